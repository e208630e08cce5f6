// morvanek-usb-gadget: puts one emulated device of a lab scenario behind a
// FunctionFS gadget, so that a USB host on the controller's other side (the
// kernel's dummy_hcd, or a real cable from a board with a device controller)
// meets it as hardware. Runs until SIGINT or SIGTERM, then takes the gadget
// down and writes what the device was asked.
#include <signal.h>
#include <sys/signalfd.h>
#include <unistd.h>

#include <cstdio>
#include <fstream>
#include <iostream>

#include <CLI/CLI.hpp>
#include <nlohmann/json.hpp>

#include "loaderGadget.h"
#include "morvanek-lab/lib/requestJson.h"
#include "morvanek-lab/lib/scenarioDevice.h"
#include "morvanek-lab/lib/scenarioError.h"
#include "morvanek-lab/lib/scenarioParser.h"
#include "sim/device/enumeratedDevice.h"

namespace {

constexpr int kServed = 0;
constexpr int kInvalid = 2;
constexpr int kFailed = 3;

const lab::DevicePlan* findPlan(const lab::Scenario& scenario, const std::string& name)
{
    for (const lab::DevicePlan& plan : scenario.devices) {
        if (name.empty() || plan.name == name) return &plan;
    }
    return nullptr;
}

std::string modeOf(const sim::PhysicalDevice& device)
{
    if (device.current() == nullptr) return "unplugged";
    return dynamic_cast<const sim::LoaderModeDevice*>(device.current()) != nullptr ? "loader" : "product";
}

nlohmann::json report(const std::string& name, const sim::PhysicalDevice& device, const usbgadget::LoaderGadget& gadget)
{
    nlohmann::json trace = nlohmann::json::array();
    for (const sim::RequestRecord& request : device.trace) trace.push_back(lab::requestRecordJson(request));
    nlohmann::json notes = device.notes;
    for (const std::string& note : gadget.notes()) notes.push_back(note);
    return {{"device", name},
            {"controller", gadget.controller()},
            {"mode", modeOf(device)},
            {"markerInPlace", device.completionMarkerInPlace()},
            {"bus", gadget.history()},
            {"notes", notes},
            {"trace", trace}};
}

// SIGINT and SIGTERM as a descriptor the serving loop can wait on.
int stopSignals()
{
    sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGINT);
    sigaddset(&signals, SIGTERM);
    sigprocmask(SIG_BLOCK, &signals, nullptr);
    return signalfd(-1, &signals, SFD_CLOEXEC);
}

}  // namespace

int main(int argc, char** argv)
{
    CLI::App app{"Puts an emulated loader-mode device of a lab scenario behind a FunctionFS USB gadget."};
    app.footer("Exit codes: 0 served until stopped, 2 the command line or the scenario is invalid, "
               "3 the gadget could not be made or served.");
    std::string scenarioFile;
    std::string deviceName;
    std::string reportFile;
    std::string readyFile;
    usbgadget::GadgetSettings settings;
    unsigned comebackMs = 100;
    app.add_option("scenario", scenarioFile, "the lab scenario that describes the device")->required();
    app.add_option("--device", deviceName, "the scenario's device to serve (default: its first)");
    app.add_option("--udc", settings.udc, "the device controller to bind to (default: the first in /sys/class/udc)");
    app.add_option("--serial", settings.serial, "the USB serial-number string (default: none)");
    app.add_option("--name", settings.name, "the gadget's name in configfs and FunctionFS (default: morvanek)")
        ->check([](const std::string& name) {
            return name.find_first_of("/. ") == std::string::npos && !name.empty() ? std::string()
                                                                                    : "a name without / . or spaces";
        });
    app.add_option("--mount-folder", settings.mountFolder, "where FunctionFS is mounted (default: /run/morvanek-gadget)");
    app.add_option("--comeback-ms", comebackMs, "how long a restarted device takes to come back (default: 100)")
        ->check(CLI::Range(0u, 60000u));
    app.add_option("--report", reportFile, "write the bus history and the device's requests here as JSON at the end");
    app.add_option("--ready", readyFile, "create this file once the gadget is on the bus");
    CLI11_PARSE(app, argc, argv);
    settings.comeback = std::chrono::milliseconds(comebackMs);

    lab::Scenario scenario;
    try {
        scenario = lab::loadScenarioFile(scenarioFile);
    } catch (const lab::ScenarioError& error) {
        std::cerr << "morvanek-usb-gadget: " << error.what() << "\n";
        return kInvalid;
    }
    const lab::DevicePlan* plan = findPlan(scenario, deviceName);
    if (plan == nullptr) {
        std::cerr << "morvanek-usb-gadget: " << scenarioFile << " has no device"
                  << (deviceName.empty() ? "" : " named " + deviceName) << "\n";
        return kInvalid;
    }

    int stopFd = stopSignals();
    try {
        auto device = lab::makeScenarioDevice(*plan);
        usbgadget::LoaderGadget gadget(device, plan->startsIn, settings);
        if (!readyFile.empty()) std::ofstream(readyFile) << gadget.controller() << "\n";
        std::cerr << "morvanek-usb-gadget: " << plan->name << " on " << gadget.controller() << "\n";
        gadget.serve(stopFd);
        nlohmann::json result = report(plan->name, *device, gadget);
        if (!reportFile.empty()) std::ofstream(reportFile) << result.dump(2) << "\n";
    } catch (const std::exception& error) {
        std::cerr << "morvanek-usb-gadget: " << error.what() << "\n";
        close(stopFd);
        return kFailed;
    }
    close(stopFd);
    return kServed;
}
