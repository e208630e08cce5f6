// Opening registry keys and reading string values, in fixed buffers.
#pragma once

#include <stdint.h>

#include "../host/karvelkStatus.h"
#include "../kernel/ntkernel.h"

// Opens a key for reading (creating it when only its last component is
// missing). On failure no handle is left open.
void openRegistryKey(const WCHAR* keyPath, HANDLE& key, tStatus& status);

// Reads a REG_SZ value whose data is at most maxDataBytes long into the
// destination, up to its first NUL or the end of its data, and terminates it.
// A value with no room left for the NUL in the destination is refused, so no
// copy ever runs past the value's data or the destination. The key is closed
// whatever happens.
void readStringValueAndClose(HANDLE key, const WCHAR* valueName, uint32_t maxDataBytes, WCHAR* destination,
                             uint32_t destinationCharacters, tStatus& status);
