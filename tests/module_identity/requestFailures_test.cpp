// A request the device refuses ends the check: nothing is written after it,
// and what was written before it stays.
#include "identityCheckWorld.h"
#include "sim/host/simHost.h"

using namespace identity_test;

namespace {

constexpr tStatus kStalled = sim::kHostTransferStalled;
const sim::IdentityValues kBlank = block(0xFFFF, 0xFFFF, 0x0001E240);
const sim::IdentityValues kFixedFromCopy = block(0x5C1D, 0xFFFF, 0x00E08820, 0x4B02);
const sim::IdentityValues kFromFirmware = block(0x5C1D, 0xFFFF, 0x00E08820);

const IdentityCase kCases[] = {
    {"VendorRead", 0x4A10, kBlank, {}, 1, kStalled, 0, {"read 37F8 2 failed"}},
    {"SerialReadOfABlankBlock", 0x4A10, kBlank, {}, 3, kStalled, 0,
     {"read 37F8 2", "read 37F0 2", "read 37FC 4 failed"}},
    {"VendorWriteOfABlankBlock", 0x4A10, kBlank, {}, 4, kStalled, 0, on4A10({"write 37F8 failed"})},
    {"ProductWriteOfABlankBlockAfterTheVendor", 0x4A10, kBlank, {}, 5, kStalled, 0,
     on4A10({"write 37F8 5C1D", "write 37F0 failed"})},
    {"CopyRead", 0x4A10, kFixedFromCopy, {}, 4, kStalled, 0, on4A10({"read 37F2 2 failed"})},
    {"AlternativeRead", 0x4A10, kFromFirmware, bytes(kSignatureA), 5, kStalled, 0,
     on4A10({"read 37F2 2", "read 37FA 2 failed"})},
    {"FirmwareRead", 0x4A10, kFromFirmware, bytes(kSignatureA), 6, kStalled, 0,
     on4A10({"read 37F2 2", "read 37FA 2", "read 0C00 16 failed"})},
    {"ProductWriteLeavesTheCopyAlone", 0x4A10, kFixedFromCopy, {}, 5, kStalled, 0,
     on4A10({"read 37F2 2", "write 37F0 failed"})},
    {"CopyWriteAfterTheProductWord", 0x4A10, kFixedFromCopy, {}, 6, kStalled, 0,
     on4A10({"read 37F2 2", "write 37F0 4B01", "write 37F2 failed"})},
};

}  // namespace

INSTANTIATE_TEST_SUITE_P(FailedRequest, IdentityCheckTable, testing::ValuesIn(kCases),
                         [](const auto& info) { return std::string(info.param.name); });
