// Watches the devices' requests as they happen: which update each belongs to,
// which log lines and file opens were whose, writes that did not take, and the
// progress of long updates.
#pragma once

#include <memory>
#include <vector>

#include "progress.h"
#include "runRecord.h"
#include "sim/device/enumeratedDevice.h"

namespace lab {

class RunObserver {
public:
    explicit RunObserver(Progress* progress) : progress_(progress) {}

    // Starts watching a device; its index is its place in the scenario.
    void watch(sim::PhysicalDevice& device, int index);
    void stepBegins();
    void stepEnds();

    const std::vector<Owner>& logOwners() const { return logOwners_; }
    const std::vector<Owner>& openOwners() const { return openOwners_; }
    const std::vector<Owner>& registryOwners() const { return registryOwners_; }
    const std::vector<int>& updateOf(int device) const { return devices_.at(device).updateOf; }
    const std::vector<int>& stepOf(int device) const { return devices_.at(device).stepOf; }
    int updates(int device) const { return devices_.at(device).updates; }
    const std::vector<WriteNotTaken>& writesNotTaken(int device) const { return devices_.at(device).writesNotTaken; }

private:
    struct Watched {
        std::string name;
        uint64_t enumeration = 0;  // of the last request seen
        int updates = 0;
        std::vector<int> updateOf;
        std::vector<int> stepOf;
        std::vector<WriteNotTaken> writesNotTaken;
    };

    void onRequest(int index, const sim::PhysicalDevice& device, const sim::RequestRecord& record);
    void catchUp();
    void showProgress(int index, const sim::PhysicalDevice& device, const sim::RequestRecord& latest);

    Progress* progress_;
    std::vector<Watched> devices_;
    Owner last_;
    int step_ = -1;
    std::vector<Owner> logOwners_;
    std::vector<Owner> openOwners_;
    std::vector<Owner> registryOwners_;
};

}  // namespace lab
