#include "usbWorld.h"

#include <umockdev.h>

#include <fstream>
#include <sstream>

#include "regfile/registryText.h"

namespace usb_testing {

namespace {
// Before any test makes a bed: see runUnderUmockdev.
const bool gUnderUmockdev = (usbtestbed::runUnderUmockdev(), true);
}  // namespace

std::vector<nlohmann::json> UsbRun::eventsOf(const std::string& kind) const
{
    std::vector<nlohmann::json> result;
    for (const auto& event : events) {
        if (event.value("event", "") == kind) result.push_back(event);
    }
    return result;
}

std::string UsbRun::outcomeOf(const std::string& busPath) const
{
    std::string outcome;
    for (const auto& event : eventsOf("update")) {
        if (event["device"]["busPath"] == busPath)
            outcome += (outcome.empty() ? "" : ",") + event["outcome"].get<std::string>();
    }
    return outcome;
}

void UsbWorld::SetUp()
{
    LoaderWorld::SetUp();
    bus = std::make_unique<usbtestbed::EmulatedBus>();
    if (!umockdev_in_mock_environment())
        GTEST_SKIP() << "umockdev's preload is not active here, so no bus can be emulated";
    outputFolder = (driveC.parent_path() / (driveC.filename().string() + "-usb")).string();
    std::filesystem::create_directories(outputFolder);
}

void UsbWorld::TearDown()
{
    bus.reset();
    std::error_code ignored;
    std::filesystem::remove_all(outputFolder, ignored);
    LoaderWorld::TearDown();
}

std::shared_ptr<sim::PhysicalDevice> UsbWorld::plugIn(const sim::EmulatedDeviceOptions& options,
                                                      const std::string& serial)
{
    auto device = sim::makeEmulatedDevice(options);
    bus->plugIn(device, serial);
    return device;
}

std::unique_ptr<usbtestbed::ProgramRun> UsbWorld::startUsb(const std::vector<std::string>& arguments, bool json)
{
    std::string registryFile = outputFolder + "/machine.reg";
    std::ofstream(registryFile) << sim::regfile::exportRegistryText(sim::kernel::registry());
    std::vector<std::string> command = {MORVANEK_USB_EXECUTABLE};
    command.insert(command.end(), arguments.begin(), arguments.end());
    for (const std::string& extra :
         {std::string("--no-progress"), "--registry=" + registryFile, "--drive=C=" + driveC.string()})
        command.push_back(extra);
    if (json) command.push_back("--json");
    return std::make_unique<usbtestbed::ProgramRun>(command, bus->folder(), outputFolder);
}

UsbRun UsbWorld::finishUsb(usbtestbed::ProgramRun& program, int signal)
{
    usbtestbed::ProgramOutput output = program.finish(signal);
    UsbRun run;
    run.exitCode = output.exitCode;
    run.errors = output.errors;
    std::istringstream lines(output.out);
    for (std::string line; std::getline(lines, line);) {
        if (!line.empty()) run.events.push_back(nlohmann::json::parse(line, nullptr, false));
    }
    return run;
}

UsbRun UsbWorld::runUsb(const std::vector<std::string>& arguments, bool json)
{
    return finishUsb(*startUsb(arguments, json), 0);
}

std::vector<sim::RequestRecord> UsbWorld::labTrace(const sim::EmulatedDeviceOptions& options)
{
    auto device = sim::makeEmulatedDevice(options);
    device->plugIn(tree());
    EXPECT_GE(startModule(), 0);
    EXPECT_EQ(callSsMain(1), 0);
    module->dllUnload();
    return device->trace;
}

std::string traceDifference(const std::vector<sim::RequestRecord>& expected,
                            const std::vector<sim::RequestRecord>& seen)
{
    for (size_t i = 0; i < std::max(expected.size(), seen.size()); ++i) {
        if (i >= expected.size()) return "an extra request: " + sim::describeRequest(seen[i]);
        if (i >= seen.size()) return "missing request: " + sim::describeRequest(expected[i]);
        const sim::RequestRecord& a = expected[i];
        const sim::RequestRecord& b = seen[i];
        bool same = a.bmRequestType == b.bmRequestType && a.bRequest == b.bRequest && a.wValue == b.wValue &&
                    a.wIndex == b.wIndex && a.length == b.length && a.outcome == b.outcome && a.data == b.data;
        if (!same) return "expected " + sim::describeRequest(a) + ", saw " + sim::describeRequest(b);
    }
    return "";
}

}  // namespace usb_testing
