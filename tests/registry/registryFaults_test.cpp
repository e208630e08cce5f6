// Registry faults as a real kernel can produce them: at one call of a key or
// value only, and an overflow that still fills the record's header.
#include <stdexcept>

#include "moduleRegistryCalls.h"

using namespace registry_test;

namespace {

constexpr NTSTATUS kStatusInsufficientResources = static_cast<NTSTATUS>(0xC000009Au);

TEST_F(RegistryTest, ANumberedFaultStrikesOnlyThatCallOfItsKeyOrValue)
{
    registry().setString(kUsbKey, "FVTPID", "4B01");
    registry().setString(kUsbKey, "Driver", "x");
    registry().failCreateKey(kUsbKeyOtherCase, kStatusAccessDenied, 2);
    registry().failQuery(kUsbKey, "fvtpid", kStatusInsufficientResources, 3);

    std::vector<NTSTATUS> opens;
    std::vector<NTSTATUS> queries;
    for (int call = 0; call < 3; ++call) {
        HANDLE key = nullptr;
        opens.push_back(openKey(kUsbKey, key));
        if (key == nullptr) continue;
        queries.push_back(queryValue(key, "Driver").status);  // another value: not counted
        queries.push_back(queryValue(key, "FVTPID").status);
        EXPECT_EQ(ZwClose(key), kStatusSuccess);
    }
    EXPECT_EQ(opens, (std::vector<NTSTATUS>{kStatusSuccess, kStatusAccessDenied, kStatusSuccess}));
    EXPECT_EQ(queries, (std::vector<NTSTATUS>{kStatusSuccess, kStatusSuccess, kStatusSuccess, kStatusSuccess}));

    // The third query of FVTPID fails; the fourth does not.
    HANDLE key = nullptr;
    ASSERT_EQ(openKey(kUsbKey, key), kStatusSuccess);
    EXPECT_EQ(queryValue(key, "FVTPID").status, kStatusInsufficientResources);
    EXPECT_EQ(queryValue(key, "FVTPID").status, kStatusSuccess);
    EXPECT_EQ(ZwClose(key), kStatusSuccess);
}

TEST_F(RegistryTest, AnInjectedOverflowFillsTheHeaderAndTheResultLengthButNoData)
{
    registry().setString(kClassKey, "FVTPID", "4B02");
    registry().failQuery(kClassKey, "FVTPID", kStatusBufferOverflow);
    registry().failQuery(kClassKey, "Missing", kStatusBufferOverflow);
    HANDLE key = nullptr;
    ASSERT_EQ(openKey(kClassKey, key), kStatusSuccess);

    QueryResult present = queryValue(key, "FVTPID");
    EXPECT_EQ(present.status, kStatusBufferOverflow);
    EXPECT_EQ(present.resultLength, 12u + 10u);
    EXPECT_EQ(present.word(4), 1u);   // REG_SZ
    EXPECT_EQ(present.word(8), 10u);  // its data length
    EXPECT_EQ(present.data(10), std::vector<uint8_t>(10, kUntouched));

    QueryResult missing = queryValue(key, "Missing");
    EXPECT_EQ(missing.status, kStatusBufferOverflow);
    EXPECT_EQ(missing.resultLength, 12u);
    EXPECT_EQ(missing.word(8), 0u);
    EXPECT_EQ(ZwClose(key), kStatusSuccess);
}

// A fault that succeeds would hand out no handle, or a record never filled.
TEST_F(RegistryTest, AFaultMustBeAFailure)
{
    EXPECT_THROW(registry().failCreateKey(kUsbKey, kStatusSuccess), std::invalid_argument);
    EXPECT_THROW(registry().failQuery(kUsbKey, "FVTPID", 0x00000103), std::invalid_argument);
}

}  // namespace
