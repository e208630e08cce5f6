#include "world.h"

#include <fstream>
#include <random>

#include <fmt/format.h>

#include "scenarioDevice.h"
#include "scenarioError.h"
#include "scenarioRegistry.h"
#include "windowsModule.h"
#include "sim/kernel/simKernel.h"

namespace lab {

namespace {

std::filesystem::path makeTemporaryFolder(char letter)
{
    std::random_device random;
    std::error_code error;
    for (int attempt = 0; attempt < 10; ++attempt) {
        std::filesystem::path folder = std::filesystem::temp_directory_path(error) /
                                       fmt::format("morvanek-lab-{}-{:08x}", letter, random());
        if (error) break;
        if (std::filesystem::create_directory(folder, error)) return folder;
    }
    throw LabError("cannot make a temporary folder for drive " + std::string(1, letter) +
                   (error ? ": " + error.message() : ""));
}

// One component of a Windows path, found in a host folder without regard to case.
std::optional<std::filesystem::path> findIgnoringCase(const std::filesystem::path& folder, const std::string& name)
{
    std::error_code error;
    if (std::filesystem::exists(folder / name, error)) return folder / name;
    auto lower = [](std::string text) {
        for (char& c : text) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
        return text;
    };
    for (const auto& entry : std::filesystem::directory_iterator(folder, error)) {
        if (lower(entry.path().filename().string()) == lower(name)) return entry.path();
    }
    return std::nullopt;
}

}  // namespace

World::World(const Scenario& scenario, const std::string& modulePath, Progress* progress,
             const std::string& progressPrefix, Engine engine)
    : scenario_(scenario), observer_(progress, progressPrefix)
{
    sim::Host::get().reset();
    sim::kernel::reset();
    sim::Host& host = sim::Host::get();
    host.ready = scenario.host.ready;
    host.setTreePresent(scenario.host.deviceTree);
    host.registrationFailure = scenario.host.registrationFailure;
    host.unregistrationFailure = scenario.host.unregistrationFailure;
    sim::TreeFaults& treeFaults = host.tree()->faults;
    auto arm = [](sim::CallFailures& calls, const std::vector<CallFailurePlan>& plans) {
        for (const CallFailurePlan& plan : plans) {
            if (plan.number == 0) {
                calls.everyCall = plan.status;
            } else {
                calls.byNumber[static_cast<int>(plan.number)] = plan.status;
            }
        }
    };
    arm(treeFaults.createQuery, scenario.host.failCreateQuery);
    arm(treeFaults.setAttribute, scenario.host.failSetAttribute);
    arm(treeFaults.findDevices, scenario.host.failFindDevices);
    arm(treeFaults.addListener, scenario.host.failAddListener);
    try {
        buildDrives();
        buildRegistry();
        buildDevices();
        if (engine == Engine::windowsDriver) {
            auto windows = std::make_unique<WindowsModule>(
                scenario, drives_, [this](const std::string& dosPath) { return hostPath(dosPath); });
            windows_ = windows.get();
            module_ = std::move(windows);
        } else {
            module_ = std::make_unique<sim::ModuleImage>(modulePath.empty() ? sim::ModuleImage::defaultPath() : modulePath);
        }
    } catch (const std::runtime_error& error) {
        // The destructor does not run for a half-built world.
        for (const auto& folder : temporaryFolders_) std::filesystem::remove_all(folder);
        sim::Host::get().reset();
        sim::kernel::reset();
        if (dynamic_cast<const ScenarioError*>(&error) != nullptr) throw;
        throw LabError(error.what());
    }
}

World::~World()
{
    // The stand-ins first: nothing may call into the module once it is unloaded.
    for (auto& device : devices_) device->requestObserver = nullptr;
    sim::Host::get().reset();
    sim::kernel::reset();
    module_.reset();
    for (const auto& folder : temporaryFolders_) {
        std::error_code ignored;
        std::filesystem::remove_all(folder, ignored);
    }
}

void World::buildDrives()
{
    for (const DrivePlan& drive : scenario_.drives) {
        std::filesystem::path folder;
        if (drive.folder) {
            folder = *drive.folder;
        } else {
            folder = makeTemporaryFolder(drive.letter);
            temporaryFolders_.push_back(folder);
        }
        drives_[drive.letter] = folder;
        sim::kernel::files().mapDrive(drive.letter, folder);
        for (const FilePlan& file : drive.files) {
            std::filesystem::path path = folder;
            std::string part;
            for (char c : file.path + "\\") {
                if (c != '\\') {
                    part += c;
                    continue;
                }
                path /= part;
                part.clear();
            }
            std::filesystem::create_directories(path.parent_path());
            std::ofstream out(path, std::ios::binary);
            out.write(reinterpret_cast<const char*>(file.bytes.data()), static_cast<std::streamsize>(file.bytes.size()));
            if (!out) throw LabError("cannot write " + path.string());
            out.close();
            if (file.heldOpenElsewhere) sim::kernel::files().holdOpenElsewhere(path);
        }
    }
    const FileFaultPlan& faults = scenario_.fileFaults;
    auto& files = sim::kernel::files();
    if (faults.everyRead != 0) files.failReads(faults.everyRead);
    for (const auto& [number, status] : faults.readNumbers) files.failReadNumber(number, status);
    if (faults.sizeQuery != 0) files.failSizeQuery(faults.sizeQuery);
    if (faults.setPosition != 0) files.failSetPosition(faults.setPosition);
    for (const auto& [number, bytes] : faults.shortReads) files.shortenRead(number, bytes);
    for (const ContentChangePlan& change : faults.contentChanges) {
        std::optional<std::filesystem::path> file = hostPath(change.dosPath);
        if (!file) throw ScenarioError(scenario_.file, change.pointer + "/file", "no such file on the scenario's drives");
        files.changeContentAfterOpens(*file, change.afterOpens, change.bytes);
    }
    for (const CallFailurePlan& failure : faults.opens)
        files.failOpenNumber(static_cast<unsigned>(failure.number), failure.status, faultFile(failure));
    for (const CallFailurePlan& failure : faults.sizeQueries)
        files.failSizeQueryNumber(static_cast<unsigned>(failure.number), failure.status, faultFile(failure));
}

std::filesystem::path World::faultFile(const CallFailurePlan& failure) const
{
    if (!failure.file) return {};
    std::optional<std::filesystem::path> path = hostPath(*failure.file);
    if (!path) {
        throw ScenarioError(scenario_.file, failure.pointer + "/file",
                            fmt::format("there is no file {} in the scenario's drives", *failure.file));
    }
    return *path;
}

void World::buildRegistry()
{
    auto& registry = sim::kernel::registry();
    fillRegistry(registry, scenario_.registry);
    for (const RegistryFaultPlan& fault : scenario_.registry.faults) {
        if (fault.valueName) {
            registry.failQuery(fault.keyPath, *fault.valueName, fault.status, fault.number);
        } else {
            registry.failCreateKey(fault.keyPath, fault.status, fault.number);
        }
    }
}

void World::buildDevices()
{
    for (size_t i = 0; i < scenario_.devices.size(); ++i) {
        const DevicePlan& plan = scenario_.devices[i];
        auto device = makeScenarioDevice(plan);
        flashBefore_.push_back(device->readMemory(0, sim::FlashMemory::kSize));
        observer_.watch(*device, static_cast<int>(i));
        if (plan.present) device->plugIn(*sim::Host::get().tree(), plan.startsIn);
        devices_.push_back(device);
    }
}

std::vector<std::string> World::engineLeftovers()
{
    return windows_ != nullptr ? windows_->finish() : std::vector<std::string>{};
}

void World::armAllocationFaults()
{
    sim::Allocator& allocator = sim::Host::get().allocator;
    attemptsBeforeSteps_ = allocator.attempts().size();
    for (size_t nth : scenario_.host.failAllocations) allocator.failNth(nth);
    allocator.failAll(scenario_.host.failAllAllocations);
}

const DevicePlan& World::plan(const std::string& name) const
{
    for (const DevicePlan& plan : scenario_.devices) {
        if (plan.name == name) return plan;
    }
    throw LabError("no device named " + name);
}

sim::PhysicalDevice& World::device(const std::string& name)
{
    for (auto& device : devices_) {
        if (device->options().name == name) return *device;
    }
    throw LabError("no device named " + name);
}

std::optional<std::filesystem::path> World::hostPath(const std::string& dosPath) const
{
    if (dosPath.size() < 2 || dosPath[1] != ':') return std::nullopt;
    auto drive = drives_.find(static_cast<char>(std::toupper(static_cast<unsigned char>(dosPath[0]))));
    if (drive == drives_.end()) return std::nullopt;
    std::filesystem::path path = drive->second;
    std::string part;
    for (char c : dosPath.substr(2) + "\\") {
        if (c != '\\' && c != '/') {
            part += c;
            continue;
        }
        if (part.empty()) continue;
        auto found = findIgnoringCase(path, part);
        if (!found) return std::nullopt;
        path = *found;
        part.clear();
    }
    return path;
}

}  // namespace lab
