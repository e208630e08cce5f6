// The identity check on an emulated loader-mode device: how the block is
// classified, each repair, and every request the device sees, so that a table
// row shows nothing else was read or written.
#include <cstdio>
#include <functional>
#include <string>
#include <vector>

#include "sim/device/enumeratedDevice.h"
#include "source/deviceTable.h"
#include "source/loaderChannel.h"
#include "source/identityCheck.h"
#include "source/statusCodes.h"
#include "tests/support/loaderWorld.h"

namespace {

using sim::kernel::Registry;
using testing_support::kDeviceClassKey;
using Prepare = std::function<void(Registry&)>;

constexpr tStatus kStalled = sim::kHostTransferStalled;
constexpr uint8_t kSignatureA[16] = {0x30, 0xE4, 0x10, 0x75, 0x96, 0x11, 0x75, 0x97,
                                     0x80, 0xE5, 0x96, 0x20, 0xE7, 0xFB, 0xE4, 0x90};
constexpr uint8_t kSignatureB[16] = {0x83, 0x02, 0x0C, 0x04, 0xE4, 0x93, 0xFC, 0x74,
                                     0x01, 0x93, 0xFD, 0x74, 0x02, 0x93, 0xFE, 0x74};

sim::IdentityValues block(uint16_t vendorId, uint16_t productId, uint32_t serialNumber, uint16_t productIdCopy = 0xFFFF,
                          uint16_t altProductId = 0xFFFF)
{
    return {vendorId, productId, serialNumber, productIdCopy, altProductId};
}

// Vendor 0x5C1D with an erased product ID word.
sim::IdentityValues erased(uint32_t serialNumber, uint16_t productIdCopy, uint16_t altProductId = 0xFFFF)
{
    return block(0x5C1D, 0xFFFF, serialNumber, productIdCopy, altProductId);
}

const sim::IdentityValues kBlank = block(0xFFFF, 0xFFFF, 0x0001E240, 0x4B02, 0x4B03);

// A signature at 0x0C00, with one byte changed when `changed` is below 16.
std::vector<uint8_t> flash(const uint8_t (&signature)[16], size_t changed = 16)
{
    std::vector<uint8_t> bytes(signature, signature + 16);
    if (changed < 16) bytes[changed] ^= 0x01;
    return bytes;
}

std::string hex(unsigned value, int digits)
{
    char text[12];
    std::snprintf(text, sizeof text, "%0*X", digits, value);
    return text;
}

// "read 37F8 2", "write 37F0 4B01"; " failed" when refused (a refused write carried no data).
std::string describe(const sim::RequestRecord& record)
{
    std::string text = (record.kind == sim::RequestKind::Read ? "read " : "write ") + hex(record.wIndex, 4);
    if (record.kind == sim::RequestKind::Read) {
        text += " " + std::to_string(record.length);
    } else if (!record.data.empty()) {
        text += " ";
        for (uint8_t byte : record.data) text += hex(byte, 2);
    }
    return record.outcome == 0 ? text : text + " failed";
}

// The three reads every check starts with, on the identity page of each loader, then `more`.
std::vector<std::string> reads(uint16_t page, std::vector<std::string> more)
{
    std::vector<std::string> all = {"read " + hex(page + 0x1F8u, 4) + " 2", "read " + hex(page + 0x1F0u, 4) + " 2",
                                    "read " + hex(page + 0x1FCu, 4) + " 4"};
    all.insert(all.end(), more.begin(), more.end());
    return all;
}
std::vector<std::string> on4A10(std::vector<std::string> more = {}) { return reads(0x3600, std::move(more)); }
std::vector<std::string> on4A20(std::vector<std::string> more = {}) { return reads(0x7C00, std::move(more)); }

// A blank block repaired on the small loader: vendor, then the registry's product; the copy word is left alone.
std::vector<std::string> blankRepaired(const std::string& productId)
{
    return on4A10({"write 37F8 5C1D", "write 37F0 " + productId});
}
std::vector<std::string> fromCopy(const std::string& productId)
{
    return on4A10({"read 37F2 2", "write 37F0 " + productId, "write 37F2 " + productId});
}
std::vector<std::string> fromFlash(const std::string& productId)
{
    return on4A10({"read 37F2 2", "read 37FA 2", "read 0C00 16", "write 37F0 " + productId, "write 37F2 " + productId});
}

Prepare fvtpid(const std::string& text, bool withNul)
{
    return [=](Registry& r) { r.setString(kDeviceClassKey, "FVTPID", text, withNul); };
}

struct Outcome {
    tStatus status = 0;
    uint16_t vendorId = 0;
    uint16_t productId = 0;
    uint32_t serialNumber = 0;
    std::vector<std::string> requests;
};

class IdentityCheck : public testing_support::WorldTest {
protected:
    // "FVTPID" = "4B0C" (10 bytes with its NUL): a product no repair of the
    // block yields, so that a blank block's repair shows in what is written.
    void SetUp() override
    {
        WorldTest::SetUp();
        sim::kernel::registry().setString(kDeviceClassKey, "FVTPID", "4B0C");
    }

