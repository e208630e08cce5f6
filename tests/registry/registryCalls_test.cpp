// ZwCreateKey and ZwQueryValueKey: open-or-create of the last component, the
// partial-information record and its size limits, the call log, injected
// failures, and the arguments the stand-in refuses.
#include <numeric>

#include "moduleRegistryCalls.h"

using namespace registry_test;

namespace {

constexpr NTSTATUS kStatusInsufficientResources = static_cast<NTSTATUS>(0xC000009Au);
const std::vector<uint8_t> kUntouchedRecord(kModuleRecordSize, kUntouched);

TEST_F(RegistryTest, OpensExistingKeysAndCreatesOnlyAMissingLastComponent)
{
    const std::tuple<const char*, std::string, NTSTATUS, uint32_t> cases[] = {
        {"existing key", kUsbKey, kStatusSuccess, kRegOpenedExistingKey},
        {"existing key, other case", kUsbKeyOtherCase, kStatusSuccess, kRegOpenedExistingKey},
        {"serial key missing under an existing key", kUsbKeyOtherCase + "\\0001e240", kStatusSuccess,
         kRegCreatedNewKey},
        {"parent missing", "\\Registry\\Machine\\System\\CurrentControlSet\\Enum\\USB\\Vid_5C1D&Pid_4B02\\0001E240",
         kStatusObjectNameNotFound, 0},
        {"new key directly under the machine hive", "\\Registry\\Machine\\Hardware", kStatusAccessDenied, 0},
        {"name outside the registry", "\\Device\\Harddisk0", kStatusObjectNameNotFound, 0},
        {"relative name", "Registry\\Machine\\System", kStatusObjectPathSyntaxBad, 0},
        {"trailing backslash", kUsbKey + "\\", kStatusObjectNameInvalid, 0},
        {"empty component", "\\Registry\\Machine\\\\System", kStatusObjectNameInvalid, 0},
    };
    for (const auto& [what, path, result, disposition] : cases) {
        SCOPED_TRACE(what);
        registry().reset();
        registry().createKey(kUsbKey);
        HANDLE handle = nullptr;
        uint32_t got = 0;

        EXPECT_EQ(openKey(path, handle, &got), result);

        EXPECT_EQ(got, disposition);
        bool created = disposition == kRegCreatedNewKey;
        EXPECT_EQ(registry().createdKeys(), created ? std::vector<std::string>{path} : std::vector<std::string>{});
        EXPECT_EQ(handle == nullptr, result != kStatusSuccess);
        if (handle != nullptr) {
            EXPECT_TRUE(registry().keyExists(path));
            EXPECT_EQ(ZwClose(handle), kStatusSuccess);
        }
    }
}

TEST_F(RegistryTest, FillsThePartialInformationRecordOrSaysWhyNot)
{
    std::vector<uint8_t> filling(524);
    std::iota(filling.begin(), filling.end(), uint8_t{1});
    const std::tuple<const char*, uint32_t, std::vector<uint8_t>, uint32_t, NTSTATUS> cases[] = {
        {"REG_SZ with its NUL", kRegSz, utf16leBytes("4B01"), kModuleRecordSize, kStatusSuccess},
        {"REG_SZ without a NUL", kRegSz, utf16leBytes("4B01A", false), kModuleRecordSize, kStatusSuccess},
        {"data filling the record", kRegSz, filling, kModuleRecordSize, kStatusSuccess},
        {"data one byte too long", kRegSz, std::vector<uint8_t>(525, 0x41), kModuleRecordSize, kStatusBufferOverflow},
        {"room for the fixed part only", kRegSz, utf16leBytes("4B01"), 12, kStatusBufferOverflow},
        {"no room for the fixed part", kRegSz, utf16leBytes("4B01"), 11, kStatusBufferTooSmall},
        {"no record at all", kRegSz, utf16leBytes("4B01"), 0, kStatusBufferTooSmall},
    };
    for (const auto& [what, type, data, recordSize, result] : cases) {
        SCOPED_TRACE(what);
        registry().setValue(kClassKey, "FVTPID", type, data);
        HANDLE key = nullptr;
        ASSERT_EQ(openKey(kClassKey, key), kStatusSuccess);

        QueryResult query = queryValue(key, "FVTPID", recordSize);

        EXPECT_EQ(query.status, result);
        EXPECT_EQ(query.resultLength, 12 + data.size());
        if (recordSize < 12) {
            EXPECT_EQ(query.record, std::vector<uint8_t>(recordSize, kUntouched));
        } else {
            EXPECT_EQ(query.word(0), 0u);  // title index
            EXPECT_EQ(query.word(4), type);
            EXPECT_EQ(query.word(8), data.size());
            // Data that does not fit is not copied at all.
            EXPECT_EQ(query.data(std::min<size_t>(data.size(), recordSize - 12)),
                      result == kStatusSuccess ? data : std::vector<uint8_t>(recordSize - 12, kUntouched));
        }
        EXPECT_EQ(ZwClose(key), kStatusSuccess);
    }
}

TEST_F(RegistryTest, NamesIgnoreCaseFailuresLeaveTheRecordAloneAndTheLogShowsEachCall)
{
    registry().setString(kUsbKey, "FvtPid", "4B01");
    registry().setString(kUsbKey, "", "default");
    registry().setString(kUsbKey, "FVTPID", "4B02");
    registry().failCreateKey(kUsbKey, kStatusAccessDenied);
    HANDLE key = nullptr;
    EXPECT_EQ(openKey(kUsbKeyOtherCase, key), kStatusAccessDenied);
    registry().clearFaults();
    ASSERT_EQ(openKey(kUsbKeyOtherCase, key), kStatusSuccess);

    EXPECT_EQ(queryValue(key, "fvtpid").data(10), utf16leBytes("4B02"));
    EXPECT_EQ(registry().value(kUsbKey, "FVTPID")->name, "FvtPid");  // the first spelling stays
    EXPECT_EQ(queryValue(key, "").data(16), utf16leBytes("default"));
    EXPECT_EQ(queryValue(key, "Firmware", 100).status, kStatusObjectNameNotFound);
    QueryResult fullInformation = queryValue(key, "FVTPID", kModuleRecordSize, 1);
    EXPECT_EQ(fullInformation.status, kStatusInvalidParameter);
    EXPECT_EQ(fullInformation.record, kUntouchedRecord);
    registry().failQuery(kUsbKey, "fvtPID", kStatusInsufficientResources);
    QueryResult failed = queryValue(key, "FVTPID");
    EXPECT_EQ(failed.status, kStatusInsufficientResources);
    EXPECT_EQ(failed.record, kUntouchedRecord);
    // A key deleted while open is gone for the handle, even once a key of the same name is back.
    registry().deleteKey("\\Registry\\Machine\\System\\CurrentControlSet\\Enum");
    registry().setString(kUsbKey, "FVTPID", "4B02");
    EXPECT_EQ(queryValue(key, "FVTPID").status, kStatusKeyDeleted);
    EXPECT_EQ(ZwClose(key), kStatusSuccess);

    const std::vector<RegistryCall>& calls = registry().calls();
    ASSERT_EQ(calls.size(), 8u);
    EXPECT_EQ(std::tie(calls[0].kind, calls[0].keyPath, calls[0].desiredAccess, calls[0].result),
              std::make_tuple(RegistryCall::Kind::createKey, kUsbKeyOtherCase, kKeyRead, kStatusAccessDenied));
    EXPECT_EQ(std::tie(calls[4].kind, calls[4].keyPath, calls[4].valueName, calls[4].bufferLength, calls[4].result),
              std::make_tuple(RegistryCall::Kind::queryValue, kUsbKeyOtherCase, std::string("Firmware"), 100u,
                              kStatusObjectNameNotFound));
}

TEST_F(RegistryTest, ArgumentsAndHandlesTheModuleMustNotPassAreReportedAndRefused)
{
    void (*spoilers[])(KeyName&) = {
        [](KeyName& k) { k.attributes.Length = 24; },
        [](KeyName& k) { k.attributes.RootDirectory = reinterpret_cast<HANDLE>(-4); },
        [](KeyName& k) { k.attributes.ObjectName = nullptr; },
        [](KeyName& k) { k.attributes.Attributes = 0; },      // case-sensitive
        [](KeyName& k) { k.attributes.Attributes = 0x40; },   // a handle user mode can reach
        [](KeyName& k) { k.attributes.SecurityDescriptor = &k; },
        [](KeyName& k) { k.name.Length = 7; },
        [](KeyName& k) { k.name.MaximumLength = 2; },
    };
    registry().createKey(kClassKey);
    for (auto spoil : spoilers) {
        KeyName key(kClassKey);
        spoil(key);
        HANDLE handle = nullptr;
        EXPECT_EQ(ZwCreateKey(&handle, kKeyRead, &key.attributes, 0, nullptr, 0, nullptr), kStatusInvalidParameter);
        EXPECT_EQ(handle, nullptr);
    }
    KeyName name(kClassKey);
    UNICODE_STRING keyClass{};
    HANDLE key = nullptr;
    EXPECT_EQ(ZwCreateKey(&key, kKeyRead, &name.attributes, 0, &keyClass, 0, nullptr), kStatusInvalidParameter);
    EXPECT_EQ(ZwCreateKey(&key, kKeyRead, &name.attributes, 0, nullptr, 1, nullptr), kStatusInvalidParameter);
    EXPECT_EQ(takeMisuseReports().size(), 10u);

    ASSERT_EQ(openKey(kClassKey, key), kStatusSuccess);
    uint8_t record[kModuleRecordSize];
    uint32_t resultLength = 0;
    EXPECT_EQ(ZwQueryValueKey(key, &name.name, 2, nullptr, sizeof record, &resultLength), kStatusInvalidParameter);
    name.name.Length = 3;
    EXPECT_EQ(ZwQueryValueKey(key, &name.name, 2, record, sizeof record, &resultLength), kStatusInvalidParameter);
    EXPECT_EQ(takeMisuseReports().size(), 2u);

    // Handles that are not open keys.
    EXPECT_EQ(ZwClose(key), kStatusSuccess);
    EXPECT_EQ(queryValue(key, "FVTPID").status, kStatusInvalidHandle);
    EXPECT_EQ(queryValue(nullptr, "FVTPID").status, kStatusInvalidHandle);
    EXPECT_EQ(ZwClose(key), kStatusInvalidHandle);
    EXPECT_EQ(takeMisuseReports().size(), 3u);
}

}  // namespace
