// morvanek-usb against emulated loader-mode devices behind umockdev: the same
// module, the same devices as the lab, a real libusb in between.
#include <signal.h>

#include <gtest/gtest.h>

#include <chrono>
#include <fstream>
#include <thread>

#include "usbWorld.h"

namespace usb_testing {
namespace {

using testing_support::makeImage;

constexpr uint32_t kSerialNumber = 0x00012345;

struct LoaderVariant {
    const char* name;
    uint16_t loaderProductId;
    uint16_t productId;
    size_t imageSize;
};

class FullUpdate : public UsbWorld, public ::testing::WithParamInterface<LoaderVariant> {};

TEST_P(FullUpdate, ProgramsTheDeviceAsTheLabDoesAndSeesItComeBackAsTheProduct)
{
    const LoaderVariant& variant = GetParam();
    writeDefaultImage(variant.productId, makeImage(variant.imageSize));
    sim::EmulatedDeviceOptions options = deviceWithIdentity(variant.loaderProductId, variant.productId, kSerialNumber);
    std::vector<sim::RequestRecord> expected = labTrace(options);
    auto device = plugIn(options, "00012345");

    UsbRun run = runUsb({"once"});

    ASSERT_EQ(run.exitCode, 0) << run.errors;
    EXPECT_EQ(traceDifference(expected, device->trace), "");
    EXPECT_TRUE(device->completionMarkerInPlace());
    char product[16];
    std::snprintf(product, sizeof product, "5C1D:%04X", variant.productId);
    char loader[16];
    std::snprintf(loader, sizeof loader, "5C1D:%04X", variant.loaderProductId);
    EXPECT_EQ(bus->history(), (std::vector<std::string>{std::string("add 1-1 ") + loader, "remove 1-1",
                                                        std::string("add 1-1 ") + product}));
    // The product's arrival reaches the module too, which leaves it alone.
    EXPECT_EQ(run.outcomeOf("1-1"), "updated,ignored");
    ASSERT_EQ(run.eventsOf("left").size(), 1u);
    EXPECT_EQ(run.eventsOf("left")[0]["text"], "left the bus to restart");
    EXPECT_EQ(run.eventsOf("arrived").back()["text"], "back after its restart");
    EXPECT_EQ(run.eventsOf("log").size(), 0u);
    EXPECT_EQ(run.eventsOf("summary").at(0)["leftovers"].size(), 0u);
}

INSTANTIATE_TEST_SUITE_P(BothLoaders, FullUpdate,
                         ::testing::Values(LoaderVariant{"loader4A10LargestImage", 0x4A10, 0x4B01, 0x3400},
                                           LoaderVariant{"loader4A20", 0x4A20, 0x4B02, 3000}),
                         [](const auto& info) { return std::string(info.param.name); });

struct FaultCase {
    const char* name;
    sim::DeviceFaults faults;
    std::vector<std::string> history;
    const char* statusInLog;
};

sim::DeviceFaults stallAt(uint64_t request)
{
    sim::DeviceFaults faults;
    faults.stallRequests = {request};
    return faults;
}

sim::DeviceFaults unplugAt(uint64_t request)
{
    sim::DeviceFaults faults;
    faults.unplugAtRequest = request;
    return faults;
}

class FaultWhileProgramming : public UsbWorld, public ::testing::WithParamInterface<FaultCase> {};

TEST_P(FaultWhileProgramming, LeavesTheDeviceInLoaderModeAndNothingBehind)
{
    const FaultCase& fault = GetParam();
    writeDefaultImage(0x4B01, makeImage(0x3400));
    sim::EmulatedDeviceOptions options = deviceWithIdentity(0x4A10, 0x4B01, kSerialNumber);
    options.faults = fault.faults;
    std::vector<sim::RequestRecord> expected = labTrace(options);
    auto device = plugIn(options);

    UsbRun run = runUsb({"once"});

    EXPECT_EQ(run.exitCode, 1) << run.errors;
    EXPECT_EQ(traceDifference(expected, device->trace), "");
    EXPECT_FALSE(device->completionMarkerInPlace());
    EXPECT_EQ(run.outcomeOf("1-1"), "failed");
    ASSERT_EQ(run.eventsOf("log").size(), 1u);
    EXPECT_EQ(run.eventsOf("log")[0]["location"], "source\\DeviceTable:451 - ");
    EXPECT_NE(run.eventsOf("log")[0]["message"].get<std::string>().find(fault.statusInLog), std::string::npos);
    EXPECT_EQ(run.eventsOf("log")[0]["device"]["busPath"], "1-1");
    EXPECT_TRUE(bus->waitForHistory(fault.history.size(), 2000));
    EXPECT_EQ(bus->history(), fault.history);
    EXPECT_EQ(run.eventsOf("summary").at(0)["leftovers"].size(), 0u);
}

INSTANTIATE_TEST_SUITE_P(
    StallAndDisconnect, FaultWhileProgramming,
    ::testing::Values(FaultCase{"stall", stallAt(60), {"add 1-1 5C1D:4A10"}, "Status = -53001"},
                      FaultCase{"disconnect", unplugAt(60), {"add 1-1 5C1D:4A10", "remove 1-1"}, "Status = -53002"}),
    [](const auto& info) { return std::string(info.param.name); });

// For people: one line per event on standard error, naming the device, and
// the loader's event-log lines with their location.
TEST_F(UsbWorld, TellsPeopleWhatHappenedOnStandardError)
{
    writeDefaultImage(0x4B01, makeImage(1000));
    sim::EmulatedDeviceOptions options = deviceWithIdentity(0x4A10, 0x4B01, kSerialNumber);
    options.faults = stallAt(10);
    plugIn(options, "00012345");

    UsbRun run = runUsb({"once"}, false);

    EXPECT_EQ(run.exitCode, 1);
    EXPECT_TRUE(run.events.empty());
    for (const char* line :
         {"morvanek-usb: 1-1 5C1D:4A10: present at start (serial 00012345)\n",
          "morvanek-usb: 1-1 5C1D:4A10: event log: morvanek source\\DeviceTable:451 - [morvaneLoader] The firmware "
          "update failed.  Leaving device 5C1D 4B01 00012345 in loader mode  Status = -53001\n",
          "morvanek-usb: 1-1 5C1D:4A10: update failed after 10 request(s); the device stays in loader mode; first "
          "failure: -53001 (the device refused a request)\n",
          "morvanek-usb: 0 device(s) updated, 1 failed; exit code 1\n"})
        EXPECT_NE(run.errors.find(line), std::string::npos) << line << "\nin:\n" << run.errors;
}

TEST_F(UsbWorld, UpdatesSeveralDevicesAtOnce)
{
    const uint16_t products[] = {0x4B01, 0x4B02, 0x4B03};
    const uint16_t loaders[] = {0x4A10, 0x4A20, 0x4A10};
    std::vector<std::vector<sim::RequestRecord>> expected;
    std::vector<std::shared_ptr<sim::PhysicalDevice>> devices;
    for (int i = 0; i < 3; ++i) {
        writeDefaultImage(products[i], makeImage(2000, static_cast<uint8_t>(i + 1)));
        sim::EmulatedDeviceOptions options = deviceWithIdentity(loaders[i], products[i], kSerialNumber + i);
        expected.push_back(labTrace(options));
        devices.push_back(plugIn(options));
    }

    UsbRun run = runUsb({"once"});

    ASSERT_EQ(run.exitCode, 0) << run.errors;
    for (int i = 0; i < 3; ++i) {
        SCOPED_TRACE("device " + std::to_string(i + 1));
        EXPECT_EQ(traceDifference(expected[i], devices[i]->trace), "");
        EXPECT_EQ(run.outcomeOf("1-" + std::to_string(i + 1)), "updated,ignored");
    }
}

// Flash programming only clears bits: a marker written over image bytes that
// are not FF FF does not take, and the device restarts into its loader again.
TEST_F(UsbWorld, ReportsADeviceThatComesBackInLoaderMode)
{
    std::vector<uint8_t> image = makeImage(1000);
    image[6] = 0x12;
    writeDefaultImage(0x4B01, image);
    auto device = plugIn(deviceWithIdentity(0x4A10, 0x4B01, kSerialNumber));

    UsbRun run = runUsb({"once"});

    EXPECT_EQ(run.exitCode, 1) << run.errors;
    EXPECT_EQ(run.outcomeOf("1-1"), "updated");
    EXPECT_EQ(bus->history(), (std::vector<std::string>{"add 1-1 5C1D:4A10", "remove 1-1", "add 1-1 5C1D:4A10"}));
    ASSERT_EQ(run.eventsOf("skipped").size(), 1u);
    EXPECT_EQ(run.eventsOf("skipped")[0]["text"], "came back in loader mode; not updated again in once mode");
    EXPECT_EQ(run.eventsOf("summary").at(0)["backInLoaderMode"], 1);
}

// Readers share the image file, so two devices of one product arriving
// together are both programmed from it.
TEST_F(UsbWorld, UpdatesTwoDevicesOfOneProductAtOnce)
{
    bus.reset();
    bus = std::make_unique<usbtestbed::EmulatedBus>(1.0);  // long enough updates to overlap for sure
    writeDefaultImage(0x4B01, makeImage(3000));
    sim::EmulatedDeviceOptions first = deviceWithIdentity(0x4A10, 0x4B01, kSerialNumber);
    sim::EmulatedDeviceOptions second = deviceWithIdentity(0x4A10, 0x4B01, kSerialNumber + 1);
    first.timing = second.timing = sim::TimingModel::fullSpeed();
    std::vector<sim::RequestRecord> expected = labTrace(first);
    auto one = plugIn(first);
    auto other = plugIn(second);

    UsbRun run = runUsb({"once"});

    ASSERT_EQ(run.exitCode, 0) << run.errors;
    EXPECT_EQ(traceDifference(expected, one->trace), "");
    EXPECT_TRUE(one->completionMarkerInPlace());
    EXPECT_TRUE(other->completionMarkerInPlace());
    EXPECT_EQ(run.eventsOf("log").size(), 0u);
}

// The module cannot see how many bytes an IN data stage brought: the host
// fails a short one rather than leave stale bytes in the buffer.
TEST_F(UsbWorld, FailsAReadThatEndsEarly)
{
    writeDefaultImage(0x4B01, makeImage(1000));
    sim::EmulatedDeviceOptions options = deviceWithIdentity(0x4A10, 0x4B01, kSerialNumber);
    options.faults.shortReads = {{5, 10}};  // the second read-back of the first block
    auto device = plugIn(options);

    UsbRun run = runUsb({"once"});

    EXPECT_EQ(run.exitCode, 1) << run.errors;
    EXPECT_EQ(run.outcomeOf("1-1"), "failed");
    EXPECT_EQ(run.eventsOf("update").at(0)["firstFailure"], -53005);
    EXPECT_FALSE(device->completionMarkerInPlace());
}

// In watch mode such a device is updated again after each comeback, but not
// forever: the third comeback in a row is left alone.
TEST_F(UsbWorld, WatchStopsUpdatingADeviceThatKeepsComingBackInLoaderMode)
{
    std::vector<uint8_t> image = makeImage(1000);
    image[6] = 0x12;
    writeDefaultImage(0x4B01, image);
    auto device = plugIn(deviceWithIdentity(0x4A10, 0x4B01, kSerialNumber));
    auto program = startUsb({"watch"});
    bool thirdComebackLeftAlone = program->waitForOutput("\"event\":\"skipped\"", 20000);

    UsbRun run = finishUsb(*program, SIGTERM);

    EXPECT_TRUE(thirdComebackLeftAlone);
    EXPECT_EQ(bus->history().size(), 7u);  // the add, then three removals and comebacks
    EXPECT_EQ(run.exitCode, 0) << run.errors;
    EXPECT_EQ(run.outcomeOf("1-1"), "updated,updated,updated");
    ASSERT_EQ(run.eventsOf("skipped").size(), 1u);
    EXPECT_NE(run.eventsOf("skipped")[0]["text"].get<std::string>().find("not updated again"), std::string::npos);
}

struct SelectionCase {
    const char* name;
    std::vector<std::string> arguments;
    const char* chosen;  // bus path of the one device updated
};

class Selection : public UsbWorld, public ::testing::WithParamInterface<SelectionCase> {};

TEST_P(Selection, UpdatesOnlyTheDeviceChosen)
{
    writeDefaultImage(0x4B01, makeImage(1000));
    writeDefaultImage(0x4B02, makeImage(1000));
    auto first = plugIn(deviceWithIdentity(0x4A10, 0x4B01, 0xA1), "A1");
    auto second = plugIn(deviceWithIdentity(0x4A10, 0x4B02, 0xB2), "B2");

    std::vector<std::string> arguments = {"once"};
    arguments.insert(arguments.end(), GetParam().arguments.begin(), GetParam().arguments.end());
    UsbRun run = runUsb(arguments);

    ASSERT_EQ(run.exitCode, 0) << run.errors;
    bool firstChosen = std::string(GetParam().chosen) == "1-1";
    EXPECT_EQ(first->completionMarkerInPlace(), firstChosen);
    EXPECT_EQ(second->completionMarkerInPlace(), !firstChosen);
    EXPECT_TRUE((firstChosen ? second : first)->trace.empty());
    EXPECT_EQ(run.outcomeOf(firstChosen ? "1-2" : "1-1"), "");
}

INSTANTIATE_TEST_SUITE_P(BySerialOrBusPath, Selection,
                         ::testing::Values(SelectionCase{"serial", {"--serial", "B2"}, "1-2"},
                                           SelectionCase{"busPath", {"--device", "1-1"}, "1-1"}),
                         [](const auto& info) { return std::string(info.param.name); });

TEST_F(UsbWorld, WatchUpdatesADeviceThatArrivesAndStopsOnSigterm)
{
    writeDefaultImage(0x4B01, makeImage(1500));
    auto program = startUsb({"watch"});
    bool listening = program->waitForOutput("watching for loader-mode devices", 20000);
    auto device = plugIn(deviceWithIdentity(0x4A10, 0x4B01, kSerialNumber));
    bool cameBack = program->waitForOutput("\"outcome\":\"ignored\"", 20000);  // the product, back

    UsbRun run = finishUsb(*program, SIGTERM);

    EXPECT_TRUE(listening);
    EXPECT_TRUE(cameBack);
    EXPECT_EQ(run.exitCode, 0) << run.errors;
    EXPECT_TRUE(device->completionMarkerInPlace());
    EXPECT_EQ(run.outcomeOf("1-1"), "updated,ignored");
    EXPECT_EQ(run.eventsOf("summary").at(0)["leftovers"].size(), 0u);
}

struct StopCase {
    const char* name;
    int signals;
    int exitCode;
    const char* outcome;
    bool updated;
};

class StopWhileUpdating : public UsbWorld, public ::testing::WithParamInterface<StopCase> {};

// One SIGINT lets the running update finish; a second abandons it, and the
// device stays in loader mode.
TEST_P(StopWhileUpdating, FinishesOrAbandonsTheRunningUpdate)
{
    // The timing model in real time: the update takes about a second. One bed
    // at a time: umockdev points the process at the newest.
    bus.reset();
    bus = std::make_unique<usbtestbed::EmulatedBus>(1.0);
    writeDefaultImage(0x4B01, makeImage(0x3400));
    sim::EmulatedDeviceOptions options = deviceWithIdentity(0x4A10, 0x4B01, kSerialNumber);
    options.timing = sim::TimingModel::fullSpeed();
    auto device = plugIn(options);
    auto program = startUsb({"once"});
    ASSERT_TRUE(program->waitForOutput("present at start", 20000));
    std::this_thread::sleep_for(std::chrono::milliseconds(200));  // into the update
    for (int i = 1; i < GetParam().signals; ++i) {
        program->signal(SIGINT);
        std::this_thread::sleep_for(std::chrono::milliseconds(50));
    }

    UsbRun run = finishUsb(*program, SIGINT);

    EXPECT_EQ(run.exitCode, GetParam().exitCode) << run.errors;
    EXPECT_EQ(run.outcomeOf("1-1").substr(0, std::string(GetParam().outcome).size()), GetParam().outcome);
    EXPECT_EQ(device->completionMarkerInPlace(), GetParam().updated);
    EXPECT_EQ(run.eventsOf("summary").at(0)["leftovers"].size(), 0u);
}

INSTANTIATE_TEST_SUITE_P(Signals, StopWhileUpdating,
                         ::testing::Values(StopCase{"oneSignalFinishes", 1, 0, "updated", true},
                                           StopCase{"secondSignalAbandons", 2, 1, "abandoned", false}),
                         [](const auto& info) { return std::string(info.param.name); });

TEST_F(UsbWorld, ReportsThatNoDeviceIsThere)
{
    UsbRun run = runUsb({"once"});
    EXPECT_EQ(run.exitCode, 4) << run.errors;
}

struct InvalidCase {
    const char* name;
    std::vector<std::string> arguments;
    const char* message;
};

class InvalidSetting : public UsbWorld, public ::testing::WithParamInterface<InvalidCase> {};

TEST_P(InvalidSetting, IsRefusedBeforeAnythingRuns)
{
    std::ofstream(outputFolder + "/bad.reg")
        << "Windows Registry Editor Version 5.00\n\n[HKEY_LOCAL_MACHINE\\X]\n\"a\"=zz\n";
    std::vector<std::string> arguments = {"once"};
    for (std::string argument : GetParam().arguments) {
        if (argument == "BAD_REG") argument = outputFolder + "/bad.reg";
        arguments.push_back(argument);
    }
    UsbRun run = runUsb(arguments);
    EXPECT_EQ(run.exitCode, 2);
    EXPECT_NE(run.errors.find(GetParam().message), std::string::npos) << run.errors;
}

INSTANTIATE_TEST_SUITE_P(
    CommandLineAndFiles, InvalidSetting,
    ::testing::Values(InvalidCase{"malformedRegFile", {"--registry", "BAD_REG"}, "bad.reg:4"},
                      InvalidCase{"missingDriveFolder", {"--drive", "D=/nonexistent/folder"}, "is not a folder"},
                      InvalidCase{"busPathNotAPath", {"--device", "usb1"}, "is not a bus path"}),
    [](const auto& info) { return std::string(info.param.name); });

}  // namespace
}  // namespace usb_testing
