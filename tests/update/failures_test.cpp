// Updates that fail, end to end through the device table: every way an update
// can end early, with the requests the device saw up to there, the messages
// logged (and only those), the device left in loader mode, and the image file
// and the control stream released (the fixture finds anything left open).
#include "updateWorld.h"

#include "sim/kernel/fileStatus.h"

namespace update_tests {
namespace {

using testing_support::kSystemVersionKey;
namespace fileStatus = sim::kernel::fileStatus;
using DeviceFault = std::function<void(sim::EmulatedDeviceOptions&)>;
using WorldFault = std::function<void(const std::filesystem::path& image)>;

struct FailureCase {
    const char* name;
    DeviceFault device;
    WorldFault world;
    std::vector<std::string> requests;
    std::vector<std::string> log;
    uint32_t imageSize = 1000;
    uint16_t loaderProductId = 0x4A10;
    bool imageLookedUp = true;
    bool descriptorFails = false;  // then no stream is opened either
};

class Failures : public WithArrival<FailureCase> {};

TEST_P(Failures, LeaveTheDeviceInLoaderModeAndReportOnlyTheirOwnMessages)
{
    const auto& [c, arrival] = GetParam();
    std::filesystem::path image = writeDefaultImage(kProductId, testing_support::makeImage(c.imageSize));
    sim::EmulatedDeviceOptions options = deviceWithIdentity(c.loaderProductId, kProductId);
    if (c.device) c.device(options);
    auto hardware = sim::makeEmulatedDevice(options);
    const std::vector<uint8_t> identityBefore = hardware->readMemory(identityPage(c.loaderProductId), 512);
    if (c.world) c.world(image);

    sim::LoaderModeDevice& loader =
        run(hardware, arrival, [fails = c.descriptorFails](sim::LoaderModeDevice& device) {
            device.failDescriptor = fails;
        });

    EXPECT_EQ(requestLines(*hardware), c.requests);
    EXPECT_EQ(logLines(), c.log);
    EXPECT_EQ(loader.openStreamCalls, c.descriptorFails ? 0 : 1);
    EXPECT_EQ(dynamic_cast<sim::ProductDevice*>(hardware->current()), nullptr) << "the device left loader mode";
    EXPECT_EQ(hardware->readMemory(identityPage(c.loaderProductId), 512), identityBefore);
    if (!c.imageLookedUp) {
        EXPECT_TRUE(sim::kernel::files().opens().empty());
        for (const auto& call : sim::kernel::registry().calls()) EXPECT_NE(call.valueName, "Driver");
    }
    EXPECT_EQ(host().allocator.liveBlocks(), 4u) << "only the stop node, the table and its two records";
}

// Request numbers: 1 to 3 read the identity, 4 and 5 erase, 6 writes block 0
// and 7 to 14 read it back, 15 writes the partial block and 16 to 23 read it
// back, 24 writes the marker, 25 restarts.
const std::vector<std::string> kIdentity = identityReads(0x4A10);
const std::vector<std::string> kErase = {"erase 1", "erase 2"};
const std::vector<std::string> kBlock0 = blockRequests(0x0200, 512);
const std::vector<std::string> kPartial = blockRequests(0x0400, 488);
const std::vector<std::string> kProgrammed = joined({kIdentity, kErase, kBlock0, kPartial});

DeviceFault stallRequest(uint64_t number)
{
    return [number](sim::EmulatedDeviceOptions& options) { options.faults.stallRequests.insert(number); };
}

DeviceFault stallKind(sim::RequestKind kind)
{
    return [kind](sim::EmulatedDeviceOptions& options) { options.faults.stallKinds.insert(kind); };
}

DeviceFault corruptRead(uint16_t address)
{
    return [address](sim::EmulatedDeviceOptions& options) {
        options.faults.readCorruptions.push_back(sim::ReadCorruption{});
        options.faults.readCorruptions.back().address = address;
        options.faults.readCorruptions.back().xorMask = 0x10;
    };
}

// The device's reads: 1 to 3 the identity, 4 to 11 block 0, 12 to 19 the
// partial block (the last one 40 bytes). A short read reports success.
DeviceFault shortRead(uint64_t read, uint32_t bytes)
{
    return [read, bytes](sim::EmulatedDeviceOptions& options) { options.faults.shortReads.push_back({read, bytes}); };
}

// Read 1 is the header's; the blocks follow from read 2.
WorldFault failImageRead(unsigned number, NTSTATUS status)
{
    return [number, status](const auto&) { sim::kernel::files().failReadNumber(number, status); };
}

const FailureCase kFailureCases[] = {
    {"DescriptorNotRead", {}, {}, {}, {}, 1000, 0x4A10, false, true},
    {"StreamNotOpened", [](auto& o) { o.faults.refuseOpenStream = true; }, {}, {}, {}, 1000, 0x4A10, false},
    {"BufferNotObtained", [](auto& o) { o.faults.refuseAllocateBuffer = true; }, {}, {}, {}, 1000, 0x4A10, false},
    {"ForeignIdentity", [](auto& o) { o.identity->vendorId = 0x1234; }, {}, kIdentity, {}, 1000, 0x4A10, false},
    {"NoSystemRootKey", {},
     [](const auto&) { sim::kernel::registry().deleteKey("\\Registry\\Machine\\Software\\Microsoft\\Windows NT"); },
     kIdentity, {pathNotFound(-100000)}},
    {"NoSystemRootValue", {},
     [](const auto&) { sim::kernel::registry().deleteValue(kSystemVersionKey, "SystemRoot"); }, kIdentity,
     {pathNotFound(-50150)}},
    {"ImageMissing", {}, [](const auto& image) { std::filesystem::remove(image); }, kIdentity, {}},
    {"ImageHeldOpenElsewhere", {}, [](const auto& image) { sim::kernel::files().holdOpenElsewhere(image); },
     kIdentity, {}},
    {"EmptyImage", {}, {}, kIdentity, {updateFailed(-50150)}, 0},
    {"OneByteTooLongForTheSmallLoader", {}, {}, kIdentity, {updateFailed(-50150)}, 0x3401},
    {"OneByteTooLongForTheLargeLoader", {}, {}, identityReads(0x4A20), {updateFailed(-50150)}, 0x7601, 0x4A20},
    {"SizeQueryFails", {}, [](const auto&) { sim::kernel::files().failSizeQuery(fileStatus::deviceDataError); },
     kIdentity, {updateFailed(-50207)}},
    {"FirstEraseRefused", stallKind(sim::RequestKind::Erase), {}, joined({kIdentity, {"erase 1 failed"}}),
     {updateFailed(sim::kHostTransferStalled)}},
    {"SecondEraseRefused", stallRequest(5), {}, joined({kIdentity, {"erase 1", "erase 2 failed"}}),
     {updateFailed(sim::kHostTransferStalled)}},
    {"BlockWriteRefused", stallKind(sim::RequestKind::Write), {},
     joined({kIdentity, kErase, {"write 0x0200 512 failed"}}), {updateFailed(sim::kHostTransferStalled)}},
    {"BlockReadBackRefused", stallRequest(7), {},
     joined({kIdentity, kErase, {"write 0x0200 512", "read 0x0200 64 failed"}}),
     {updateFailed(sim::kHostTransferStalled)}},
    {"PartialBlockWriteRefused", stallRequest(15), {},
     joined({kIdentity, kErase, kBlock0, {"write 0x0400 488 failed"}}), {updateFailed(sim::kHostTransferStalled)}},
    {"PartialBlockLastReadRefused", stallRequest(23), {},
     joined({kIdentity, kErase, kBlock0, std::vector<std::string>(kPartial.begin(), kPartial.end() - 1),
             {"read 0x05C0 40 failed"}}),
     {updateFailed(sim::kHostTransferStalled)}},
    {"BlockImageReadFails", {}, failImageRead(2, fileStatus::deviceDataError), joined({kIdentity, kErase}),
     {updateFailed(-50207)}},
    {"PartialBlockImageReadFails", {}, failImageRead(3, fileStatus::deviceDataError),
     joined({kIdentity, kErase, kBlock0}), {updateFailed(-50207)}},
    // The size was checked before the erase: a read that meets the end of the
    // file early must not program what the block buffer happened to hold.
    {"PartialBlockReadMeetsTheEndOfTheFile", {}, failImageRead(3, fileStatus::endOfFile),
     joined({kIdentity, kErase, kBlock0}), {updateFailed(-50207)}},
    {"ThirdBlockDiffers", corruptRead(0x0200 + 2 * 512 + 17), {},
     joined({kIdentity, {"erase 1", "erase 2", "erase 3", "erase 4"}, kBlock0, blockRequests(0x0400, 512),
             blockRequests(0x0600, 512)}),
     {verificationFailed(421, 2), updateFailed(-50152)}, 2048},
    {"PartialBlockDiffers", corruptRead(0x0400 + 487), {}, kProgrammed,
     {verificationFailed(436, 1), updateFailed(-50152)}},
    {"FirstByteOfABlockDiffers", corruptRead(0x0200), {}, joined({kIdentity, kErase, kBlock0}),
     {verificationFailed(421, 0), updateFailed(-50152)}},
    // A read-back that delivers less than asked never verifies, although the
    // block's own bytes were the last to pass through the transfer buffer.
    {"BlockFirstReadBackDeliversNothing", shortRead(4, 0), {}, joined({kIdentity, kErase, kBlock0}),
     {verificationFailed(421, 0), updateFailed(-50152)}},
    {"BlockMiddleReadBackEndsEarly", shortRead(8, 32), {}, joined({kIdentity, kErase, kBlock0}),
     {verificationFailed(421, 0), updateFailed(-50152)}},
    {"BlockLastReadBackLacksOneByte", shortRead(11, 63), {}, joined({kIdentity, kErase, kBlock0}),
     {verificationFailed(421, 0), updateFailed(-50152)}},
    {"PartialBlockFirstReadBackDeliversNothing", shortRead(12, 0), {}, kProgrammed,
     {verificationFailed(436, 1), updateFailed(-50152)}},
    {"PartialBlockMiddleReadBackEndsEarly", shortRead(15, 1), {}, kProgrammed,
     {verificationFailed(436, 1), updateFailed(-50152)}},
    {"PartialBlockLastReadBackLacksOneByte", shortRead(19, 39), {}, kProgrammed,
     {verificationFailed(436, 1), updateFailed(-50152)}},
    {"MarkerWriteRefused", stallRequest(24), {}, joined({kProgrammed, {"write 0x0206 2 failed"}}),
     {updateFailed(sim::kHostTransferStalled)}},
    {"RestartRefused", stallKind(sim::RequestKind::Restart), {},
     joined({kProgrammed, {"write 0x0206 2", "restart failed"}}), {updateFailed(sim::kHostTransferStalled)}},
    {"UnpluggedWhileReadingBack", [](auto& o) { o.faults.unplugAtRequest = 10; }, {},
     joined({kIdentity, kErase, {"write 0x0200 512", "read 0x0200 64", "read 0x0240 64", "read 0x0280 64",
                                 "read 0x02C0 64 failed"}}),
     {updateFailed(sim::kHostDeviceGone)}},
};

INSTANTIATE_TEST_SUITE_P(Rows, Failures, ::testing::Combine(::testing::ValuesIn(kFailureCases), kArrivals),
                         CaseAndArrival());

}  // namespace
}  // namespace update_tests
