// The image path of a device: its driver key's "Firmware" value, or else the
// product's default image under the system root.
#include "locationWorld.h"
#include "source/imageLocation.h"
#include "source/statusCodes.h"

using namespace location_test;
using sim::kernel::Registry;
using sim::kernel::RegistryCall;

namespace {

constexpr const char* kClassesKey = "\\Registry\\Machine\\System\\CurrentControlSet\\Control\\Class\\";
constexpr const char* kDriverValue = "{6D2F4B10-93A7-11CF-B4E8-00C05D7A3F21}\\0003";  // 43 characters
constexpr const char* kImage = "C:\\images\\missing.bin";                            // no such file: still taken
constexpr const char* kDefaultImage = "C:\\WINDOWS\\system32\\drivers\\QVUSB4B01.bin";
const std::string kInstanceKey = instanceKey(0x5C1D, 0x4B01, 0x0001E240);
const std::string kDriverKey = std::string(kClassesKey) + kDriverValue;

struct LocateCase {
    const char* name;
    Prepare prepare;  // on a device whose "Driver" names kDriverKey, whose "Firmware" is kImage
    std::string path;
};

void PrintTo(const LocateCase& locateCase, std::ostream* out) { *out << locateCase.name; }

// A driver value and a "Firmware" value under the key it names.
Prepare driver(const std::string& value, bool withTerminator, const std::string& image = kImage)
{
    return [=](Registry& r) {
        r.setString(kInstanceKey, "Driver", value, withTerminator);
        r.setString(kClassesKey + value, "Firmware", image);
    };
}

Prepare firmware(const std::string& image, bool withTerminator)
{
    return [=](Registry& r) { r.setString(kDriverKey, "Firmware", image, withTerminator); };
}

std::string imageOfLength(size_t characters) { return "C:\\images\\" + repeat('f', characters - 10); }

const std::string kLongestImage = imageOfLength(259);

const LocateCase kCases[] = {
    {"FirmwareValueNamesTheImage", [](Registry&) {}, kImage},
    {"DriverValueNamesAnyKey", driver("{11111111-2222-3333-4444-555555555555}\\0000", true, "C:\\other.bin"),
     "C:\\other.bin"},
    {"DriverOf43CharactersWithoutTerminator", driver(kDriverValue, false), kImage},
    {"DriverOf44CharactersWithTerminator", driver(kDriverValue + std::string("1"), true), kDefaultImage},
    {"DriverOf44CharactersWithoutTerminator", driver(kDriverValue + std::string("1"), false), kDefaultImage},
    {"DriverMissing", [](Registry& r) { r.deleteValue(kInstanceKey, "Driver"); }, kDefaultImage},
    {"DriverExpandable",
     [](Registry& r) { r.setValue(kInstanceKey, "Driver", 2, sim::kernel::utf16leBytes(kDriverValue)); },
     kDefaultImage},
    {"NoKeyForTheVendorAndProduct",
     [](Registry& r) { r.deleteKey("\\Registry\\Machine\\System\\CurrentControlSet\\Enum\\USB\\Vid_5C1D&Pid_4B01"); },
     kDefaultImage},
    {"InstanceKeyAccessDenied", [](Registry& r) { r.failCreateKey(kInstanceKey, sim::kernel::kStatusAccessDenied); },
     kDefaultImage},
    {"DriverKeyMissing", [](Registry& r) { r.deleteKey(kDriverKey); }, kDefaultImage},
    {"DriverKeyParentMissing",
     [](Registry& r) { r.setString(kInstanceKey, "Driver", "{00000000-0000-0000-0000-000000000000}\\0003"); },
     kDefaultImage},
    {"FirmwareMissing", [](Registry& r) { r.deleteValue(kDriverKey, "Firmware"); }, kDefaultImage},
    {"FirmwareExpandable",
     [](Registry& r) { r.setValue(kDriverKey, "Firmware", 2, sim::kernel::utf16leBytes(kImage)); }, kDefaultImage},
    {"FirmwareQueryFails",
     [](Registry& r) { r.failQuery(kDriverKey, "Firmware", sim::kernel::kStatusKeyDeleted); }, kDefaultImage},
    {"FirmwareOf259Characters", firmware(kLongestImage, true), kLongestImage},
    {"FirmwareOf259CharactersWithoutTerminator", firmware(kLongestImage, false), kLongestImage},
    {"FirmwareOf260Characters", firmware(imageOfLength(260), true), kDefaultImage},
    {"FirmwareOf260CharactersWithoutTerminator", firmware(imageOfLength(260), false), kDefaultImage},
};

class LocateFirmwareImage : public LocationWorld, public testing::WithParamInterface<LocateCase> {
protected:
    void SetUp() override
    {
        LocationWorld::SetUp();
        sim::kernel::registry().setString(kInstanceKey, "Driver", kDriverValue);
        sim::kernel::registry().setString(kDriverKey, "Firmware", kImage);
    }
};

}  // namespace

