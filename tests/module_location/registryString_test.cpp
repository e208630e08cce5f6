// Reading a REG_SZ value into a bounded destination: every refusal leaves the
// destination as it was, and no copy runs past the value's data or the
// destination.
#include "locationWorld.h"
#include "source/imageLocation.h"
#include "source/statusCodes.h"

using namespace location_test;
using sim::kernel::Registry;

namespace {

constexpr const char* kParentKey = "\\Registry\\Machine\\Software\\Morvanek";
constexpr const char* kKey = "\\Registry\\Machine\\Software\\Morvanek\\Test";
constexpr uint32_t kLimit = 8;  // characters, NUL included

struct StringCase {
    const char* name;
    Prepare prepare;  // on a key that holds "Text" = "abc"
    tStatus status;
    const char* text;  // what the destination reads on success
};

void PrintTo(const StringCase& stringCase, std::ostream* out) { *out << stringCase.name; }

Prepare text(const std::string& value, bool withTerminator)
{
    return [=](Registry& r) { r.setString(kKey, "Text", value, withTerminator); };
}

Prepare typed(uint32_t type, std::vector<uint8_t> data)
{
    return [=](Registry& r) { r.setValue(kKey, "Text", type, data); };
}

const StringCase kCases[] = {
    {"AtTheLimitWithTerminator", text("abcdefg", true), 0, "abcdefg"},
    {"OverTheLimitWithTerminator", text("abcdefgh", true), kStatusMissingOrMalformed, nullptr},
    {"WithoutTerminatorLeavingRoomForIt", text("abcdefg", false), 0, "abcdefg"},
    {"WithoutTerminatorFillingTheDestination", text("abcdefgh", false), kStatusMissingOrMalformed, nullptr},
    {"EmptyWithoutData", typed(1, {}), 0, ""},
    {"EndsAtItsFirstNul", typed(1, {'a', 0, 'b', 0, 0, 0, 'c', 0, 0, 0}), 0, "ab"},
    {"ExpandableString", typed(2, sim::kernel::utf16leBytes("abc")), kStatusMissingOrMalformed, nullptr},
    {"MultiString", typed(7, sim::kernel::multiStringBytes({"abc"})), kStatusMissingOrMalformed, nullptr},
    {"Number", [](Registry& r) { r.setDword(kKey, "Text", 0x616263); }, kStatusMissingOrMalformed, nullptr},
    {"LargerThanTheQueryRecord", text(repeat('a', 300), true), kStatusMissingOrMalformed, nullptr},
    {"ValueMissing", [](Registry& r) { r.deleteValue(kKey, "Text"); }, kStatusMissingOrMalformed, nullptr},
    {"QueryFails", [](Registry& r) { r.failQuery(kKey, "Text", sim::kernel::kStatusKeyDeleted); },
     kStatusMissingOrMalformed, nullptr},
    // The open creates a missing last component; the new key has no value.
    {"KeyMissing", [](Registry& r) { r.deleteKey(kKey); }, kStatusMissingOrMalformed, nullptr},
    {"ParentMissing", [](Registry& r) { r.deleteKey(kParentKey); }, kStatusRegistryKeyNotFound, nullptr},
    {"AccessDenied", [](Registry& r) { r.failCreateKey(kKey, sim::kernel::kStatusAccessDenied); },
     kStatusMissingOrMalformed, nullptr},
    {"KeyReportedNotFound", [](Registry& r) { r.failCreateKey(kKey, kStatusObjectNameNotFound); },
     kStatusRegistryKeyNotFound, nullptr},
};

class RegistryString : public LocationWorld, public testing::WithParamInterface<StringCase> {
};

}  // namespace

TEST_P(RegistryString, IsCopiedWhole_OrRefusedWithTheDestinationUntouched)
{
    const StringCase& c = GetParam();
    sim::kernel::registry().setString(kKey, "Text", "abc");
    c.prepare(sim::kernel::registry());

    std::vector<WCHAR> destination = untouchedBuffer(kLimit);
    tStatus status = 0;
    readRegistryString(sim::kernel::toUtf16(kKey).c_str(), u"Text", destination.data(), kLimit, status);

    EXPECT_EQ(status, c.status);
    if (c.text == nullptr) {
        EXPECT_TRUE(isUntouched(destination)) << textOf(destination);
    } else {
        EXPECT_EQ(textOf(destination), c.text);
        size_t end = std::string(c.text).size() + 1;
        EXPECT_TRUE(isUntouched({destination.begin() + static_cast<std::ptrdiff_t>(end), destination.end()}));
    }
    EXPECT_EQ(sim::kernel::openHandleCount(), 0u);
}

INSTANTIATE_TEST_SUITE_P(Value, RegistryString, testing::ValuesIn(kCases),
                         [](const auto& info) { return std::string(info.param.name); });

TEST_F(LocationWorld, StatusOnEntry_NegativeReadsNothing_PositiveIsKept)
{
    sim::kernel::registry().setString(kKey, "Text", "abc");
    for (tStatus entry : {-7, 3}) {
        SCOPED_TRACE(entry);
        std::vector<WCHAR> destination = untouchedBuffer(kLimit);
        tStatus status = entry;
        readRegistryString(sim::kernel::toUtf16(kKey).c_str(), u"Text", destination.data(), kLimit, status);
        EXPECT_EQ(status, entry);
        EXPECT_EQ(textOf(destination), entry < 0 ? "<no NUL>" : "abc");
    }
    EXPECT_EQ(sim::kernel::registry().calls().size(), 2u);  // the positive run's open and query only
}
