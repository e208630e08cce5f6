// Where a device's firmware image is found: a REG_SZ value read into a bounded
// destination, the driver key's "Firmware" value, or else the product's
// default image under the system root.
#include <algorithm>
#include <functional>
#include <string>
#include <vector>

#include "kernel/ntkernel.h"
#include "sim/kernel/kernelUtf16.h"
#include "source/imageLocation.h"
#include "source/statusCodes.h"
#include "tests/support/loaderWorld.h"

namespace {

using sim::kernel::Registry;
using sim::kernel::RegistryCall;
using testing_support::kSystemVersionKey;
using Prepare = std::function<void(Registry&)>;

constexpr const char* kKey = "\\Registry\\Machine\\Software\\Morvanek\\Test";
constexpr uint32_t kLimit = 8;  // characters, NUL included: 16 bytes of data at most
constexpr const char* kClassesKey = "\\Registry\\Machine\\System\\CurrentControlSet\\Control\\Class\\";
constexpr const char* kDriverValue = "{6D2F4B10-93A7-11CF-B4E8-00C05D7A3F21}\\0003";  // 43 characters
constexpr const char* kImage = "C:\\images\\missing.bin";                            // no such file: still taken
constexpr const char* kDefaultImage = "C:\\WINDOWS\\system32\\drivers\\QVUSB4B01.bin";
const std::string kInstanceKey = testing_support::instanceKey(0x5C1D, 0x4B01, 0x0001E240);
const std::string kDriverKey = std::string(kClassesKey) + kDriverValue;

// A buffer of that many characters, none of them a NUL.
std::vector<WCHAR> untouchedBuffer(size_t characters) { return std::vector<WCHAR>(characters, u'#'); }

// The buffer's text up to its NUL; "<no NUL>" when it has none.
std::string textOf(const std::vector<WCHAR>& buffer)
{
    auto end = std::find(buffer.begin(), buffer.end(), WCHAR(0));
    if (end == buffer.end()) return "<no NUL>";
    return sim::kernel::toUtf8(buffer.data(), static_cast<size_t>(end - buffer.begin()));
}

// The ways a path is built: the default image for product 0x0A1B, with the
// longest "SystemRoot" each takes (NUL included), and the lookup of a device
// without a registry key, which falls back to the first.
struct Builder {
    const char* name;
    void (*build)(WCHAR* path, tStatus& status);
    const char* fileName;
    size_t longestRootBytes;
};

const Builder kBuilders[] = {
    {"Image", [](WCHAR* path, tStatus& status) { buildDefaultImagePath(0x0A1B, path, status); },
     "\\system32\\drivers\\QVUSB0A1B.bin", 456},
    {"Image0200", [](WCHAR* path, tStatus& status) { buildDefaultImagePath0200(0x0A1B, path, status); },
     "\\system32\\drivers\\QVUSB0A1B0200.bin", 448},
    {"Located", [](WCHAR* path, tStatus& status) { locateFirmwareImage(0x5C1D, 0x0A1B, 1, path, status); },
     "\\system32\\drivers\\QVUSB0A1B.bin", 456},
};

std::string build(void (*builder)(WCHAR*, tStatus&), tStatus& status)
{
    std::vector<WCHAR> path = untouchedBuffer(kPathCharacters);
    builder(path.data(), status);
    return textOf(path);
}

std::string locate(uint16_t vendorId, uint16_t productId, uint32_t serialNumber, tStatus& status)
{
    std::vector<WCHAR> path = untouchedBuffer(kPathCharacters);
    locateFirmwareImage(vendorId, productId, serialNumber, path.data(), status);
    return textOf(path);
}

struct StringCase {
    const char* name;
    Prepare prepare;  // on a key that holds "Text" = "abc"
    tStatus status;
    const char* text;  // what the destination reads on success; null: untouched
};

struct LocateCase {
    const char* name;
    Prepare prepare;  // on a device whose "Driver" names kDriverKey, whose "Firmware" is kImage
    std::string path;
};

void PrintTo(const StringCase& c, std::ostream* out) { *out << c.name; }
void PrintTo(const LocateCase& c, std::ostream* out) { *out << c.name; }

Prepare text(const std::string& value, bool withNul)
{
    return [=](Registry& r) { r.setString(kKey, "Text", value, withNul); };
}

Prepare typed(uint32_t type, std::vector<uint8_t> data)
{
    return [=](Registry& r) { r.setValue(kKey, "Text", type, data); };
}

// A "Driver" value and a "Firmware" value under the key it names.
Prepare driver(const std::string& value, const std::string& image)
{
    return [=](Registry& r) {
        r.setString(kInstanceKey, "Driver", value);
        r.setString(kClassesKey + value, "Firmware", image);
    };
}

std::string imageOfLength(size_t characters) { return "C:\\images\\" + std::string(characters - 10, 'f'); }

// Every refusal leaves the destination as it was; no copy runs past the value's data or the destination.
const StringCase kStringCases[] = {
    {"16BytesWithNul", text("abcdefg", true), 0, "abcdefg"},
    {"18BytesWithNul", text("abcdefgh", true), kStatusMissingOrMalformed, nullptr},
    {"WithoutNulLeavingRoomForIt", text("abcdefg", false), 0, "abcdefg"},
    {"WithoutNulFillingTheDestination", text("abcdefgh", false), kStatusMissingOrMalformed, nullptr},
    {"EmptyWithoutData", typed(1, {}), 0, ""},
    {"EndsAtItsFirstNul", typed(1, {'a', 0, 'b', 0, 0, 0, 'c', 0, 0, 0}), 0, "ab"},
    {"ExpandableString", typed(2, sim::kernel::utf16leBytes("abc")), kStatusMissingOrMalformed, nullptr},
    {"LargerThanTheQueryRecord", text(std::string(300, 'a'), true), kStatusMissingOrMalformed, nullptr},
    {"ValueMissing", [](Registry& r) { r.deleteValue(kKey, "Text"); }, kStatusMissingOrMalformed, nullptr},
    {"ParentKeyMissing", [](Registry& r) { r.deleteKey("\\Registry\\Machine\\Software\\Morvanek"); },
     kStatusRegistryKeyNotFound, nullptr},
    {"AccessDenied", [](Registry& r) { r.failCreateKey(kKey, sim::kernel::kStatusAccessDenied); },
     kStatusMissingOrMalformed, nullptr},
};

// "Driver" may take 88 bytes, its NUL included; "Firmware" 520. Any failure falls back to the default image.
const LocateCase kLocateCases[] = {
    {"DriverOf88BytesNamesAnyKey", driver("{11111111-2222-3333-4444-555555555555}\\0000", "C:\\other.bin"),
     "C:\\other.bin"},
    {"DriverOf90Bytes", driver(kDriverValue + std::string("1"), kImage), kDefaultImage},
    {"FirmwareOf520Bytes", [](Registry& r) { r.setString(kDriverKey, "Firmware", imageOfLength(259)); },
     imageOfLength(259)},
    {"FirmwareOf522Bytes", [](Registry& r) { r.setString(kDriverKey, "Firmware", imageOfLength(260)); },
     kDefaultImage},
    {"DriverMissing", [](Registry& r) { r.deleteValue(kInstanceKey, "Driver"); }, kDefaultImage},
    {"DriverKeyParentMissing",
     [](Registry& r) { r.setString(kInstanceKey, "Driver", "{00000000-0000-0000-0000-000000000000}\\0003"); },
     kDefaultImage},
    {"FirmwareMissing", [](Registry& r) { r.deleteValue(kDriverKey, "Firmware"); }, kDefaultImage},
};

class LocationWorld : public testing_support::WorldTest {
protected:
    void SetUp() override
    {
        WorldTest::SetUp();
        sim::kernel::registry().setString(kSystemVersionKey, "SystemRoot", "C:\\WINDOWS");
    }

