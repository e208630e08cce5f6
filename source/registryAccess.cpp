#include "registryAccess.h"

#include "statusCodes.h"

namespace {

constexpr uint32_t kValueRecordBytes = 536;

void initObjectAttributes(OBJECT_ATTRIBUTES& attributes, UNICODE_STRING* name)
{
    attributes.Length = sizeof(OBJECT_ATTRIBUTES);
    attributes.RootDirectory = nullptr;
    attributes.ObjectName = name;
    attributes.Attributes = kObjCaseInsensitive | kObjKernelHandle;
    attributes.SecurityDescriptor = nullptr;
    attributes.SecurityQualityOfService = nullptr;
}

}  // namespace

void openRegistryKey(const WCHAR* keyPath, HANDLE& key, tStatus& status)
{
    key = nullptr;
    if (status < 0) return;
    UNICODE_STRING name;
    RtlInitUnicodeString(&name, keyPath);
    OBJECT_ATTRIBUTES attributes;
    initObjectAttributes(attributes, &name);
    NTSTATUS result = ZwCreateKey(&key, kKeyRead, &attributes, 0, nullptr, 0, nullptr);
    if (result != kStatusSuccess) {
        key = nullptr;
        setFailure(status, result == kStatusObjectNameNotFound ? kStatusRegistryKeyNotFound : kStatusMissingOrMalformed);
    }
}

void readStringValueAndClose(HANDLE key, const WCHAR* valueName, uint32_t maxDataBytes, WCHAR* destination,
                             uint32_t destinationCharacters, tStatus& status)
{
    // Aligned so the UTF-16 data at offset 12 can be read in place.
    uint32_t record[kValueRecordBytes / sizeof(uint32_t)];
    KEY_VALUE_PARTIAL_INFORMATION* value = reinterpret_cast<KEY_VALUE_PARTIAL_INFORMATION*>(record);
    UNICODE_STRING name;
    RtlInitUnicodeString(&name, valueName);
    uint32_t resultLength = 0;
    NTSTATUS result = ZwQueryValueKey(key, &name, kKeyValuePartialInformation, record, sizeof(record), &resultLength);

    if (result != kStatusSuccess || value->Type != kRegSz || value->DataLength > maxDataBytes) {
        setFailure(status, kStatusMissingOrMalformed);
    } else if (status >= 0) {
        const WCHAR* text = reinterpret_cast<const WCHAR*>(value->Data);
        uint32_t available = value->DataLength / sizeof(WCHAR);
        uint32_t length = 0;
        while (length < available && text[length] != 0) ++length;
        if (length >= destinationCharacters) {
            setFailure(status, kStatusMissingOrMalformed);
        } else {
            for (uint32_t i = 0; i < length; ++i) destination[i] = text[i];
            destination[length] = 0;
        }
    }
    ZwClose(key);
}
