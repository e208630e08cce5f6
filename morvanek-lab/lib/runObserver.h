// Watches the devices' requests as they happen: which update each belongs to,
// which log lines and file opens were whose, writes that did not take, and the
// progress of long updates.
#pragma once

#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "progress.h"
#include "runRecord.h"
#include "sim/device/enumeratedDevice.h"

namespace lab {

class RunObserver {
public:
    // prefix: put before each progress line, such as "[2/5] file.json".
    RunObserver(Progress* progress, std::string prefix) : progress_(progress), prefix_(std::move(prefix)) {}

    // Starts watching a device; its index is its place in the scenario.
    void watch(sim::PhysicalDevice& device, int index);
    void stepBegins();
    void stepEnds();

    const std::vector<Owner>& logOwners() const { return logOwners_; }
    const std::vector<Owner>& openOwners() const { return openOwners_; }
    const std::vector<Owner>& registryOwners() const { return registryOwners_; }
    const std::vector<int>& updateOf(int device) const { return devices_.at(device).updateOf; }
    int updates(int device) const { return devices_.at(device).updates; }
    const std::vector<int>& requestOrder() const { return requestOrder_; }
    const std::vector<WriteNotTaken>& writesNotTaken(int device) const { return devices_.at(device).writesNotTaken; }

private:
    struct UpdateProgress {
        int update = -1;
        size_t erased = 0;
        size_t written = 0;
        size_t pages = 0;   // totals: 0 while unknown
        size_t blocks = 0;
        std::string phase;  // what the update does now
        size_t done = 0;    // of total, in this phase
        size_t total = 0;
    };

    struct Watched {
        std::string name;
        UpdateProgress progress;
        const sim::EnumeratedDevice* enumeration = nullptr;
        int updates = 0;
        std::vector<int> updateOf;
        std::vector<WriteNotTaken> writesNotTaken;
    };

    void onRequest(int index, const sim::PhysicalDevice& device, const sim::RequestRecord& record);
    void catchUp();
    void countProgress(Watched& watched, int update, const sim::PhysicalDevice& device,
                       const sim::RequestRecord& record);
    static void imageTotals(UpdateProgress& progress, const sim::LoaderFlashLayout& layout);
    void showProgress(const Watched& watched);

    Progress* progress_;
    std::string prefix_;
    std::vector<Watched> devices_;
    Owner last_;
    std::vector<Owner> logOwners_;
    std::vector<Owner> openOwners_;
    std::vector<Owner> registryOwners_;
    std::vector<int> requestOrder_;
};

}  // namespace lab
