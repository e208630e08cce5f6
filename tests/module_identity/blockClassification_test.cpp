// How the identity block is classified by its vendor ID, and the repair of a
// blank block from the registry.
#include "identityCheckWorld.h"
#include "source/statusCodes.h"

using namespace identity_test;

namespace {

const std::vector<std::string> kBlankRepairOn4A10 = on4A10({"write 37F8 5C1D", "write 37F0 4B0C"});

const IdentityCase kCases[] = {
    {"FamilyBlockIsReturnedAsRead", 0x4A10, block(0x5C1D, 0x4B01, 0x0001E240), {}, 0, 0, 0x4B01, on4A10()},
    {"FamilyBlockWithProductZeroIsReturnedAsRead", 0x4A10, block(0x5C1D, 0x0000, 0x00E08820, 0x4B02), {}, 0, 0,
     0x0000, on4A10()},
    {"FamilyBlockOnTheLargeLoader", 0x4A20, block(0x5C1D, 0x4B02, 0x12345678), {}, 0, 0, 0x4B02, on4A20()},
    {"ErasedProductOnTheLargeLoaderIsLeftAsRead", 0x4A20, block(0x5C1D, 0xFFFF, 0x00E08820, 0x4B02, 0x4B03),
     bytes(kSignatureA), 0, 0, 0xFFFF, on4A20()},

    // The copy and alternative words would lead the product repair elsewhere: a blank block never gets there.
    {"ErasedBlankTakesTheRegistryProduct", 0x4A10, block(0xFFFF, 0xFFFF, 0xFFFFFFFF, 0x4B02, 0x4B03), {}, 0, 0,
     0x4B0C, kBlankRepairOn4A10},
    {"ZeroedBlankTakesTheRegistryProduct", 0x4A10, block(0x0000, 0x0000, 0x00E08820, 0x4B02), bytes(kSignatureB), 0,
     0, 0x4B0C, kBlankRepairOn4A10},
    {"ErasedBlankOnTheLargeLoader", 0x4A20, block(0xFFFF, 0xFFFF, 0x0001E240), {}, 0, 0, 0x4B0C,
     on4A20({"write 7DF8 5C1D", "write 7DF0 4B0C"})},
    {"ZeroedBlankOnTheLargeLoader", 0x4A20, block(0x0000, 0x0000, 0x0001E240), {}, 0, 0, 0x4B0C,
     on4A20({"write 7DF8 5C1D", "write 7DF0 4B0C"})},

    {"ErasedVendorWithZeroProductIsRefused", 0x4A10, block(0xFFFF, 0x0000, 0x0001E240), {}, 0,
     kStatusForeignOrUnverified, 0, on4A10()},
    {"ZeroVendorWithErasedProductIsRefused", 0x4A10, block(0x0000, 0xFFFF, 0x0001E240), {}, 0,
     kStatusForeignOrUnverified, 0, on4A10()},
    {"ErasedVendorWithAProductIsRefused", 0x4A10, block(0xFFFF, 0x4B01, 0x0001E240), {}, 0,
     kStatusForeignOrUnverified, 0, on4A10()},
    {"ForeignVendorIsRefused", 0x4A20, block(0x1234, 0x4B01, 0x0001E240), {}, 0, kStatusForeignOrUnverified, 0,
     on4A20()},
    {"ForeignVendorWithErasedProductIsNotRepaired", 0x4A10, block(0x5C1E, 0xFFFF, 0x00E08820, 0x4B02), {}, 0,
     kStatusForeignOrUnverified, 0, on4A10()},
    {"ByteSwappedFamilyVendorIsForeign", 0x4A10, block(0x1D5C, 0x4B01, 0x0001E240), {}, 0,
     kStatusForeignOrUnverified, 0, on4A10()},
};

}  // namespace

INSTANTIATE_TEST_SUITE_P(Classification, IdentityCheckTable, testing::ValuesIn(kCases),
                         [](const auto& info) { return std::string(info.param.name); });

// The registry is asked only for a blank block, and leaves no key open.
TEST_F(IdentityCheckWorld, OnlyABlankBlockReadsTheRegistry)
{
    runCheck(0x4A10, block(0x5C1D, 0xFFFF, 0x00E08820, 0x4B02));
    runCheck(0x4A10, block(0x1234, 0x4B01, 0x0001E240));
    EXPECT_EQ(sim::kernel::registry().calls().size(), 0u);

    runCheck(0x4A10, block(0xFFFF, 0xFFFF, 0x0001E240));
    const auto& calls = sim::kernel::registry().calls();
    ASSERT_EQ(calls.size(), 2u);
    EXPECT_EQ(calls[0].keyPath, kDeviceClassKey);
    EXPECT_EQ(calls[0].desiredAccess, 0x20019u);
    EXPECT_EQ(calls[1].valueName, "FVTPID");
}
