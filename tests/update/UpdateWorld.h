// A loader world with one emulated device that the module finds present at
// its start or arriving later, and the device's requests and the event log in
// forms that compare at a glance.
#pragma once

#include <functional>
#include <memory>
#include <ostream>
#include <string>
#include <vector>

#include "sim/device/enumeratedDevice.h"
#include "tests/support/LoaderWorld.h"

namespace update_tests {

enum class Arrival { PresentAtStart, PluggedInLater };

std::string arrivalName(Arrival arrival);

struct LogLine {
    std::string location;
    std::string message;
    bool operator==(const LogLine& other) const { return location == other.location && message == other.message; }
};

void PrintTo(const LogLine& line, std::ostream* out);

// One line per request the device was handed: "read 0x37F8 2", "write 0x0200 512", "erase 1", "restart"; a request
// that did not go through ends in " failed".
std::vector<std::string> requestLines(const sim::PhysicalDevice& device);

// The reads of vendor ID, product ID and serial number that open every update.
std::vector<std::string> identityReads(uint16_t loaderProductId);
// One block's write and its read-back in requests of at most 64 bytes.
std::vector<std::string> blockRequests(uint16_t address, uint32_t length);
std::vector<std::string> joined(const std::vector<std::vector<std::string>>& parts);

// The messages about the device of deviceWithIdentity(..., 0x4B01).
LogLine updateFailed(tStatus status);
LogLine pathNotFound(tStatus status);
LogLine blockDiffers(uint32_t block);
LogLine partialBlockDiffers(uint32_t block);

constexpr uint16_t kProductId = 0x4B01;

class UpdateWorld : public testing_support::LoaderWorld {
protected:
    void TearDown() override;

    // Puts a loader-mode enumeration of the hardware into the tree, before or
    // after the module starts; prepare sees it before the module does.
    sim::LoaderModeDevice& run(const std::shared_ptr<sim::PhysicalDevice>& hardware, Arrival arrival,
                               const std::function<void(sim::LoaderModeDevice&)>& prepare = {});

    // The event log; every entry must carry the loader's component, level and tag.
    std::vector<LogLine> logLines();

private:
    bool started_ = false;
};

}  // namespace update_tests
