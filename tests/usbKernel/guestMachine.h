// A virtual machine with a real kernel USB stack for morvanek-usb's tests:
// Debian's kernel under qemu, the emulated devices of a lab scenario behind
// FunctionFS gadgets on dummy_hcd, and morvanek-usb on the host side of the
// same controllers, all in one guest that runs the programs built here.
#pragma once

#include <map>
#include <string>
#include <utility>
#include <vector>

#include <nlohmann/json.hpp>

namespace usb_kernel_testing {

struct GadgetPlan {
    std::string device;  // the scenario's device
    std::string serial;  // its USB serial-number string
};

// What the guest does: serve the gadgets, run morvanek-usb once (or watch)
// with the scenario's world and the extra arguments.
struct GuestJob {
    GuestJob() = default;
    GuestJob(std::string scenario, std::vector<GadgetPlan> served, std::vector<std::string> arguments = {})
        : scenarioFile(std::move(scenario)), gadgets(std::move(served)), usbArguments(std::move(arguments))
    {
    }

    std::string scenarioFile;
    std::vector<GadgetPlan> gadgets;
    std::vector<std::string> usbArguments;
    std::string usbPrefix;      // a command morvanek-usb runs under, such as one that drops root
    std::string beforeGadgets;  // shell lines run before the gadgets start
    std::string afterUsb;       // shell lines run after morvanek-usb ended, before the gadgets stop
    bool watch = false;         // morvanek-usb watch, started before the devices arrive
};

struct GuestRun {
    int usbExitCode = -1;
    std::vector<nlohmann::json> events;  // morvanek-usb's JSON lines
    std::string usbErrors;
    std::map<std::string, nlohmann::json> gadgets;  // each device's gadget report, by device name
    std::string log;                                // what the job and the guest said, for failures
    std::string folder;                             // the job's folder, with what it wrote

    std::vector<nlohmann::json> eventsOf(const std::string& kind) const;
    // A file the job wrote into its folder; empty when there is none.
    std::string file(const std::string& name) const;
    // The update events of loader-mode devices (a product that arrives is "ignored").
    std::vector<nlohmann::json> updates() const;
};

class GuestMachine {
  public:
    // Prepares the guest once per test program; an empty answer means ready,
    // otherwise it says why the machine cannot run one (the tests skip).
    static std::string prepare();

    // Exports the scenario's world with the lab, boots the guest with one
    // controller per gadget, serves the devices and runs `morvanek-usb once`
    // with the world and the extra arguments.
    static GuestRun run(const std::string& jobName, const GuestJob& job);

    // The lab's own run of the scenario: each device's report (its trace,
    // mode, marker, ...) by device name.
    static std::map<std::string, nlohmann::json> labDevices(const std::string& scenarioFile);
    // The scenario's device names, in order.
    static std::vector<std::string> deviceNames(const std::string& scenarioFile);
};

// The text as one word for the shell.
std::string shellQuoted(const std::string& text);

// The first difference between two traces (the lab's JSON form), or empty
// when they agree request for request: kind, addresses, length, outcome, data.
std::string traceDifference(const nlohmann::json& expected, const nlohmann::json& seen);

}  // namespace usb_kernel_testing
