#include "identityCheckWorld.h"

using namespace identity_test;

TEST_P(IdentityCheckTable, ReturnsTheIdentityAndMakesExactlyTheseRequests)
{
    const IdentityCase& c = GetParam();
    sim::DeviceFaults faults;
    if (c.stalledRequest != 0) faults.stallRequests = {c.stalledRequest};
    IdentityOutcome outcome = runCheck(c.loaderProductId, c.identity, c.bytesAt0C00, faults);

    EXPECT_EQ(outcome.status, c.status);
    EXPECT_EQ(outcome.requests, c.requests);
    if (c.status >= 0) {
        EXPECT_EQ(outcome.vendorId, 0x5C1D);
        EXPECT_EQ(outcome.productId, c.productId);
        EXPECT_EQ(outcome.serialNumber, c.identity.serialNumber);
    }
}

TEST_F(IdentityCheckWorld, NegativeStatusOnEntryMakesNoRequest)
{
    for (const sim::IdentityValues& identity : {block(0x5C1D, 0x4B01, 1), block(0xFFFF, 0xFFFF, 1),
                                                block(0x5C1D, 0xFFFF, 0x00E08820, 0x4B02)}) {
        SCOPED_TRACE(identity.vendorId);
        IdentityOutcome outcome = runCheck(0x4A10, identity, {}, {}, -7);
        EXPECT_EQ(outcome.status, -7);
        EXPECT_EQ(outcome.requests, std::vector<std::string>{});
    }
    EXPECT_EQ(sim::kernel::registry().calls().size(), 0u);
}
