// The update's exits before any flash is touched, called directly so that the
// status each leaves is seen, including the exits the device table cannot
// reach: a negative status on entry, a loader product ID without a flash map,
// and an image that opens for its header but not a second time to be
// programmed.
#include <functional>

#include "ImageWorld.h"
#include "sim/device/enumeratedDevice.h"
#include "sim/kernel/fileStatus.h"
#include "source/DeviceTable.h"

namespace {

struct ExitCase {
    const char* name;
    std::function<void(sim::EmulatedDeviceOptions&)> device;
    std::function<void()> world;
    tStatus expected;
    size_t requests;
    std::vector<std::string> log;  // location and message
    tStatus entry = 0;
    int streamOpens = 1;
};

void PrintTo(const ExitCase& c, std::ostream* out)
{
    *out << c.name;
}

class UpdateExits : public ImageWorld, public ::testing::WithParamInterface<ExitCase> {};

TEST_P(UpdateExits, EndWithTheirStatusBeforeAnyErase)
{
    const ExitCase& c = GetParam();
    writeDefaultImage(0x4B01, testing_support::makeImage(1000));
    sim::EmulatedDeviceOptions options = deviceWithIdentity(0x4A10, 0x4B01);
    options.attribute21 = 0xFFFFFFFF;  // the table's own walk leaves the device alone
    if (c.device) c.device(options);
    auto hardware = sim::makeEmulatedDevice(options);
    sim::LoaderModeDevice& loader = hardware->plugIn(tree());
    if (c.world) c.world();
    {
        tStatus tableStatus = 0;
        DeviceTable table(tableStatus);
        ASSERT_EQ(tableStatus, 0);
        tStatus status = c.entry;
        table.updateFirmware(&loader, options.loaderProductId, status);
        EXPECT_EQ(status, c.expected);
    }
    EXPECT_EQ(hardware->trace.size(), c.requests);
    EXPECT_EQ(loader.openStreamCalls, c.streamOpens);
    std::vector<std::string> log;
    for (const sim::LogEntry& entry : host().eventLog) log.push_back(entry.location + entry.message);
    EXPECT_EQ(log, c.log);
}

const ExitCase kExitCases[] = {
    [] {
        ExitCase c{"NegativeStatusOnEntry", {}, {}, -7, 0, {}};
        c.entry = -7;
        c.streamOpens = 0;
        return c;
    }(),
    [] {
        // Without a "Driver" value the image lookup falls back to the default path, with a fresh status.
        ExitCase c{"PositiveStatusOnEntryStillUpdates", {}, {}, 0, 3 + 2 + 9 + 9 + 2, {}};
        c.entry = 7;
        return c;
    }(),
    [] {
        ExitCase c{"NoFlashMap", [](auto& o) {
                            o.loaderProductId = 0x4A30;
                            o.identity.reset();
                        }, {}, -50150, 0, {}};
        c.streamOpens = 0;
        return c;
    }(),
    {"StreamNotOpened", [](auto& o) { o.faults.refuseOpenStream = true; }, {}, sim::kHostFailure, 0, {}},
    {"BufferNotObtained", [](auto& o) { o.faults.refuseAllocateBuffer = true; }, {}, sim::kHostAllocationFailed, 0,
     {}},
    {"ForeignIdentity", [](auto& o) { o.identity->vendorId = 0x1234; }, {}, -50152, 3, {}},
    {"HeaderNotRead", {}, [] { sim::kernel::files().reset(); }, -50150, 3, {}},
    {"ImageOpensOnlyForItsHeader", {},
     [] { create_file_spy::refuseOpen(2, sim::kernel::fileStatus::sharingViolation); }, -50150, 3,
     {"source\\DeviceTable:385 - Unable to open firmware image C:\\WINDOWS\\system32\\drivers\\QVUSB4B01.bin.  "
      "Leaving device 5C1D 4B01 0001E240 in loader mode."}},
};

INSTANTIATE_TEST_SUITE_P(Exits, UpdateExits, ::testing::ValuesIn(kExitCases),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace
