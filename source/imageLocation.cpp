#include "imageLocation.h"

#include "registryAccess.h"
#include "statusCodes.h"

namespace {

constexpr WCHAR kInstanceKeyTemplate[] =
    KTEXT("\\Registry\\Machine\\System\\CurrentControlSet\\Enum\\USB\\Vid_0000&Pid_0000\\00000000");
constexpr WCHAR kSystemVersionKey[] = KTEXT("\\Registry\\Machine\\Software\\Microsoft\\Windows NT\\CurrentVersion");
constexpr WCHAR kDefaultImageName[] = KTEXT("\\system32\\drivers\\QVUSB0000.bin");
constexpr WCHAR kDefaultImageName0200[] = KTEXT("\\system32\\drivers\\QVUSB00000200.bin");
constexpr char kDigits[] = "0123456789ABCDEF";

constexpr uint32_t length(const WCHAR* text)
{
    uint32_t n = 0;
    while (text[n] != 0) ++n;
    return n;
}

static_assert(length(kInstanceKeyTemplate) == 78, "instance key template is 78 characters");
static_assert(kInstanceKeyTemplate[55] == '_' && kInstanceKeyTemplate[64] == '_' && kInstanceKeyTemplate[69] == '\\',
              "the identity digits sit at 56, 65 and 70");
static_assert(length(kDeviceClassKey) == 95, "class key is 95 characters");
static_assert(kDeviceClassKey[57] == '{', "the class GUID starts at 57");
static_assert(length(kDefaultImageName) == 31 && length(kDefaultImageName0200) == 35, "default image names");
static_assert(kDefaultImageName[22] == 'B' && kDefaultImageName0200[22] == 'B', "product digits start at 23");

constexpr uint32_t kInstanceVendorAt = 56;
constexpr uint32_t kInstanceProductAt = 65;
constexpr uint32_t kInstanceSerialAt = 70;
constexpr uint32_t kImageNameProductAt = 23;

// The driver key path: the class key up to its "{", then the "Driver" value,
// which may take the GUID's 38 characters and 6 more, NUL included.
constexpr uint32_t kDriverValueLimit = 44;
constexpr uint32_t kDriverKeyCharacters = 57 + kDriverValueLimit;

// "SystemRoot" may take what the path buffer leaves beside the file name.
constexpr uint32_t kSystemRootLimit = 228;
constexpr uint32_t kSystemRootLimit0200 = 224;
static_assert(kSystemRootLimit - 1 + length(kDefaultImageName) + 1 == 259, "longest default path fits");
static_assert(kSystemRootLimit0200 - 1 + length(kDefaultImageName0200) + 1 == 259, "longest 0200 path fits");

void copyText(WCHAR* destination, const WCHAR* source)
{
    uint32_t i = 0;
    for (; source[i] != 0; ++i) destination[i] = source[i];
    destination[i] = 0;
}

// Fixed-width upper-case hexadecimal, most significant digit first.
void writeHex(WCHAR* at, uint32_t value, uint32_t digits)
{
    for (uint32_t i = 0; i < digits; ++i) {
        uint32_t shift = 4 * (digits - 1 - i);
        at[i] = static_cast<WCHAR>(kDigits[(value >> shift) & 0xF]);
    }
}

void buildDefaultPath(uint16_t productId, const WCHAR* imageName, uint32_t systemRootLimit, WCHAR* path,
                      tStatus& status)
{
    path[0] = 0;
    if (status < 0) return;
    WCHAR built[kPathCharacters];
    readRegistryString(kSystemVersionKey, KTEXT("SystemRoot"), built, systemRootLimit, status);
    if (status < 0) return;
    WCHAR* name = built + length(built);
    copyText(name, imageName);
    writeHex(name + kImageNameProductAt, productId, 4);
    copyText(path, built);
}

}  // namespace

void readRegistryString(const WCHAR* keyPath, const WCHAR* valueName, WCHAR* destination, uint32_t limit,
                        tStatus& status)
{
    if (status < 0) return;
    HANDLE key;
    openRegistryKey(keyPath, key, status);
    if (status < 0) return;
    readStringValueAndClose(key, valueName, 2 * limit, destination, limit, status);
}

void locateFirmwareImage(uint16_t vendorId, uint16_t productId, uint32_t serialNumber, WCHAR* path,
                         tStatus& status)
{
    path[0] = 0;
    if (status < 0) return;

    WCHAR instanceKey[sizeof(kInstanceKeyTemplate) / sizeof(WCHAR)];
    copyText(instanceKey, kInstanceKeyTemplate);
    writeHex(instanceKey + kInstanceVendorAt, vendorId, 4);
    writeHex(instanceKey + kInstanceProductAt, productId, 4);
    writeHex(instanceKey + kInstanceSerialAt, serialNumber, 8);

    WCHAR driverKeyPath[kDriverKeyCharacters];
    copyText(driverKeyPath, kDeviceClassKey);
    WCHAR* driverValue = wcschr(driverKeyPath, static_cast<WCHAR>('{'));

    readRegistryString(instanceKey, KTEXT("Driver"), driverValue, kDriverValueLimit, status);
    if (status >= 0) readRegistryString(driverKeyPath, KTEXT("Firmware"), path, kPathCharacters, status);
    if (status >= 0) return;

    // No usable "Driver" or "Firmware" value: the product's default image.
    status = 0;
    buildDefaultImagePath(productId, path, status);
}

void buildDefaultImagePath(uint16_t productId, WCHAR* path, tStatus& status)
{
    buildDefaultPath(productId, kDefaultImageName, kSystemRootLimit, path, status);
}

void buildDefaultImagePath0200(uint16_t productId, WCHAR* path, tStatus& status)
{
    buildDefaultPath(productId, kDefaultImageName0200, kSystemRootLimit0200, path, status);
}
