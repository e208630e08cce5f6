// The names the kernel and the host's loader wrappers call.
#pragma once

#include <stdint.h>

#include "../../../host/karvelkStatus.h"
#include "../../../kernel/ntkernel.h"
#include "../../exportVisibility.h"


extern "C" {
MODULE_EXPORT NTSTATUS DllInitialize(UNICODE_STRING* registryPath);
MODULE_EXPORT NTSTATUS DllUnload();
MODULE_EXPORT const uint8_t* pkgSetWDMWrapperLoadStateAndGetGUID(uint32_t state);
MODULE_EXPORT tStatus pkgWDMWrapperCallSSMain(uint32_t reason);
MODULE_EXPORT void pkgSetLegacyWrapperLoadState(uint32_t state);
}