    Outcome run(uint16_t loaderProductId, const sim::IdentityValues& identity, const std::vector<uint8_t>& at0C00 = {},
                uint64_t stalledRequest = 0, tStatus entryStatus = 0)
    {
        sim::EmulatedDeviceOptions options;
        options.loaderProductId = loaderProductId;
        options.identity = identity;
        if (!at0C00.empty()) options.memory = {{0x0C00, at0C00}};
        if (stalledRequest != 0) options.faults.stallRequests = {stalledRequest};
        sim::LoaderModeDevice& device = sim::plugInLoaderDevice(options);

        Outcome outcome;
        LoaderChannel channel;
        openLoaderChannel(channel, &device, loaderProductId, outcome.status);
        EXPECT_EQ(outcome.status, 0) << "the channel must open for the check to be seen";
        outcome.status = entryStatus;
        DeviceTable::checkIdentity(channel, outcome.vendorId, outcome.productId, outcome.serialNumber,
                                   outcome.status);
        closeLoaderChannel(channel);
        for (const sim::RequestRecord& record : device.hardware().trace) outcome.requests.push_back(describe(record));
        return outcome;
    }
};

struct IdentityCase {
    const char* name;
    Prepare registry;  // on a class key holding "FVTPID" = "4B0C"; may be empty
    uint16_t loaderProductId;
    sim::IdentityValues identity;
    std::vector<uint8_t> at0C00;
    uint64_t stalledRequest;  // counted from 1; 0: none
    tStatus status;
    uint16_t productId;  // returned with vendor 0x5C1D and the serial as read, unless the status is negative
    std::vector<std::string> requests;
};

void PrintTo(const IdentityCase& c, std::ostream* out) { *out << c.name; }

const IdentityCase kCases[] = {
    // Classification. A family block is returned as read, though its copy and alternative words would lead a repair
    // elsewhere; a blank one takes the registry's product; anything else is refused.
    {"FamilyBlockWithProductZeroIsAsRead", {}, 0x4A10, block(0x5C1D, 0x0000, 0x00E08820, 0x4B02), {}, 0, 0, 0x0000,
     on4A10()},
    {"ErasedProductOnTheLargeLoaderIsAsRead", {}, 0x4A20, erased(0x00E08820, 0x4B02, 0x4B03), flash(kSignatureA), 0,
     0, 0xFFFF, on4A20()},
    {"ErasedBlankTakesTheRegistryProduct", {}, 0x4A10, kBlank, flash(kSignatureB), 0, 0, 0x4B0C, blankRepaired("4B0C")},
    {"ZeroedBlankOnTheLargeLoader", {}, 0x4A20, block(0x0000, 0x0000, 0x0001E240), {}, 0, 0, 0x4B0C,
     on4A20({"write 7DF8 5C1D", "write 7DF0 4B0C"})},
    {"ErasedVendorWithZeroProductIsRefused", {}, 0x4A10, block(0xFFFF, 0x0000, 0x0001E240), {}, 0,
     kStatusForeignOrUnverified, 0, on4A10()},
    {"ZeroVendorWithErasedProductIsRefused", {}, 0x4A10, block(0x0000, 0xFFFF, 0x0001E240), {}, 0,
     kStatusForeignOrUnverified, 0, on4A10()},
    {"ForeignVendorWithErasedProductIsNotRepaired", {}, 0x4A10, block(0x5C1E, 0xFFFF, 0x00E08820, 0x4B02), {}, 0,
     kStatusForeignOrUnverified, 0, on4A10()},
    {"ByteSwappedFamilyVendorIsForeign", {}, 0x4A10, block(0x1D5C, 0x4B01, 0x0001E240), {}, 0,
     kStatusForeignOrUnverified, 0, on4A10()},

    // A blank block's product from "FVTPID": at most 10 bytes, of which four hex digits count.
    {"FvtpidOf10BytesWithoutNulGivesItsFirstFourDigits", fvtpid("4B02A", false), 0x4A10, kBlank, {}, 0, 0, 0x4B02,
     blankRepaired("4B02")},
    {"FvtpidOf12BytesIsRefused", fvtpid("4B02A", true), 0x4A10, kBlank, {}, 0, kStatusMissingOrMalformed, 0, on4A10()},
    {"FvtpidOfTwoLowerCaseDigits", fvtpid("4b", true), 0x4A10, kBlank, {}, 0, 0, 0x004B, blankRepaired("004B")},
    {"FvtpidMissing", [](Registry& r) { r.deleteValue(kDeviceClassKey, "FVTPID"); }, 0x4A10, kBlank, {}, 0,
     kStatusMissingOrMalformed, 0, on4A10()},
    {"FvtpidOnlyInAnInstanceSubkey",
     [](Registry& r) {
         r.deleteValue(kDeviceClassKey, "FVTPID");
         r.setString(std::string(kDeviceClassKey) + "\\0000", "FVTPID", "4B01");
     },
     0x4A10, kBlank, {}, 0, kStatusMissingOrMalformed, 0, on4A10()},
    {"FvtpidExpandable",
     [](Registry& r) { r.setValue(kDeviceClassKey, "FVTPID", 2, sim::kernel::utf16leBytes("4B01")); }, 0x4A10,
     kBlank, {}, 0, kStatusMissingOrMalformed, 0, on4A10()},
    // The open creates a missing last component, so the class key comes back empty.
    {"ClassKeyMissing", [](Registry& r) { r.deleteKey(kDeviceClassKey); }, 0x4A10, kBlank, {}, 0,
     kStatusMissingOrMalformed, 0, on4A10()},
    {"ParentOfTheClassKeyMissing",
     [](Registry& r) { r.deleteKey("\\Registry\\Machine\\System\\CurrentControlSet\\Control\\Class"); }, 0x4A10,
     kBlank, {}, 0, kStatusRegistryKeyNotFound, 0, on4A10()},

    // An erased product ID word on the small loader: the copy word, checked against the serial list...
    {"CopyFixedForTheFirstListedSerial", {}, 0x4A10, erased(0x00E08820, 0x4B02), {}, 0, 0, 0x4B01, fromCopy("4B01")},
    {"CopyFixedForTheLastListedSerial", {}, 0x4A10, erased(0x00E0DECC, 0x4B02), {}, 0, 0, 0x4B01, fromCopy("4B01")},
    {"CopyKeptForSerialZero", {}, 0x4A10, erased(0x00000000, 0x4B02), {}, 0, 0, 0x4B02, fromCopy("4B02")},
    {"CopyZeroIsTaken", {}, 0x4A10, erased(0x00E08820, 0x0000), {}, 0, 0, 0x0000, fromCopy("0000")},
    // ...the alternative word 0x4B03 (signature B would say 0x4B02: the flash is not looked at)...
    {"AlternativeTakenWithoutTheFlash", {}, 0x4A10, erased(0x0001E240, 0xFFFF, 0x4B03), flash(kSignatureB), 0, 0,
     0x4B03, on4A10({"read 37F2 2", "read 37FA 2", "write 37F0 4B03", "write 37F2 4B03"})},
    // ...or the firmware's signature, A telling the products apart by the serial ranges.
    {"SignatureAOutsideTheRangesWithAnotherAlternative", {}, 0x4A10, erased(0x00E10F21, 0xFFFF, 0x4B02),
     flash(kSignatureA), 0, 0, 0x4B01, fromFlash("4B01")},
    {"SignatureAInARange", {}, 0x4A10, erased(0x00E10F22, 0xFFFF), flash(kSignatureA), 0, 0, 0x4B02, fromFlash("4B02")},
    {"SignatureBOutsideTheRanges", {}, 0x4A10, erased(0x0001E240, 0xFFFF), flash(kSignatureB), 0, 0, 0x4B02,
     fromFlash("4B02")},
    {"SignatureAWithItsLastByteChanged", {}, 0x4A10, erased(0x00E10F22, 0xFFFF), flash(kSignatureA, 15), 0,
     kStatusFlashNotRecognised, 0, on4A10({"read 37F2 2", "read 37FA 2", "read 0C00 16"})},
    {"SignatureBWithItsFirstByteChanged", {}, 0x4A10, erased(0x0001E240, 0xFFFF), flash(kSignatureB, 0), 0,
     kStatusFlashNotRecognised, 0, on4A10({"read 37F2 2", "read 37FA 2", "read 0C00 16"})},

    // A refused request ends the check: nothing is sent after it, and what was written before it stays.
    {"VendorReadRefused", {}, 0x4A10, kBlank, {}, 1, kStalled, 0, {"read 37F8 2 failed"}},
    {"BlankProductWriteRefused", {}, 0x4A10, kBlank, {}, 5, kStalled, 0,
     on4A10({"write 37F8 5C1D", "write 37F0 failed"})},
    {"FlashReadRefused", {}, 0x4A10, erased(0x00E08820, 0xFFFF), flash(kSignatureA), 6, kStalled, 0,
     on4A10({"read 37F2 2", "read 37FA 2", "read 0C00 16 failed"})},
    {"CopyWordWriteRefused", {}, 0x4A10, erased(0x00E08820, 0x4B02), {}, 6, kStalled, 0,
     on4A10({"read 37F2 2", "write 37F0 4B01", "write 37F2 failed"})},
};

class IdentityCheckTable : public IdentityCheck, public testing::WithParamInterface<IdentityCase> {};

}  // namespace

