// Registry calls made the way the module makes them: a counted full path,
// object attributes of 48 bytes, case-insensitive, and a 536-byte record.
#pragma once

#include <gtest/gtest.h>

#include <cstring>
#include <string>
#include <vector>

#include "kernel/ntkernel.h"
#include "sim/kernel/kernelUtf16.h"
#include "sim/kernel/simKernel.h"
#include "tests/support/worldTest.h"

namespace registry_test {

using namespace sim::kernel;
using RegistryTest = testing_support::WorldTest;

constexpr uint32_t kModuleRecordSize = 536;
constexpr uint8_t kUntouched = 0xCC;
const std::string kClassKey =
    "\\Registry\\Machine\\System\\CurrentControlSet\\Control\\Class\\{6D2F4B10-93A7-11CF-B4E8-00C05D7A3F21}";
const std::string kUsbKey = "\\Registry\\Machine\\System\\CurrentControlSet\\Enum\\USB\\Vid_5C1D&Pid_4B01";
const std::string kUsbKeyOtherCase = "\\REGISTRY\\machine\\SYSTEM\\currentcontrolset\\enum\\usb\\VID_5C1D&PID_4b01";

struct KeyName {
    explicit KeyName(const std::string& path) : text(toUtf16(path))
    {
        RtlInitUnicodeString(&name, text.c_str());
        attributes.Length = sizeof(OBJECT_ATTRIBUTES);
        attributes.ObjectName = &name;
        attributes.Attributes = kObjCaseInsensitive | kObjKernelHandle;
    }
    KeyName(const KeyName&) = delete;

    std::u16string text;
    UNICODE_STRING name{};
    OBJECT_ATTRIBUTES attributes{};
};

inline NTSTATUS openKey(const std::string& path, HANDLE& handle, uint32_t* disposition = nullptr)
{
    KeyName key(path);
    return ZwCreateKey(&handle, kKeyRead, &key.attributes, 0, nullptr, 0, disposition);
}

// The partial-information record: title index, type and data length, then the data.
struct QueryResult {
    NTSTATUS status = 0;
    uint32_t resultLength = 0xFFFFFFFF;
    std::vector<uint8_t> record;

    uint32_t word(size_t at) const
    {
        uint32_t value;
        std::memcpy(&value, &record[at], 4);
        return value;
    }
    std::vector<uint8_t> data(size_t length) const { return {record.begin() + 12, record.begin() + 12 + length}; }
};

inline QueryResult queryValue(HANDLE key, const std::string& valueName, uint32_t recordSize = kModuleRecordSize,
                              int informationClass = kKeyValuePartialInformation)
{
    KeyName name(valueName);  // for its counted string
    QueryResult result;
    result.record.assign(recordSize, kUntouched);
    result.status = ZwQueryValueKey(key, &name.name, informationClass, recordSize ? result.record.data() : nullptr,
                                    recordSize, &result.resultLength);
    return result;
}

// Misuse reports are the test's to check; taking them keeps the fixture's
// final check for the unexpected ones.
inline std::vector<std::string> takeMisuseReports()
{
    std::vector<std::string> reports = misuseReports();
    clearMisuseReports();
    return reports;
}

}  // namespace registry_test
