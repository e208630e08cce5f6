// ZwQueryValueKey: the partial-information record, its size limits, missing
// values, and handles that are not open keys.
#include <numeric>

#include "moduleRegistryCalls.h"
#include "tests/support/WorldTest.h"

using namespace sim::kernel;
using namespace registry_test;

namespace {

const std::string kClassKey =
    "\\Registry\\Machine\\System\\CurrentControlSet\\Control\\Class\\{6D2F4B10-93A7-11CF-B4E8-00C05D7A3F21}";
constexpr NTSTATUS kStatusInsufficientResources = static_cast<NTSTATUS>(0xC000009Au);

class RegistryQuery : public testing_support::WorldTest {
protected:
    HANDLE openClassKey()
    {
        HANDLE handle = nullptr;
        EXPECT_EQ(openKey(kClassKey, handle), kStatusSuccess);
        return handle;
    }
};

std::vector<uint8_t> bytesOfLength(size_t length)
{
    std::vector<uint8_t> data(length);
    std::iota(data.begin(), data.end(), uint8_t{1});
    return data;
}

TEST_F(RegistryQuery, FillsThePartialInformationRecordOrSaysWhyNot)
{
    struct Case {
        const char* what;
        uint32_t type;
        std::vector<uint8_t> data;
        uint32_t recordSize;
        NTSTATUS result;
    };
    const Case cases[] = {
        {"REG_SZ with its NUL", kRegSz, utf16leBytes("4B01"), kModuleRecordSize, kStatusSuccess},
        {"REG_SZ without a NUL", kRegSz, utf16leBytes("4B01A", false), kModuleRecordSize, kStatusSuccess},
        {"empty REG_SZ", kRegSz, {}, kModuleRecordSize, kStatusSuccess},
        {"REG_EXPAND_SZ", kRegExpandSz, utf16leBytes("%SystemRoot%\\x.bin"), kModuleRecordSize, kStatusSuccess},
        {"REG_DWORD", kRegDword, {0x01, 0x4B, 0, 0}, kModuleRecordSize, kStatusSuccess},
        {"REG_BINARY", kRegBinary, {1, 2, 3}, kModuleRecordSize, kStatusSuccess},
        {"REG_MULTI_SZ", kRegMultiSz, multiStringBytes({"a", "bc"}), kModuleRecordSize, kStatusSuccess},
        {"data filling the record", kRegSz, bytesOfLength(524), kModuleRecordSize, kStatusSuccess},
        {"data one byte too long", kRegSz, bytesOfLength(525), kModuleRecordSize, kStatusBufferOverflow},
        {"room for the fixed part only", kRegSz, utf16leBytes("4B01"), 12, kStatusBufferOverflow},
        {"no room for the fixed part", kRegSz, utf16leBytes("4B01"), 11, kStatusBufferTooSmall},
        {"no record at all", kRegSz, utf16leBytes("4B01"), 0, kStatusBufferTooSmall},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        registry().setValue(kClassKey, "FVTPID", c.type, c.data);
        HANDLE key = openClassKey();

        QueryResult query = queryValue(key, "FVTPID", c.recordSize);

        EXPECT_EQ(query.status, c.result);
        EXPECT_EQ(query.resultLength, 12 + c.data.size());
        if (c.recordSize >= 12) {
            EXPECT_EQ(query.word(0), 0u);  // title index
            EXPECT_EQ(query.type(), c.type);
            EXPECT_EQ(query.dataLength(), c.data.size());
        } else {
            EXPECT_EQ(query.record, std::vector<uint8_t>(c.recordSize, kUntouched));
        }
        if (c.result == kStatusSuccess) {
            EXPECT_EQ(query.data(c.data.size()), c.data);
        } else if (c.result == kStatusBufferOverflow) {
            EXPECT_EQ(query.data(c.recordSize - 12), std::vector<uint8_t>(c.recordSize - 12, kUntouched));
        }
        EXPECT_EQ(ZwClose(key), kStatusSuccess);
    }
}

TEST_F(RegistryQuery, ValueNamesIgnoreCaseAndTheEmptyNameIsTheDefaultValue)
{
    registry().setString(kClassKey, "FvtPid", "4B01");
    registry().setString(kClassKey, "", "default");
    registry().setString(kClassKey, "FVTPID", "4B02");
    HANDLE key = openClassKey();

    QueryResult named = queryValue(key, "fvtpid");
    QueryResult byDefault = queryValue(key, "");

    ASSERT_EQ(named.status, kStatusSuccess);
    EXPECT_EQ(named.data(named.dataLength()), utf16leBytes("4B02"));
    ASSERT_EQ(byDefault.status, kStatusSuccess);
    EXPECT_EQ(byDefault.data(byDefault.dataLength()), utf16leBytes("default"));
    EXPECT_EQ(registry().value(kClassKey, "FVTPID")->name, "FvtPid");  // the first spelling stays
    EXPECT_EQ(ZwClose(key), kStatusSuccess);
}

TEST_F(RegistryQuery, MissingValuesOtherClassesAndInjectedFailuresLeaveTheRecordAlone)
{
    registry().setString(kClassKey, "FVTPID", "4B01");
    registry().setString(kClassKey, "Other", "x");
    registry().failQuery(kClassKey, "fvtpid", kStatusInsufficientResources);
    HANDLE key = openClassKey();

    QueryResult missing = queryValue(key, "Firmware");
    QueryResult fullInformation = queryValue(key, "Other", kModuleRecordSize, 1);
    QueryResult failed = queryValue(key, "FVTPID");
    QueryResult other = queryValue(key, "Other");

    EXPECT_EQ(missing.status, kStatusObjectNameNotFound);
    EXPECT_EQ(fullInformation.status, kStatusInvalidParameter);
    EXPECT_EQ(failed.status, kStatusInsufficientResources);
    for (const QueryResult* refused : {&missing, &fullInformation, &failed})
        EXPECT_EQ(refused->record, std::vector<uint8_t>(kModuleRecordSize, kUntouched));
    EXPECT_EQ(other.status, kStatusSuccess);
    EXPECT_EQ(ZwClose(key), kStatusSuccess);
}

TEST_F(RegistryQuery, TheCallLogNamesKeyValueRecordSizeAndResult)
{
    registry().setString(kClassKey, "FVTPID", "4B01");
    HANDLE key = openClassKey();
    queryValue(key, "FVTPID");
    queryValue(key, "Firmware", 100);
    EXPECT_EQ(ZwClose(key), kStatusSuccess);

    std::vector<RegistryCall> queries;
    for (const RegistryCall& call : registry().calls())
        if (call.kind == RegistryCall::Kind::queryValue) queries.push_back(call);
    ASSERT_EQ(queries.size(), 2u);
    EXPECT_EQ(queries[0].keyPath, kClassKey);
    EXPECT_EQ(queries[0].valueName, "FVTPID");
    EXPECT_EQ(queries[0].bufferLength, kModuleRecordSize);
    EXPECT_EQ(queries[0].result, kStatusSuccess);
    EXPECT_EQ(queries[1].valueName, "Firmware");
    EXPECT_EQ(queries[1].bufferLength, 100u);
    EXPECT_EQ(queries[1].result, kStatusObjectNameNotFound);
}

TEST_F(RegistryQuery, AKeyDeletedWhileOpenAnswersKeyDeleted)
{
    registry().setString(kClassKey, "FVTPID", "4B01");
    HANDLE key = openClassKey();
    registry().deleteKey("\\Registry\\Machine\\System\\CurrentControlSet\\Control");
    registry().setString(kClassKey, "FVTPID", "4B02");  // a new key of the same name

    EXPECT_EQ(queryValue(key, "FVTPID").status, kStatusKeyDeleted);
    EXPECT_EQ(ZwClose(key), kStatusSuccess);
}

TEST_F(RegistryQuery, HandlesThatAreNotOpenKeysAreReported)
{
    registry().setString(kClassKey, "FVTPID", "4B01");
    HANDLE closed = openClassKey();
    ASSERT_EQ(ZwClose(closed), kStatusSuccess);
    HANDLE neverOpened = reinterpret_cast<HANDLE>(static_cast<intptr_t>(-0x1234));

    EXPECT_EQ(queryValue(closed, "FVTPID").status, kStatusInvalidHandle);
    EXPECT_EQ(queryValue(neverOpened, "FVTPID").status, kStatusInvalidHandle);
    EXPECT_EQ(queryValue(nullptr, "FVTPID").status, kStatusInvalidHandle);
    EXPECT_EQ(ZwClose(closed), kStatusInvalidHandle);

    std::vector<std::string> reports = takeMisuseReports();
    ASSERT_EQ(reports.size(), 4u);
    EXPECT_NE(reports[0].find("not an open registry key"), std::string::npos) << reports[0];
    EXPECT_NE(reports[3].find("ZwClose"), std::string::npos) << reports[3];
}

TEST_F(RegistryQuery, MalformedQueryArgumentsAreReported)
{
    registry().setString(kClassKey, "FVTPID", "4B01");
    HANDLE key = openClassKey();
    std::u16string text = u"FVTPID";
    UNICODE_STRING name;
    RtlInitUnicodeString(&name, text.c_str());
    uint8_t record[kModuleRecordSize];
    uint32_t resultLength = 0;

    EXPECT_EQ(ZwQueryValueKey(key, nullptr, 2, record, sizeof record, &resultLength), kStatusInvalidParameter);
    EXPECT_EQ(ZwQueryValueKey(key, &name, 2, record, sizeof record, nullptr), kStatusInvalidParameter);
    EXPECT_EQ(ZwQueryValueKey(key, &name, 2, nullptr, sizeof record, &resultLength), kStatusInvalidParameter);
    name.Length = 3;
    EXPECT_EQ(ZwQueryValueKey(key, &name, 2, record, sizeof record, &resultLength), kStatusInvalidParameter);
    EXPECT_EQ(ZwClose(key), kStatusSuccess);

    EXPECT_EQ(takeMisuseReports().size(), 4u);
}

}  // namespace