    static std::vector<WCHAR> readText(tStatus& status)
    {
        std::vector<WCHAR> destination = untouchedBuffer(kLimit);
        readRegistryString(sim::kernel::toUtf16(kKey).c_str(), u"Text", destination.data(), kLimit, status);
        return destination;
    }
};

class RegistryString : public LocationWorld, public testing::WithParamInterface<StringCase> {};
class LocateFirmwareImage : public LocationWorld, public testing::WithParamInterface<LocateCase> {};

}  // namespace

TEST_P(RegistryString, IsCopiedWholeOrRefusedWithTheDestinationUntouched)
{
    const StringCase& c = GetParam();
    sim::kernel::registry().setString(kKey, "Text", "abc");
    c.prepare(sim::kernel::registry());
    tStatus status = 0;
    std::vector<WCHAR> destination = readText(status);

    EXPECT_EQ(status, c.status);
    std::vector<WCHAR> expected = untouchedBuffer(kLimit);
    if (c.text != nullptr) {
        std::u16string text = sim::kernel::toUtf16(c.text);
        std::copy(text.c_str(), text.c_str() + text.size() + 1, expected.begin());  // and its NUL
    }
    EXPECT_EQ(destination, expected) << textOf(destination);
}

INSTANTIATE_TEST_SUITE_P(Value, RegistryString, testing::ValuesIn(kStringCases),
                         [](const auto& info) { return std::string(info.param.name); });

// A negative status brought in reads nothing; a positive one is kept.
TEST_F(LocationWorld, RegistryStringStatusOnEntry)
{
    sim::kernel::registry().setString(kKey, "Text", "abc");
    for (tStatus entry : {-7, 3}) {
        tStatus status = entry;
        EXPECT_EQ(textOf(readText(status)), entry < 0 ? "<no NUL>" : "abc");
        EXPECT_EQ(status, entry);
    }
    EXPECT_EQ(sim::kernel::registry().calls().size(), 2u);  // the positive run's open and query only
}

