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

namespace registry_test {

constexpr uint32_t kModuleRecordSize = 536;
constexpr uint8_t kUntouched = 0xCC;

struct KeyName {
    explicit KeyName(const std::string& path) : text(sim::kernel::toUtf16(path))
    {
        RtlInitUnicodeString(&name, text.c_str());
        attributes.Length = sizeof(OBJECT_ATTRIBUTES);
        attributes.ObjectName = &name;
        attributes.Attributes = kObjCaseInsensitive;
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

struct QueryResult {
    NTSTATUS status = 0;
    uint32_t resultLength = 0xFFFFFFFF;
    std::vector<uint8_t> record;

    uint32_t word(size_t offset) const
    {
        uint32_t value;
        std::memcpy(&value, record.data() + offset, sizeof value);
        return value;
    }
    uint32_t type() const { return word(offsetof(KEY_VALUE_PARTIAL_INFORMATION, Type)); }
    uint32_t dataLength() const { return word(offsetof(KEY_VALUE_PARTIAL_INFORMATION, DataLength)); }
    std::vector<uint8_t> data(size_t length) const
    {
        auto begin = record.begin() + offsetof(KEY_VALUE_PARTIAL_INFORMATION, Data);
        return std::vector<uint8_t>(begin, begin + static_cast<std::ptrdiff_t>(length));
    }
};

inline QueryResult queryValue(HANDLE key, const std::string& valueName, uint32_t recordSize = kModuleRecordSize,
                              int informationClass = kKeyValuePartialInformation)
{
    std::u16string name16 = sim::kernel::toUtf16(valueName);
    UNICODE_STRING name;
    RtlInitUnicodeString(&name, name16.c_str());
    QueryResult result;
    result.record.assign(recordSize, kUntouched);
    result.status = ZwQueryValueKey(key, &name, informationClass, recordSize ? result.record.data() : nullptr,
                                    recordSize, &result.resultLength);
    return result;
}

// Misuse reports are the test's to check; taking them keeps the fixture's
// final check for the unexpected ones.
inline std::vector<std::string> takeMisuseReports()
{
    std::vector<std::string> reports = sim::kernel::misuseReports();
    EXPECT_EQ(sim::kernel::openHandleCount(), 0u) << "take the reports once every handle is closed";
    sim::kernel::resetHandles();
    return reports;
}

}  // namespace registry_test
