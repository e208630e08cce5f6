// A world for morvanek-usb: the loader world's registry and drive C, an
// emulated USB bus made with umockdev, and the program run against both as a
// child process under umockdev's preload. The same devices can be run through
// the lab's host in this process, to compare what each device was asked.
#pragma once

#include <memory>
#include <string>
#include <vector>

#include <nlohmann/json.hpp>

#include "tests/support/loaderWorld.h"
#include "usb/testbed/emulatedBus.h"
#include "usb/testbed/programRun.h"

namespace usb_testing {

struct UsbRun {
    int exitCode = -1;
    std::string errors;                  // standard error
    std::vector<nlohmann::json> events;  // the JSON lines of standard output

    std::vector<nlohmann::json> eventsOf(const std::string& kind) const;
    // The update events' outcomes by bus path.
    std::string outcomeOf(const std::string& busPath) const;
};

class UsbWorld : public testing_support::LoaderWorld {
  protected:
    void SetUp() override;
    void TearDown() override;

    // Runs the program with --json (unless told not to), the world's registry
    // and drive C, and the arguments given; waits for it to end.
    UsbRun runUsb(const std::vector<std::string>& arguments, bool json = true);
    // The same, started in the background, for watch; finishUsb sends the
    // signal given (0: none) and collects it.
    std::unique_ptr<usbtestbed::ProgramRun> startUsb(const std::vector<std::string>& arguments, bool json = true);
    UsbRun finishUsb(usbtestbed::ProgramRun& program, int signal);

    // What the device would be asked through the lab's host: the module run
    // in this process against a device made from the same options.
    std::vector<sim::RequestRecord> labTrace(const sim::EmulatedDeviceOptions& options);

    std::shared_ptr<sim::PhysicalDevice> plugIn(const sim::EmulatedDeviceOptions& options,
                                                const std::string& serial = "");

    std::unique_ptr<usbtestbed::EmulatedBus> bus;
    std::string outputFolder;
};

// The first difference between two traces in words, or empty when they agree.
std::string traceDifference(const std::vector<sim::RequestRecord>& expected,
                            const std::vector<sim::RequestRecord>& seen);

}  // namespace usb_testing
