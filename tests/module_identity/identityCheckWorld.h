// Runs the identity check on an emulated loader-mode device and reports what
// it returned and every request the device saw, in a form tables can spell out.
#pragma once

#include <ostream>
#include <string>
#include <utility>
#include <vector>

#include "sim/device/enumeratedDevice.h"
#include "source/DeviceTable.h"
#include "tests/support/LoaderWorld.h"

namespace identity_test {

using testing_support::kDeviceClassKey;

constexpr uint8_t kSignatureA[16] = {0x30, 0xE4, 0x10, 0x75, 0x96, 0x11, 0x75, 0x97,
                                     0x80, 0xE5, 0x96, 0x20, 0xE7, 0xFB, 0xE4, 0x90};
constexpr uint8_t kSignatureB[16] = {0x83, 0x02, 0x0C, 0x04, 0xE4, 0x93, 0xFC, 0x74,
                                     0x01, 0x93, 0xFD, 0x74, 0x02, 0x93, 0xFE, 0x74};

inline sim::IdentityValues block(uint16_t vendorId, uint16_t productId, uint32_t serialNumber,
                                 uint16_t productIdCopy = 0xFFFF, uint16_t altProductId = 0xFFFF)
{
    sim::IdentityValues values;
    values.vendorId = vendorId;
    values.productId = productId;
    values.serialNumber = serialNumber;
    values.productIdCopy = productIdCopy;
    values.altProductId = altProductId;
    return values;
}

struct IdentityOutcome {
    tStatus status = 0;
    uint16_t vendorId = 0;
    uint16_t productId = 0;
    uint32_t serialNumber = 0;
    // "read 37F8 2", "write 37F0 4B01"; " failed" when the transfer did not go through.
    std::vector<std::string> requests;
};

// The three reads every check starts with, then the given requests.
std::vector<std::string> afterIdentityReads(uint16_t identityPage, std::vector<std::string> more = {});

class IdentityCheckWorld : public testing_support::WorldTest {
protected:
    // "FVTPID" = "4B0C": a product no repair of the block yields, so a blank
    // block's repair shows in what is written.
    void SetUp() override;

    // Plugs in a device with the block (and the bytes at 0x0C00, when given),
    // opens a channel, runs the check with the entry status, closes the channel.
    IdentityOutcome runCheck(uint16_t loaderProductId, const sim::IdentityValues& identity,
                             const std::vector<uint8_t>& bytesAt0C00 = {}, sim::DeviceFaults faults = {},
                             tStatus entryStatus = 0);
};

// One run of the check: the device, what it returns and the requests it sees.
struct IdentityCase {
    const char* name;
    uint16_t loaderProductId;
    sim::IdentityValues identity;
    std::vector<uint8_t> bytesAt0C00;
    uint64_t stalledRequest;  // counted from 1; 0: none
    tStatus status;
    uint16_t productId;  // with vendor 0x5C1D and the stored serial, when the status is not negative
    std::vector<std::string> requests;
};
void PrintTo(const IdentityCase& identityCase, std::ostream* out);

class IdentityCheckTable : public IdentityCheckWorld, public testing::WithParamInterface<IdentityCase> {
};

// The requests of a device of each loader: the identity reads, then `more`.
inline std::vector<std::string> on4A10(std::vector<std::string> more = {})
{
    return afterIdentityReads(0x3600, std::move(more));
}
inline std::vector<std::string> on4A20(std::vector<std::string> more = {})
{
    return afterIdentityReads(0x7C00, std::move(more));
}

inline std::vector<uint8_t> bytes(const uint8_t (&array)[16]) { return std::vector<uint8_t>(array, array + 16); }

}  // namespace identity_test