// A positive status brought in is kept when "Firmware" is found; the fallback starts afresh.
TEST_P(LocateFirmwareImage, FindsTheImagePath)
{
    sim::kernel::registry().setString(kInstanceKey, "Driver", kDriverValue);
    sim::kernel::registry().setString(kDriverKey, "Firmware", kImage);
    GetParam().prepare(sim::kernel::registry());
    tStatus status = 5;
    EXPECT_EQ(locate(0x5C1D, 0x4B01, 0x0001E240, status), GetParam().path);
    EXPECT_EQ(status, GetParam().path == kDefaultImage ? 0 : 5);
}

INSTANTIATE_TEST_SUITE_P(Registry, LocateFirmwareImage, testing::ValuesIn(kLocateCases),
                         [](const auto& info) { return std::string(info.param.name); });

// Digits are upper case wherever they appear, and the default image is named
// after the product of the identity block. Key names match case-insensitively,
// so the names passed are compared as text.
TEST_F(LocationWorld, AsksInstanceKeyDriverKeyThenSystemRootInUpperCaseHex)
{
    std::string instance = testing_support::instanceKey(0x5C1D, 0x4B0A, 0x00ABCDEF);
    ASSERT_NE(instance.find("Vid_5C1D&Pid_4B0A\\00ABCDEF"), std::string::npos);
    sim::kernel::registry().setString(instance, "Driver", kDriverValue);
    sim::kernel::registry().createKey(kDriverKey);

    tStatus status = 0;
    EXPECT_EQ(locate(0x5c1d, 0x4b0a, 0x00abcdef, status), "C:\\WINDOWS\\system32\\drivers\\QVUSB4B0A.bin");
    EXPECT_EQ(status, 0);
    std::vector<std::string> calls;
    for (const RegistryCall& call : sim::kernel::registry().calls()) {
        bool open = call.kind == RegistryCall::Kind::createKey;
        calls.push_back(open ? "open " + call.keyPath : "query " + call.valueName);
        EXPECT_EQ(open ? call.desiredAccess : call.bufferLength, open ? 0x20019u : 536u) << calls.back();
    }
    EXPECT_EQ(calls, (std::vector<std::string>{"open " + instance, "query Driver", "open " + kDriverKey,
                                               "query Firmware", "open " + std::string(kSystemVersionKey),
                                               "query SystemRoot"}));
}

TEST_F(LocationWorld, MissingSerialKeyIsCreatedEmptyAndTheDefaultTaken)
{
    sim::kernel::registry().createKey("\\Registry\\Machine\\System\\CurrentControlSet\\Enum\\USB\\Vid_5C1D&Pid_4B01");
    tStatus status = 0;
    EXPECT_EQ(locate(0x5C1D, 0x4B01, 0x0001E240, status), kDefaultImage);
    EXPECT_EQ(status, 0);
    EXPECT_EQ(sim::kernel::registry().createdKeys(), std::vector<std::string>{kInstanceKey});
}

// The longest "SystemRoot" taken gives a path of 258 characters; two bytes more are refused.
TEST_F(LocationWorld, LongestSystemRoot)
{
    for (const Builder& builder : kBuilders) {
        for (size_t rootBytes : {builder.longestRootBytes, builder.longestRootBytes + 2}) {
            SCOPED_TRACE(testing::Message() << builder.name << " " << rootBytes);
            bool accepted = rootBytes == builder.longestRootBytes;
            std::string systemRoot = "C:\\" + std::string(rootBytes / 2 - 4, 'w');
            sim::kernel::registry().setString(kSystemVersionKey, "SystemRoot", systemRoot);
            tStatus status = 0;
            std::string path = build(builder.build, status);
            EXPECT_EQ(status, accepted ? 0 : kStatusMissingOrMalformed);
            EXPECT_EQ(path, accepted ? systemRoot + builder.fileName : "");
            EXPECT_EQ(path.size(), accepted ? 258u : 0u);
        }
    }
}

// Whichever way the path is built, it is empty after a failure.
TEST_F(LocationWorld, PathIsEmptyAfterAFailure)
{
    struct Case {
        const char* name;
        Prepare prepare;
        tStatus entry;
        tStatus status;
    };
    const Case cases[] = {
        {"SystemRootMissing", [](Registry& r) { r.deleteValue(kSystemVersionKey, "SystemRoot"); }, 0,
         kStatusMissingOrMalformed},
        {"SystemVersionKeyParentMissing",
         [](Registry& r) { r.deleteKey("\\Registry\\Machine\\Software\\Microsoft\\Windows NT"); }, 0,
         kStatusRegistryKeyNotFound},
        {"NegativeStatusOnEntry", [](Registry&) {}, -7, -7},
    };
    for (const Builder& builder : kBuilders) {
        for (const Case& c : cases) {
            SCOPED_TRACE(testing::Message() << builder.name << " " << c.name);
            sim::kernel::registry().reset();
            sim::kernel::registry().setString(kSystemVersionKey, "SystemRoot", "C:\\WINDOWS");
            c.prepare(sim::kernel::registry());
            tStatus status = c.entry;
            EXPECT_EQ(build(builder.build, status), "");
            EXPECT_EQ(status, c.status);
            EXPECT_EQ(sim::kernel::registry().calls().empty(), c.entry < 0);
        }
    }
}