TEST_P(LocateFirmwareImage, FindsTheImagePath)
{
    GetParam().prepare(sim::kernel::registry());
    std::vector<WCHAR> path = untouchedBuffer(kPathCharacters);
    tStatus status = 0;
    locateFirmwareImage(0x5C1D, 0x4B01, 0x0001E240, path.data(), status);
    EXPECT_EQ(status, 0);
    EXPECT_EQ(textOf(path), GetParam().path);
}

INSTANTIATE_TEST_SUITE_P(Registry, LocateFirmwareImage, testing::ValuesIn(kCases),
                         [](const auto& info) { return std::string(info.param.name); });

namespace {

std::vector<std::string> describe(const std::vector<RegistryCall>& calls)
{
    std::vector<std::string> lines;
    for (const RegistryCall& call : calls) {
        bool open = call.kind == RegistryCall::Kind::createKey;
        lines.push_back((open ? "open " + call.keyPath : "query " + call.valueName) +
                        (open ? (call.desiredAccess == 0x20019 ? "" : " not for reading")
                              : (call.bufferLength == 536 ? "" : " not into 536 bytes")));
    }
    return lines;
}

}  // namespace

// Digits are upper case wherever they appear, and the default image is named
// after the product of the identity block.
TEST_F(LocationWorld, AsksInstanceKeyDriverKeyThenSystemRootInUpperCaseHex)
{
    std::string instance = instanceKey(0x5C1D, 0x4B0A, 0x00ABCDEF);
    ASSERT_NE(instance.find("Vid_5C1D&Pid_4B0A\\00ABCDEF"), std::string::npos);
    sim::kernel::registry().setString(instance, "Driver", kDriverValue);
    sim::kernel::registry().createKey(kDriverKey);

    std::vector<WCHAR> path = untouchedBuffer(kPathCharacters);
    tStatus status = 0;
    locateFirmwareImage(0x5c1d, 0x4b0a, 0x00abcdef, path.data(), status);

    EXPECT_EQ(status, 0);
    EXPECT_EQ(textOf(path), "C:\\WINDOWS\\system32\\drivers\\QVUSB4B0A.bin");
    // Key names match case-insensitively, so the names passed are compared as text.
    std::vector<std::string> expected = {"open " + instance,   "query Driver",
                                         "open " + kDriverKey, "query Firmware",
                                         std::string("open ") + kSystemVersionKey, "query SystemRoot"};
    EXPECT_EQ(describe(sim::kernel::registry().calls()), expected);
}

TEST_F(LocationWorld, MissingSerialKeyIsCreatedEmptyAndTheDefaultTaken)
{
    sim::kernel::registry().createKey("\\Registry\\Machine\\System\\CurrentControlSet\\Enum\\USB\\Vid_5C1D&Pid_4B01");
    std::vector<WCHAR> path = untouchedBuffer(kPathCharacters);
    tStatus status = 0;
    locateFirmwareImage(0x5C1D, 0x4B01, 0x0001E240, path.data(), status);
    EXPECT_EQ(status, 0);
    EXPECT_EQ(textOf(path), kDefaultImage);
    EXPECT_EQ(sim::kernel::registry().createdKeys(), std::vector<std::string>{kInstanceKey});
}

// A failed lookup resets the status, discarding a positive one the caller brought.
TEST_F(LocationWorld, PositiveStatusIsKeptOnlyWhenTheFirmwareValueIsFound)
{
    sim::kernel::registry().setString(kInstanceKey, "Driver", kDriverValue);
    for (bool named : {true, false}) {
        SCOPED_TRACE(named);
        if (named) sim::kernel::registry().setString(kDriverKey, "Firmware", kImage);
        else sim::kernel::registry().deleteValue(kDriverKey, "Firmware");
        std::vector<WCHAR> path = untouchedBuffer(kPathCharacters);
        tStatus status = 5;
        locateFirmwareImage(0x5C1D, 0x4B01, 0x0001E240, path.data(), status);
        EXPECT_EQ(status, named ? 5 : 0);
        EXPECT_EQ(textOf(path), named ? kImage : kDefaultImage);
    }
}

TEST_F(LocationWorld, DefaultFailingTooLeavesThePathEmpty)
{
    struct Case {
        const char* name;
        Prepare prepare;
        tStatus status;
    };
    const Case cases[] = {
        {"SystemRootMissing", [](Registry& r) { r.deleteValue(kSystemVersionKey, "SystemRoot"); },
         kStatusMissingOrMalformed},
        {"SystemVersionKeyParentMissing",
         [](Registry& r) { r.deleteKey("\\Registry\\Machine\\Software\\Microsoft\\Windows NT"); },
         kStatusRegistryKeyNotFound},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        sim::kernel::registry().setString(kSystemVersionKey, "SystemRoot", "C:\\WINDOWS");
        c.prepare(sim::kernel::registry());
        std::vector<WCHAR> path = untouchedBuffer(kPathCharacters);
        tStatus status = 0;
        locateFirmwareImage(0x5C1D, 0x4B01, 0x0001E240, path.data(), status);
        EXPECT_EQ(status, c.status);
        EXPECT_EQ(textOf(path), "");
    }
    EXPECT_EQ(sim::kernel::openHandleCount(), 0u);
}
