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

#include "engine.h"
#include "runObserver.h"
#include "scenario.h"
#include "sim/device/enumeratedDevice.h"
#include "sim/loader/moduleImage.h"

namespace lab {

class WindowsModule;

class World {
public:
    // Throws LabError when the module cannot be loaded or a folder not made.
    // The Windows engine's module is morvanek.sys under Wine (modulePath is the Linux one's).
    World(const Scenario& scenario, const std::string& modulePath, Progress* progress,
          const std::string& progressPrefix = {}, Engine engine = Engine::linuxModule);
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

    // What the engine itself still holds for the module after the steps (the
    // Windows side's own count); ends the engine, so call it last.
    std::vector<std::string> engineLeftovers();

    // Applied last, just before the steps, so that they count the steps' allocations only.
    void armAllocationFaults();
    // Allocation attempts before the steps began, which the faults do not count.
    size_t allocationAttemptsBeforeSteps() const { return attemptsBeforeSteps_; }

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
    WindowsModule* windows_ = nullptr;  // module_, when it is the Windows engine's
    size_t attemptsBeforeSteps_ = 0;
};

}  // namespace lab
