// ZwCreateKey: open-or-create of the last component, the kernel's failures,
// and the arguments the stand-in refuses.
#include "moduleRegistryCalls.h"
#include "tests/support/WorldTest.h"

using namespace sim::kernel;
using namespace registry_test;

namespace {

const std::string kUsbKey = "\\Registry\\Machine\\System\\CurrentControlSet\\Enum\\USB\\Vid_5C1D&Pid_4B01";
const std::string kClassKey =
    "\\Registry\\Machine\\System\\CurrentControlSet\\Control\\Class\\{6D2F4B10-93A7-11CF-B4E8-00C05D7A3F21}";

class RegistryOpen : public testing_support::WorldTest {};

TEST_F(RegistryOpen, OpensExistingKeysAndCreatesOnlyAMissingLastComponent)
{
    struct Case {
        const char* what;
        std::string path;
        NTSTATUS result;
        uint32_t disposition;  // when it succeeds
    };
    const Case cases[] = {
        {"existing key", kUsbKey, kStatusSuccess, kRegOpenedExistingKey},
        {"existing key, other case", "\\REGISTRY\\machine\\SYSTEM\\currentcontrolset\\enum\\usb\\VID_5C1D&PID_4b01",
         kStatusSuccess, kRegOpenedExistingKey},
        {"serial key missing under an existing key", kUsbKey + "\\0001E240", kStatusSuccess, kRegCreatedNewKey},
        {"parent missing", "\\Registry\\Machine\\System\\CurrentControlSet\\Enum\\USB\\Vid_5C1D&Pid_4B02\\0001E240",
         kStatusObjectNameNotFound, 0},
        {"new key directly under the machine hive", "\\Registry\\Machine\\Hardware", kStatusAccessDenied, 0},
        {"name outside the registry", "\\Device\\Harddisk0", kStatusObjectNameNotFound, 0},
        {"relative name", "Registry\\Machine\\System", kStatusObjectPathSyntaxBad, 0},
        {"trailing backslash", kUsbKey + "\\", kStatusObjectNameInvalid, 0},
        {"empty component", "\\Registry\\Machine\\\\System", kStatusObjectNameInvalid, 0},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        registry().reset();
        registry().createKey(kUsbKey);
        HANDLE handle = nullptr;
        uint32_t disposition = 0;

        EXPECT_EQ(openKey(c.path, handle, &disposition), c.result);

        bool created = c.disposition == kRegCreatedNewKey;
        EXPECT_EQ(registry().createdKeys(), created ? std::vector<std::string>{c.path} : std::vector<std::string>{});
        if (c.result == kStatusSuccess) {
            EXPECT_EQ(disposition, c.disposition);
            EXPECT_EQ(openHandleCount(HandleKind::registryKey), 1u);
            EXPECT_TRUE(registry().keyExists(c.path));
            EXPECT_EQ(ZwClose(handle), kStatusSuccess);
        } else {
            EXPECT_EQ(handle, nullptr);
            EXPECT_EQ(disposition, 0u);
        }
        EXPECT_EQ(openHandleCount(), 0u);
    }
}

TEST_F(RegistryOpen, AKeyCreatedByTheModuleIsFoundByTheNextOpen)
{
    registry().createKey(kUsbKey);
    HANDLE first = nullptr;
    HANDLE second = nullptr;
    uint32_t disposition = 0;
    ASSERT_EQ(openKey(kUsbKey + "\\0001e240", first), kStatusSuccess);
    ASSERT_EQ(openKey(kUsbKey + "\\0001E240", second, &disposition), kStatusSuccess);

    EXPECT_NE(first, second);
    EXPECT_EQ(disposition, kRegOpenedExistingKey);
    EXPECT_EQ(openHandleCount(HandleKind::registryKey), 2u);
    EXPECT_EQ(registry().createdKeys(), std::vector<std::string>{kUsbKey + "\\0001e240"});
    EXPECT_EQ(ZwClose(first), kStatusSuccess);
    EXPECT_EQ(ZwClose(second), kStatusSuccess);
}

TEST_F(RegistryOpen, TheCallLogShowsNameAccessAndResult)
{
    registry().createKey(kClassKey);
    HANDLE handle = nullptr;
    ASSERT_EQ(openKey(kClassKey, handle), kStatusSuccess);
    EXPECT_EQ(ZwClose(handle), kStatusSuccess);
    EXPECT_EQ(openKey(kUsbKey, handle), kStatusObjectNameNotFound);

    const std::vector<RegistryCall>& calls = registry().calls();
    ASSERT_EQ(calls.size(), 2u);
    EXPECT_EQ(calls[0].kind, RegistryCall::Kind::createKey);
    EXPECT_EQ(calls[0].keyPath, kClassKey);
    EXPECT_EQ(calls[0].desiredAccess, kKeyRead);
    EXPECT_EQ(calls[0].result, kStatusSuccess);
    EXPECT_FALSE(calls[0].created);
    EXPECT_EQ(calls[1].keyPath, kUsbKey);
    EXPECT_EQ(calls[1].result, kStatusObjectNameNotFound);
}

TEST_F(RegistryOpen, AnInjectedFailureReplacesTheOpenWhateverTheCase)
{
    registry().createKey(kClassKey);
    registry().failCreateKey(kClassKey, kStatusAccessDenied);
    std::string otherCase = kClassKey;
    for (char& c : otherCase) c = static_cast<char>(std::toupper(static_cast<unsigned char>(c)));
    HANDLE handle = nullptr;

    EXPECT_EQ(openKey(otherCase, handle), kStatusAccessDenied);
    EXPECT_EQ(handle, nullptr);

    registry().clearFaults();
    ASSERT_EQ(openKey(otherCase, handle), kStatusSuccess);
    EXPECT_EQ(ZwClose(handle), kStatusSuccess);
}

TEST_F(RegistryOpen, ArgumentsTheModuleMustNotPassAreReportedAndRefused)
{
    struct Case {
        const char* what;
        void (*spoil)(KeyName&);
        const char* report;
    };
    const Case cases[] = {
        {"short attributes", [](KeyName& k) { k.attributes.Length = 24; }, "length 24"},
        {"root directory", [](KeyName& k) { k.attributes.RootDirectory = reinterpret_cast<HANDLE>(-4); },
         "root directory"},
        {"no object name", [](KeyName& k) { k.attributes.ObjectName = nullptr; }, "no object name"},
        {"case-sensitive name", [](KeyName& k) { k.attributes.Attributes = 0; }, "OBJ_CASE_INSENSITIVE"},
        {"kernel-handle flag", [](KeyName& k) { k.attributes.Attributes = 0x240; }, "0x240"},
        {"security descriptor", [](KeyName& k) { k.attributes.SecurityDescriptor = &k; }, "security descriptor"},
        {"odd name length", [](KeyName& k) { k.name.Length = 7; }, "odd length"},
        {"name longer than its maximum", [](KeyName& k) { k.name.MaximumLength = 2; }, "maximum"},
    };
    registry().createKey(kClassKey);
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        KeyName key(kClassKey);
        c.spoil(key);
        HANDLE handle = nullptr;

        EXPECT_EQ(ZwCreateKey(&handle, kKeyRead, &key.attributes, 0, nullptr, 0, nullptr), kStatusInvalidParameter);

        EXPECT_EQ(handle, nullptr);
        std::vector<std::string> reports = takeMisuseReports();
        ASSERT_EQ(reports.size(), 1u);
        EXPECT_NE(reports[0].find(c.report), std::string::npos) << reports[0];
    }

    KeyName key(kClassKey);
    UNICODE_STRING keyClass{};
    HANDLE handle = nullptr;
    EXPECT_EQ(ZwCreateKey(nullptr, kKeyRead, &key.attributes, 0, nullptr, 0, nullptr), kStatusInvalidParameter);
    EXPECT_EQ(ZwCreateKey(&handle, kKeyRead, nullptr, 0, nullptr, 0, nullptr), kStatusInvalidParameter);
    EXPECT_EQ(ZwCreateKey(&handle, kKeyRead, &key.attributes, 0, &keyClass, 0, nullptr), kStatusInvalidParameter);
    EXPECT_EQ(ZwCreateKey(&handle, kKeyRead, &key.attributes, 0, nullptr, 1, nullptr), kStatusInvalidParameter);
    EXPECT_EQ(takeMisuseReports().size(), 4u);
}

}  // namespace
