// A blank block's product ID comes from "FVTPID" under the device class key:
// at most 10 bytes of text, of which four hex digits count.
#include <functional>

#include "identityCheckWorld.h"
#include "source/identityCheck.h"
#include "source/statusCodes.h"

using namespace identity_test;
using sim::kernel::Registry;

namespace {

constexpr const char* kClassesKey = "\\Registry\\Machine\\System\\CurrentControlSet\\Control\\Class";

struct ProductIdCase {
    const char* name;
    std::function<void(Registry&)> prepare;  // on a class key that holds "FVTPID" = "4B0C"
    tStatus status;
    const char* written;  // the product ID written and returned, in hex; null when the status is a failure
};

void PrintTo(const ProductIdCase& productIdCase, std::ostream* out) { *out << productIdCase.name; }

void setText(Registry& registry, const std::string& text, bool withTerminator)
{
    registry.setString(kDeviceClassKey, "FVTPID", text, withTerminator);
}

const ProductIdCase kCases[] = {
    {"FourDigits", [](Registry& r) { setText(r, "4B01", true); }, 0, "4B01"},
    {"FourDigitsWithoutTerminator", [](Registry& r) { setText(r, "4B01", false); }, 0, "4B01"},
    {"FiveDigitsWithoutTerminatorUseTheFirstFour", [](Registry& r) { setText(r, "4B02A", false); }, 0, "4B02"},
    {"FewerDigits", [](Registry& r) { setText(r, "4B", true); }, 0, "004B"},
    {"LowerCaseDigits", [](Registry& r) { setText(r, "4b0a", true); }, 0, "4B0A"},
    {"FiveDigitsWithTerminatorAreTooLong", [](Registry& r) { setText(r, "4B02A", true); },
     kStatusMissingOrMalformed, nullptr},
    {"SixDigitsWithoutTerminatorAreTooLong", [](Registry& r) { setText(r, "4B02AB", false); },
     kStatusMissingOrMalformed, nullptr},
    {"LargerThanTheQueryRecord", [](Registry& r) { setText(r, std::string(600, '4'), true); },
     kStatusMissingOrMalformed, nullptr},
    {"ValueMissing", [](Registry& r) { r.deleteValue(kDeviceClassKey, "FVTPID"); }, kStatusMissingOrMalformed,
     nullptr},
    {"ValueOnlyInAnInstanceSubkey",
     [](Registry& r) {
         r.deleteValue(kDeviceClassKey, "FVTPID");
         r.setString(std::string(kDeviceClassKey) + "\\0000", "FVTPID", "4B01");
     },
     kStatusMissingOrMalformed, nullptr},
    {"ExpandableString",
     [](Registry& r) { r.setValue(kDeviceClassKey, "FVTPID", 2, sim::kernel::utf16leBytes("4B01")); },
     kStatusMissingOrMalformed, nullptr},
    {"Number", [](Registry& r) { r.setDword(kDeviceClassKey, "FVTPID", 0x4B01); }, kStatusMissingOrMalformed,
     nullptr},
    {"QueryFails",
     [](Registry& r) { r.failQuery(kDeviceClassKey, "FVTPID", sim::kernel::kStatusKeyDeleted); },
     kStatusMissingOrMalformed, nullptr},
    {"AccessDeniedOnTheClassKey",
     [](Registry& r) { r.failCreateKey(kDeviceClassKey, sim::kernel::kStatusAccessDenied); },
     kStatusMissingOrMalformed, nullptr},
    {"ClassKeyReportedNotFound", [](Registry& r) { r.failCreateKey(kDeviceClassKey, kStatusObjectNameNotFound); },
     kStatusRegistryKeyNotFound, nullptr},
    // The open creates a missing last component, so the class key comes back empty.
    {"ClassKeyMissing", [](Registry& r) { r.deleteKey(kDeviceClassKey); }, kStatusMissingOrMalformed, nullptr},
    {"ParentOfTheClassKeyMissing", [](Registry& r) { r.deleteKey(kClassesKey); }, kStatusRegistryKeyNotFound,
     nullptr},
};

class RegistryProductId : public IdentityCheckWorld, public testing::WithParamInterface<ProductIdCase> {
};

}  // namespace

TEST_P(RegistryProductId, RepairsABlankBlockOrWritesNothing)
{
    const ProductIdCase& c = GetParam();
    Registry& registry = sim::kernel::registry();
    c.prepare(registry);

    for (const sim::IdentityValues& blank : {block(0xFFFF, 0xFFFF, 0x0001E240), block(0x0000, 0x0000, 0)}) {
        SCOPED_TRACE(blank.vendorId);
        IdentityOutcome outcome = runCheck(0x4A10, blank);
        EXPECT_EQ(outcome.status, c.status);
        if (c.written == nullptr) {
            EXPECT_EQ(outcome.requests, on4A10());
        } else {
            EXPECT_EQ(outcome.requests, on4A10({"write 37F8 5C1D", std::string("write 37F0 ") + c.written}));
            EXPECT_EQ(outcome.vendorId, 0x5C1D);
            EXPECT_EQ(outcome.productId, std::stoul(c.written, nullptr, 16));
            EXPECT_EQ(outcome.serialNumber, blank.serialNumber);
        }
    }
}

INSTANTIATE_TEST_SUITE_P(Fvtpid, RegistryProductId, testing::ValuesIn(kCases),
                         [](const auto& info) { return std::string(info.param.name); });

// Only a clean read is converted: a status brought in, even a positive one,
// leaves the product ID as it was.
TEST_F(IdentityCheckWorld, ProductIdIsTakenOnlyWithAZeroStatus)
{
    struct Case {
        tStatus entry;
        uint16_t productId;
        size_t registryCalls;
    };
    for (const Case& c : {Case{0, 0x4B0C, 2}, Case{3, 0xFFFF, 2}, Case{-7, 0xFFFF, 0}}) {
        SCOPED_TRACE(c.entry);
        sim::kernel::registry().reset();
        sim::kernel::registry().setString(kDeviceClassKey, "FVTPID", "4B0C");
        uint16_t productId = 0xFFFF;
        tStatus status = c.entry;
        readRegistryProductId(productId, status);
        EXPECT_EQ(status, c.entry);
        EXPECT_EQ(productId, c.productId);
        EXPECT_EQ(sim::kernel::registry().calls().size(), c.registryCalls);
        EXPECT_EQ(sim::kernel::openHandleCount(), 0u);
    }
}
