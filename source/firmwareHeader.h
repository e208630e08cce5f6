// Image files and the header text at offset 514 of every image.
#pragma once

#include <stdint.h>

#include "../host/karvelkStatus.h"
#include "../kernel/ntkernel.h"

class FirmwareHeader {
public:
    virtual ~FirmwareHeader() {}

    uint32_t imageVersion = 0;  // a packed version
    uint32_t field2 = 0;
    uint32_t field3 = 0;
    uint32_t field4 = 0;
    uint32_t headerRevision = 0;  // 0x02xx: imageVersion is compared
    uint32_t imageType = 0;       // 0xF0: exempt from the version comparison
};

constexpr uint32_t kHeaderTextOffset = 514;
constexpr uint32_t kHeaderTextBytes = 60;
constexpr int32_t kImageReadOnly = 0x8000;
constexpr int32_t kNoImageFile = -1;

// The file's kernel handle narrowed to 32 bits, or kNoImageFile. The caller
// closes it with ZwClose(imageFileHandle(handle)).
int32_t openImageFile(const WCHAR* path, int32_t mode);

inline HANDLE imageFileHandle(int32_t file)
{
    return reinterpret_cast<HANDLE>(static_cast<intptr_t>(file));
}

void readFirmwareHeader(FirmwareHeader& header, const WCHAR* path, tStatus& status);

// Reads digitCount hexadecimal digits, passing over NUL bytes, consuming at
// most budget bytes. Any other byte fails with -50150.
uint32_t parseHexField(const uint8_t*& cursor, uint64_t budget, uint32_t digitCount, tStatus& status);
