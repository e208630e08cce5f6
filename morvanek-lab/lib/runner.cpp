#include "runner.h"

#include <fmt/format.h>

#include "sim/kernel/simKernel.h"

namespace lab {

namespace {

constexpr const char* kServiceKey = "\\Registry\\Machine\\System\\CurrentControlSet\\Services\\morvanek";

std::string guidText(const uint8_t* bytes)
{
    // Registry form: the first three groups are little-endian numbers.
    return fmt::format("{{{:02X}{:02X}{:02X}{:02X}-{:02X}{:02X}-{:02X}{:02X}-{:02X}{:02X}-{:02X}{:02X}{:02X}{:02X}{:02X}{:02X}}}",
                       bytes[3], bytes[2], bytes[1], bytes[0], bytes[5], bytes[4], bytes[7], bytes[6], bytes[8],
                       bytes[9], bytes[10], bytes[11], bytes[12], bytes[13], bytes[14], bytes[15]);
}

std::string routeText(MainRoute route)
{
    return route == MainRoute::wrapper ? "through pkgWDMWrapperCallSSMain" : "through the module main";
}

std::string statusText(int32_t status)
{
    return std::to_string(status);
}

std::string ntStatusText(int64_t status)
{
    return fmt::format("0x{:08X}", static_cast<uint32_t>(status));
}

tStatus callMain(World& world, MainRoute route, uint32_t reason, StepRecord& step)
{
    if (route == MainRoute::moduleMain) return sim::Host::get().callModuleMain(reason);
    if (world.module().callSsMain == nullptr) {
        step.problem = "the module does not export pkgWDMWrapperCallSSMain";
        return 0;
    }
    tStatus result = world.module().callSsMain(reason);
    sim::Host::get().tree()->deliverPendingEvents();
    return result;
}

void runStep(const StepPlan& plan, World& world, StepRecord& step)
{
    sim::ModuleImage& module = world.module();
    auto missing = [&](const void* function, const char* name) {
        if (function == nullptr) step.problem = fmt::format("the module does not export {}", name);
        return function == nullptr;
    };
    tStatus status = plan.statusIn;
    switch (plan.kind) {
    case StepKind::load:
        step.title = plan.registryPath == kServiceKey ? "load" : "load with registry path " + plan.registryPath;
        step.result = static_cast<uint32_t>(module.initialize(plan.registryPath));
        step.resultText = ntStatusText(*step.result);
        return;
    case StepKind::unload:
        step.title = "unload";
        step.result = static_cast<uint32_t>(module.dllUnload());
        step.resultText = ntStatusText(*step.result);
        return;
    case StepKind::start:
    case StepKind::stop:
    case StepKind::moduleMain:
        step.title = plan.kind == StepKind::moduleMain ? fmt::format("module main, reason {}, ", plan.reason)
                                                       : std::string(stepKindName(plan.kind)) + " ";
        step.title += routeText(plan.route);
        step.result = callMain(world, plan.route, plan.reason, step);
        step.resultText = statusText(static_cast<int32_t>(*step.result));
        return;
    case StepKind::plugIn: {
        step.title = "plug in " + plan.device;
        sim::PhysicalDevice& device = world.device(plan.device);
        // A device that was plugged in before starts as a real one would: as its flash says.
        sim::PhysicalDevice::PowerUp how = plan.startsIn.value_or(
            device.everPluggedIn() ? sim::PhysicalDevice::PowerUp::asFlashSays : world.plan(plan.device).startsIn);
        device.plugIn(*sim::Host::get().tree(), how);
        return;
    }
    case StepKind::unplug:
        step.title = "unplug " + plan.device;
        if (world.device(plan.device).current() == nullptr) step.problem = plan.device + " is not plugged in";
        world.device(plan.device).unplug();
        return;
    case StepKind::setWdmLoadState: {
        step.title = fmt::format("pkgSetWDMWrapperLoadStateAndGetGUID({})", plan.state);
        if (missing(reinterpret_cast<void*>(module.setWdmLoadStateAndGetGuid), "pkgSetWDMWrapperLoadStateAndGetGUID"))
            return;
        const uint8_t* guid = module.setWdmLoadStateAndGetGuid(plan.state);
        step.guid = guid == nullptr ? "null" : guidText(guid);
        step.resultText = *step.guid;
        return;
    }
    case StepKind::setLegacyLoadState:
        step.title = fmt::format("pkgSetLegacyWrapperLoadState({})", plan.state);
        if (missing(reinterpret_cast<void*>(module.setLegacyLoadState), "pkgSetLegacyWrapperLoadState")) return;
        module.setLegacyLoadState(plan.state);
        return;
    case StepKind::getCurrentVersion:
    case StepKind::getOldestCompatibleVersion: {
        bool current = plan.kind == StepKind::getCurrentVersion;
        step.title = fmt::format("{}(status {})", current ? "getCurrentVersion" : "getOldestCompatibleVersion", status);
        auto function = current ? module.getCurrentVersion : module.getOldestCompatibleVersion;
        if (missing(reinterpret_cast<void*>(function), current ? "getCurrentVersion" : "getOldestCompatibleVersion"))
            return;
        tSSVersion version = function(status);
        char text[16];
        step.result = version.packed();
        step.status = status;
        step.resultText = fmt::format("0x{:08X} ({}), status {}", version.packed(), version.toString(text), status);
        return;
    }
    case StepKind::compareVersion: {
        step.title = fmt::format("compareVersion(newest 0x{:08X}, oldest 0x{:08X}, status {}, component {})",
                                 plan.newest, plan.oldest, status,
                                 plan.component ? "\"" + *plan.component + "\"" : std::string("null"));
        if (missing(reinterpret_cast<void*>(module.compareVersion), "compareVersion")) return;
        tSSVersion newest(plan.newest);
        tSSVersion oldest(plan.oldest);
        module.compareVersion(newest, oldest, status, plan.component ? plan.component->c_str() : nullptr);
        step.status = status;
        step.resultText = "status " + statusText(status);
        return;
    }
    case StepKind::compareFirmwareVersion:
        step.title = fmt::format("compareFirmwareVersion(expected 0x{:08X}, product 0x{:04X}, status {})", plan.version,
                                 plan.productId, status);
        if (missing(reinterpret_cast<void*>(module.compareFirmwareVersion), "compareFirmwareVersion")) return;
        module.compareFirmwareVersion(tSSVersion(plan.version), plan.productId, status);
        step.status = status;
        step.resultText = "status " + statusText(status);
        return;
    }
}

std::string modeOf(const sim::PhysicalDevice& device)
{
    const sim::EnumeratedDevice* current = device.current();
    if (current == nullptr) return "unplugged";
    if (dynamic_cast<const sim::LoaderModeDevice*>(current) != nullptr) return "loader";
    return "product";
}

}  // namespace

std::vector<StepRecord> runSteps(const Scenario& scenario, World& world)
{
    std::vector<StepRecord> steps;
    world.armAllocationFaults();
    for (const StepPlan& plan : scenario.steps) {
        StepRecord step;
        step.plan = plan;
        world.observer().stepBegins();
        runStep(plan, world, step);
        world.observer().stepEnds();
        steps.push_back(step);
    }
    return steps;
}

RunRecord takeRecord(const Scenario& scenario, World& world, std::vector<StepRecord> steps)
{
    RunRecord record;
    record.steps = std::move(steps);
    sim::Host& host = sim::Host::get();
    const RunObserver& observer = world.observer();

    for (size_t i = 0; i < host.eventLog.size(); ++i) {
        Owner owner = i < observer.logOwners().size() ? observer.logOwners()[i] : Owner{};
        record.eventLog.push_back({host.eventLog[i], owner});
    }
    record.debugLines = host.debugLines;
    record.packageEvents = host.packageEvents;

    const auto& opens = sim::kernel::files().opens();
    for (size_t i = 0; i < opens.size(); ++i) {
        FileOpenSeen seen{opens[i], i < observer.openOwners().size() ? observer.openOwners()[i] : Owner{}, 0};
        std::error_code error;
        if (!opens[i].hostPath.empty()) seen.size = std::filesystem::file_size(opens[i].hostPath, error);
        record.fileOpens.push_back(seen);
    }
    record.requestOrder = observer.requestOrder();
    record.createdKeys = sim::kernel::registry().createdKeys();
    record.registryCalls = sim::kernel::registry().calls();
    for (size_t i = 0; i < record.registryCalls.size(); ++i)
        record.registryCallOwners.push_back(i < observer.registryOwners().size() ? observer.registryOwners()[i] : Owner{});

    for (size_t i = 0; i < scenario.devices.size(); ++i) {
        const DevicePlan& plan = scenario.devices[i];
        sim::PhysicalDevice& device = *world.devices()[i];
        DeviceRecord entry;
        entry.name = plan.name;
        entry.options = plan.options;
        entry.timingName = plan.timingName;
        entry.layout = device.layout();
        entry.flashBefore = world.flashBefore()[i];
        entry.flashAfter = device.readMemory(0, sim::FlashMemory::kSize);
        entry.trace = device.trace;
        entry.updateOf = observer.updateOf(static_cast<int>(i));
        entry.updates = observer.updates(static_cast<int>(i));
        entry.writesNotTaken = observer.writesNotTaken(static_cast<int>(i));
        entry.mode = modeOf(device);
        if (const sim::EnumeratedDevice* current = device.current()) {
            auto attribute = [&](uint32_t id) { return static_cast<uint16_t>(current->attributes.at(id)); };
            entry.enumeratedVendorId = attribute(1);
            entry.enumeratedProductId = attribute(2);
        }
        entry.markerInPlace = device.completionMarkerInPlace();
        entry.notes = device.notes;
        entry.elapsed = device.elapsed;
        record.devices.push_back(std::move(entry));
    }

    record.leftovers = host.leftovers();
    for (const std::string& handle : sim::kernel::openHandleDescriptions()) record.leftovers.push_back("open handle: " + handle);
    record.misuse = host.misuse;
    for (const std::string& report : sim::kernel::misuseReports()) record.misuse.push_back(report);
    record.liveBlocks = host.allocator.liveBlocks();
    record.liveBytes = host.allocator.liveBytes();
    record.totalAllocations = host.allocator.totalAllocations();
    record.openHandles = sim::kernel::openHandleCount();
    record.liveListeners = host.tree()->liveListeners();
    record.liveQueries = host.tree()->liveQueries();
    return record;
}

}  // namespace lab