TEST_P(IdentityCheckTable, ReturnsTheIdentityAndMakesExactlyTheseRequests)
{
    const IdentityCase& c = GetParam();
    if (c.registry) c.registry(sim::kernel::registry());
    Outcome outcome = run(c.loaderProductId, c.identity, c.at0C00, c.stalledRequest);

    EXPECT_EQ(outcome.status, c.status);
    EXPECT_EQ(outcome.requests, c.requests);
    if (c.status >= 0) {
        EXPECT_EQ(outcome.vendorId, 0x5C1D);
        EXPECT_EQ(outcome.productId, c.productId);
        EXPECT_EQ(outcome.serialNumber, c.identity.serialNumber);
    }
}

INSTANTIATE_TEST_SUITE_P(Identity, IdentityCheckTable, testing::ValuesIn(kCases),
                         [](const auto& info) { return std::string(info.param.name); });

// A negative status brought in: no request, no registry read. A positive one
// is kept, and a blank block is repaired with the registry's product as with
// a status of 0: never written with the erased product word, after which it
// would no longer be blank and could not be repaired again.
TEST_F(IdentityCheck, StatusOnEntry)
{
    for (const sim::IdentityValues& identity : {kBlank, erased(0x00E08820, 0x4B02)}) {
        Outcome outcome = run(0x4A10, identity, {}, 0, -7);
        EXPECT_EQ(outcome.status, -7);
        EXPECT_EQ(outcome.requests, std::vector<std::string>{});
    }
    EXPECT_EQ(sim::kernel::registry().calls().size(), 0u);

    for (uint16_t loaderProductId : {0x4A10, 0x4A20}) {
        SCOPED_TRACE(loaderProductId);
        Outcome outcome = run(loaderProductId, kBlank, {}, 0, 3);
        EXPECT_EQ(outcome.status, 3);
        EXPECT_EQ(outcome.vendorId, 0x5C1D);
        EXPECT_EQ(outcome.productId, 0x4B0C);
        EXPECT_EQ(outcome.requests, loaderProductId == 0x4A10 ? blankRepaired("4B0C")
                                                              : on4A20({"write 7DF8 5C1D", "write 7DF0 4B0C"}));
    }

    uint16_t productId = 0xFFFF;
    tStatus status = 3;
    readRegistryProductId(productId, status);
    EXPECT_EQ(status, 3);
    EXPECT_EQ(productId, 0x4B0C);
}
