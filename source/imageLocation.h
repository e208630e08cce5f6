// Where a device's firmware image lives: named by the device's driver key in
// the registry, or else the default file in the system's driver directory.
#pragma once

#include <stdint.h>

#include "../host/karvelkStatus.h"
#include "../kernel/ntkernel.h"

// A path buffer: at most 259 characters and the NUL.
constexpr uint32_t kPathCharacters = 260;

// Reads a REG_SZ value of at most `limit` characters, NUL included. The
// destination is written only on success.
void readRegistryString(const WCHAR* keyPath, const WCHAR* valueName, WCHAR* destination, uint32_t limit,
                        tStatus& status);

// The image path of a device; the path is empty after any failure.
void locateFirmwareImage(uint16_t vendorId, uint16_t productId, uint32_t serialNumber, WCHAR* path,
                         tStatus& status);
void buildDefaultImagePath(uint16_t productId, WCHAR* path, tStatus& status);
void buildDefaultImagePath0200(uint16_t productId, WCHAR* path, tStatus& status);

// The device setup class key, under which the driver keys and "FVTPID" live.
inline constexpr WCHAR kDeviceClassKey[] =
    KTEXT("\\Registry\\Machine\\System\\CurrentControlSet\\Control\\Class\\{6D2F4B10-93A7-11CF-B4E8-00C05D7A3F21}");
