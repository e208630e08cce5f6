// The world a scenario describes, built in the host's and kernel's stand-ins:
// host state, registry, drives in temporary folders, emulated devices, and the
// module loaded by file. Taken down again when the World goes.
#pragma once

#include <filesystem>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "runObserver.h"
#include "scenario.h"
#include "sim/device/enumeratedDevice.h"
#include "sim/loader/moduleImage.h"

namespace lab {

class World {
public:
    // Throws LabError when the module cannot be loaded or a folder not made.
    World(const Scenario& scenario, const std::string& modulePath, Progress* progress,
          const std::string& progressPrefix = {});
    ~World();
    World(const World&) = delete;
    World& operator=(const World&) = delete;

    sim::ModuleImage& module() { return *module_; }
    RunObserver& observer() { return observer_; }
    sim::PhysicalDevice& device(const std::string& name);
    const DevicePlan& plan(const std::string& name) const;
    std::vector<std::shared_ptr<sim::PhysicalDevice>>& devices() { return devices_; }
    const std::vector<std::vector<uint8_t>>& flashBefore() const { return flashBefore_; }

    // The host file a DOS path ("C:\WINDOWS\x.bin") stands for, ignoring case
    // as Windows does; nullopt when the drive or file is not there.
    std::optional<std::filesystem::path> hostPath(const std::string& dosPath) const;

    // Applied last, just before the steps, so that they count the steps' allocations only.
    void armAllocationFaults();

private:
    void buildDrives();
    void buildRegistry();
    void buildDevices();
    // The host file a file fault names; empty when it names none.
    std::filesystem::path faultFile(const CallFailurePlan& failure) const;

    const Scenario& scenario_;
    RunObserver observer_;
    std::vector<std::filesystem::path> temporaryFolders_;
    std::map<char, std::filesystem::path> drives_;
    std::vector<std::shared_ptr<sim::PhysicalDevice>> devices_;
    std::vector<std::vector<uint8_t>> flashBefore_;
    std::unique_ptr<sim::ModuleImage> module_;
};

}  // namespace lab
