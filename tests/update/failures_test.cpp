// Updates that fail, end to end through the device table: every way an update
// can end early, with the requests the device saw up to there, the messages
// logged (and only those), the device left in loader mode, and the image file
// and the control stream released (the fixture finds anything left open).
#include "UpdateWorld.h"

#include "sim/kernel/fileStatus.h"

namespace update_tests {
namespace {

using testing_support::kSystemVersionKey;
using testing_support::makeImage;
namespace fileStatus = sim::kernel::fileStatus;

struct FailureCase {
    const char* name;
    std::function<void(sim::EmulatedDeviceOptions&)> device;
    std::function<void(const std::filesystem::path& image)> world;
    std::vector<std::string> requests;
    std::vector<LogLine> log;
    uint16_t loaderProductId = 0x4A10;
    uint32_t imageSize = 1000;
    bool descriptorFails = false;
    bool streamOpened = true;
    bool imageLookedUp = true;
};

void PrintTo(const FailureCase& c, std::ostream* out)
{
    *out << c.name;
}

class Failures : public UpdateWorld, public ::testing::WithParamInterface<std::tuple<FailureCase, Arrival>> {};

TEST_P(Failures, LeaveTheDeviceInLoaderModeAndReportOnlyTheirOwnMessages)
{
    const auto& [c, arrival] = GetParam();
    std::filesystem::path image = writeDefaultImage(kProductId, makeImage(c.imageSize));
    sim::EmulatedDeviceOptions options = deviceWithIdentity(c.loaderProductId, kProductId);
    if (c.device) c.device(options);
    auto hardware = sim::makeEmulatedDevice(options);
    const uint16_t identityPage = c.loaderProductId == 0x4A10 ? 0x3600 : 0x7C00;
    const std::vector<uint8_t> identityBefore = hardware->readMemory(identityPage, 512);
    if (c.world) c.world(image);

    sim::LoaderModeDevice& loader =
        run(hardware, arrival, [&](sim::LoaderModeDevice& device) { device.failDescriptor = c.descriptorFails; });

    EXPECT_EQ(requestLines(*hardware), c.requests);
    EXPECT_EQ(logLines(), c.log);
    EXPECT_EQ(loader.openStreamCalls, c.streamOpened ? 1 : 0);
    EXPECT_EQ(dynamic_cast<sim::ProductDevice*>(hardware->current()), nullptr) << "the device left loader mode";
    EXPECT_EQ(hardware->readMemory(identityPage, 512), identityBefore);
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

std::function<void(sim::EmulatedDeviceOptions&)> stallRequest(uint64_t number)
{
    return [number](sim::EmulatedDeviceOptions& options) { options.faults.stallRequests.insert(number); };
}

std::function<void(sim::EmulatedDeviceOptions&)> stallKind(sim::RequestKind kind)
{
    return [kind](sim::EmulatedDeviceOptions& options) { options.faults.stallKinds.insert(kind); };
}

std::function<void(sim::EmulatedDeviceOptions&)> corruptRead(uint16_t address)
{
    return [address](sim::EmulatedDeviceOptions& options) {
        sim::ReadCorruption corruption;
        corruption.address = address;
        corruption.xorMask = 0x10;
        options.faults.readCorruptions.push_back(corruption);
    };
}

std::function<void(const std::filesystem::path&)> failImageRead(unsigned number)
{
    // Read 1 is the header's; the blocks follow from read 2.
    return [number](const std::filesystem::path&) {
        sim::kernel::files().failReadNumber(number, fileStatus::deviceDataError);
    };
}

FailureCase withLoader(FailureCase c, uint16_t loaderProductId, uint32_t imageSize)
{
    c.loaderProductId = loaderProductId;
    c.imageSize = imageSize;
    return c;
}

FailureCase withImageSize(FailureCase c, uint32_t imageSize)
{
    c.imageSize = imageSize;
    return c;
}

const FailureCase kFailureCases[] = {
    [] {
        FailureCase c{"DescriptorNotRead", {}, {}, {}, {}};
        c.descriptorFails = true;
        c.streamOpened = false;
        c.imageLookedUp = false;
        return c;
    }(),
    [] {
        FailureCase c{"StreamNotOpened", [](auto& o) { o.faults.refuseOpenStream = true; }, {}, {}, {}};
        c.imageLookedUp = false;
        return c;
    }(),
    [] {
        FailureCase c{"BufferNotObtained", [](auto& o) { o.faults.refuseAllocateBuffer = true; }, {}, {}, {}};
        c.imageLookedUp = false;
        return c;
    }(),
    [] {
        FailureCase c{"ForeignIdentity", [](auto& o) { o.identity->vendorId = 0x1234; }, {}, kIdentity, {}};
        c.imageLookedUp = false;
        return c;
    }(),
    {"NoSystemRootKey", {},
     [](const auto&) { sim::kernel::registry().deleteKey("\\Registry\\Machine\\Software\\Microsoft\\Windows NT"); },
     kIdentity, {pathNotFound(-100000)}},
    {"NoSystemRootValue", {},
     [](const auto&) { sim::kernel::registry().deleteValue(kSystemVersionKey, "SystemRoot"); }, kIdentity,
     {pathNotFound(-50150)}},
    {"ImageMissing", {}, [](const auto& image) { std::filesystem::remove(image); }, kIdentity, {}},
    {"ImageHeldOpenElsewhere", {}, [](const auto& image) { sim::kernel::files().holdOpenElsewhere(image); },
     kIdentity, {}},
    withImageSize({"EmptyImage", {}, {}, kIdentity, {updateFailed(-50150)}}, 0),
    withLoader({"OneByteTooLongForTheSmallLoader", {}, {}, kIdentity, {updateFailed(-50150)}}, 0x4A10, 0x3401),
    withLoader({"OneByteTooLongForTheLargeLoader", {}, {}, identityReads(0x4A20), {updateFailed(-50150)}}, 0x4A20,
               0x7601),
    {"SizeQueryFails", {},
     [](const auto&) { sim::kernel::files().failSizeQuery(fileStatus::deviceDataError); }, kIdentity,
     {updateFailed(-50207)}},
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
    {"BlockImageReadFails", {}, failImageRead(2), joined({kIdentity, kErase}), {updateFailed(-50207)}},
    {"PartialBlockImageReadFails", {}, failImageRead(3), joined({kIdentity, kErase, kBlock0}),
     {updateFailed(-50207)}},
    withImageSize({"ThirdBlockDiffers", corruptRead(0x0200 + 2 * 512 + 17), {},
                   joined({kIdentity, {"erase 1", "erase 2", "erase 3", "erase 4"}, kBlock0,
                           blockRequests(0x0400, 512), blockRequests(0x0600, 512)}),
                   {blockDiffers(2), updateFailed(-50152)}},
                  2048),
    {"PartialBlockDiffers", corruptRead(0x0400 + 487), {}, joined({kIdentity, kErase, kBlock0, kPartial}),
     {partialBlockDiffers(1), updateFailed(-50152)}},
    {"MarkerWriteRefused", stallRequest(24), {},
     joined({kIdentity, kErase, kBlock0, kPartial, {"write 0x0206 2 failed"}}),
     {updateFailed(sim::kHostTransferStalled)}},
    {"RestartRefused", stallKind(sim::RequestKind::Restart), {},
     joined({kIdentity, kErase, kBlock0, kPartial, {"write 0x0206 2", "restart failed"}}),
     {updateFailed(sim::kHostTransferStalled)}},
    {"UnpluggedWhileReadingBack", [](auto& o) { o.faults.unplugAtRequest = 10; }, {},
     joined({kIdentity, kErase, {"write 0x0200 512", "read 0x0200 64", "read 0x0240 64", "read 0x0280 64",
                                 "read 0x02C0 64 failed"}}),
     {updateFailed(sim::kHostDeviceGone)}},
};

INSTANTIATE_TEST_SUITE_P(Rows, Failures,
                         ::testing::Combine(::testing::ValuesIn(kFailureCases),
                                            ::testing::Values(Arrival::PresentAtStart, Arrival::PluggedInLater)),
                         [](const auto& info) {
                             return std::string(std::get<0>(info.param).name) + "_" +
                                    arrivalName(std::get<1>(info.param));
                         });

}  // namespace
}  // namespace update_tests
