#include "identityCheck.h"

#include "../host/karvelk.h"
#include "deviceTable.h"
#include "imageLocation.h"
#include "registryAccess.h"
#include "serialTables.h"
#include "statusCodes.h"

namespace {

constexpr uint16_t kErased = 0xFFFF;
constexpr uint16_t kZeroed = 0x0000;
constexpr uint16_t kProductPlain = 0x4B01;
constexpr uint16_t kProductRanged = 0x4B02;
constexpr uint16_t kProductAlternative = 0x4B03;

constexpr uint16_t kFlashSignatureAddress = 0x0C00;
constexpr uint8_t kFlashSignatureA[16] = {0x30, 0xE4, 0x10, 0x75, 0x96, 0x11, 0x75, 0x97,
                                          0x80, 0xE5, 0x96, 0x20, 0xE7, 0xFB, 0xE4, 0x90};
constexpr uint8_t kFlashSignatureB[16] = {0x83, 0x02, 0x0C, 0x04, 0xE4, 0x93, 0xFC, 0x74,
                                          0x01, 0x93, 0xFD, 0x74, 0x02, 0x93, 0xFE, 0x74};

// "FVTPID" holds four hex digits; a value of up to 10 bytes is taken.
constexpr uint32_t kRegistryProductIdBytes = 10;
constexpr uint32_t kRegistryProductIdDigits = 4;

uint16_t readBigEndian16(LoaderChannel& channel, uint16_t offset, tStatus& status)
{
    uint8_t bytes[2] = {0, 0};
    readLoaderMemory(channel, static_cast<uint16_t>(channel.identityPage + offset), bytes, sizeof(bytes), status);
    return static_cast<uint16_t>((bytes[0] << 8) | bytes[1]);
}

uint32_t readBigEndian32(LoaderChannel& channel, uint16_t offset, tStatus& status)
{
    uint8_t bytes[4] = {0, 0, 0, 0};
    readLoaderMemory(channel, static_cast<uint16_t>(channel.identityPage + offset), bytes, sizeof(bytes), status);
    return (static_cast<uint32_t>(bytes[0]) << 24) | (static_cast<uint32_t>(bytes[1]) << 16) |
           (static_cast<uint32_t>(bytes[2]) << 8) | bytes[3];
}

void writeBigEndian16(LoaderChannel& channel, uint16_t offset, uint16_t value, tStatus& status)
{
    const uint8_t bytes[2] = {static_cast<uint8_t>(value >> 8), static_cast<uint8_t>(value & 0xFF)};
    writeLoaderMemory(channel, static_cast<uint16_t>(channel.identityPage + offset), bytes, sizeof(bytes), status);
}

bool isInSerialFixList(uint32_t serialNumber)
{
    for (const uint32_t* entry = kSerialFixList; *entry != 0; ++entry) {
        if (*entry == serialNumber) return true;
    }
    return false;
}

bool equalBytes(const uint8_t* a, const uint8_t* b, uint32_t count)
{
    for (uint32_t i = 0; i < count; ++i) {
        if (a[i] != b[i]) return false;
    }
    return true;
}

}  // namespace

void readRegistryProductId(uint16_t& productId, tStatus& status)
{
    if (status < 0) return;
    HANDLE key;
    openRegistryKey(kDeviceClassKey, key, status);
    if (status < 0) return;
    WCHAR text[kRegistryProductIdBytes / sizeof(WCHAR) + 1];
    readStringValueAndClose(key, KTEXT("FVTPID"), kRegistryProductIdBytes, text, sizeof(text) / sizeof(WCHAR), status);
    // A positive status the caller brought in does not make a good read
    // count for nothing: a blank block would then be written with the erased
    // product word, and a block that is no longer blank is never repaired
    // from the registry again.
    if (status < 0) return;

    char digits[kRegistryProductIdDigits + 1];
    uint32_t count = 0;
    for (; count < kRegistryProductIdDigits && text[count] != 0; ++count) {
        digits[count] = static_cast<char>(text[count] & 0xFF);
    }
    digits[count] = 0;
    productId = static_cast<uint16_t>(kvlASCIIToU32Base16(digits));
}

void writeProductId(LoaderChannel& channel, uint16_t productId, tStatus& status)
{
    writeBigEndian16(channel, kIdentityProductId, productId, status);
}

void DeviceTable::checkIdentity(LoaderChannel& channel, uint16_t& vendorId, uint16_t& productId,
                                uint32_t& serialNumber, tStatus& status)
{
    vendorId = readBigEndian16(channel, kIdentityVendorId, status);
    productId = readBigEndian16(channel, kIdentityProductId, status);
    serialNumber = readBigEndian32(channel, kIdentitySerialNumber, status);
    if (status < 0) return;

    if (vendorId != kFamilyVendorId) {
        bool blank = (vendorId == kErased && productId == kErased) || (vendorId == kZeroed && productId == kZeroed);
        if (!blank) {
            setFailure(status, kStatusForeignOrUnverified);
            return;
        }
        // A blank block: the product comes from the registry. The copy word
        // is left alone and the serial number is returned as read.
        readRegistryProductId(productId, status);
        if (status < 0) return;
        vendorId = kFamilyVendorId;
        writeBigEndian16(channel, kIdentityVendorId, vendorId, status);
        writeProductId(channel, productId, status);
        return;
    }

    // Only the small loader's devices lose their product ID word this way.
    if (productId != kErased || channel.loaderProductId != kLoaderProductIdSmall) return;

    productId = readBigEndian16(channel, kIdentityProductIdCopy, status);
    if (status < 0) return;
    if (productId == kProductRanged && isInSerialFixList(serialNumber)) {
        productId = kProductPlain;
    } else if (productId == kErased) {
        productId = readBigEndian16(channel, kIdentityAltProductId, status);
        if (status < 0) return;
        if (productId != kProductAlternative) {
            // The firmware already in flash tells the product apart.
            uint8_t signature[16];
            readLoaderMemory(channel, kFlashSignatureAddress, signature, sizeof(signature), status);
            if (status < 0) return;
            if (equalBytes(signature, kFlashSignatureA, sizeof(signature))) {
                productId = isSerialInRanges(serialNumber) ? kProductRanged : kProductPlain;
            } else if (equalBytes(signature, kFlashSignatureB, sizeof(signature))) {
                productId = kProductRanged;
            } else {
                setFailure(status, kStatusFlashNotRecognised);
                return;
            }
        }
    }

    writeBigEndian16(channel, kIdentityProductId, productId, status);
    if (status >= 0) writeBigEndian16(channel, kIdentityProductIdCopy, productId, status);
}

bool DeviceTable::isSerialInRanges(uint32_t serialNumber)
{
    for (const SerialRange& range : kSerialRangeTable) {
        if (range.low <= serialNumber && serialNumber <= range.high) return true;
    }
    return false;
}
