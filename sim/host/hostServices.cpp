// The host library's plain functions, and the stand-in's bookkeeping of them.
#include <cstdio>

#include "simHost.h"

namespace sim {

void* Allocator::allocate(size_t size, tStatus* status)
{
    if (status != nullptr && *status < 0) return nullptr;
    ++attempts_;
    if (failAll_ || failAt_.count(attempts_) != 0) {
        if (status != nullptr) *status = kHostAllocationFailed;
        return nullptr;
    }
    void* block = ::operator new(size == 0 ? 1 : size);
    live_[block] = size;
    ++total_;
    return block;
}

void Allocator::release(void* pointer)
{
    if (pointer == nullptr) return;
    auto it = live_.find(pointer);
    if (it == live_.end()) {
        char text[96];
        std::snprintf(text, sizeof text, "_memDelete of %p, which the allocator did not hand out", pointer);
        Host::get().reportMisuse(text);
        return;
    }
    live_.erase(it);
    ::operator delete(pointer);
}

size_t Allocator::liveBytes() const
{
    size_t bytes = 0;
    for (const auto& block : live_) bytes += block.second;
    return bytes;
}

void Allocator::failNth(size_t nth)
{
    if (nth > 0) failAt_.insert(attempts_ + nth);
}

void Allocator::clearFaults()
{
    failAt_.clear();
    failAll_ = false;
}

void Allocator::reset()
{
    for (const auto& block : live_) ::operator delete(block.first);
    live_.clear();
    total_ = 0;
    attempts_ = 0;
    clearFaults();
}

Host& Host::get()
{
    static Host instance;
    return instance;
}

Host::Host() : tree_(new DeviceTreeSim) {}

void Host::reset()
{
    ready = true;
    // Devices hold host blocks (stream buffers); drop them before the allocator.
    tree_.reset(new DeviceTreeSim);
    treePresent_ = true;
    allocator.reset();
    eventLog.clear();
    debugLines.clear();
    packageEvents.clear();
    registeredModule = nullptr;
    registrations = 0;
    unregistrations = 0;
    registrationFailure = 0;
    unregistrationFailure = 0;
    registrationProblems.clear();
    misuse.clear();
}

void Host::setTreePresent(bool present)
{
    treePresent_ = present;
}

tStatus Host::callModuleMain(uint32_t reason)
{
    if (registeredModule == nullptr || registeredModule->moduleMain == nullptr) {
        reportMisuse("module main called while no module is registered");
        return kHostFailure;
    }
    tStatus result = registeredModule->moduleMain(reason);
    if (tree_) tree_->deliverPendingEvents();
    return result;
}

void Host::reportMisuse(const std::string& what)
{
    std::fprintf(stderr, "host stand-in: %s\n", what.c_str());
    misuse.push_back(what);
}

std::vector<std::string> Host::leftovers() const
{
    std::vector<std::string> result;
    if (allocator.liveBlocks() != 0) {
        result.push_back(std::to_string(allocator.liveBlocks()) + " host allocation(s) live (" +
                         std::to_string(allocator.liveBytes()) + " bytes)");
    }
    if (tree_) {
        for (const std::string& item : tree_->describeLeftovers()) result.push_back(item);
    }
    return result;
}

}  // namespace sim

using sim::Host;

int32_t pkgIsKarvelkInitialized()
{
    return Host::get().ready ? 1 : 0;
}

tStatus pkgModulePackageEventLog(uint32_t event, const char* firstName, const char* secondName,
                                 const char* mainName, tModuleMain moduleMain)
{
    sim::PackageEvent entry;
    entry.event = event;
    entry.firstName = firstName ? firstName : "(null)";
    entry.secondName = secondName ? secondName : "(null)";
    entry.mainName = mainName ? mainName : "(null)";
    entry.moduleMain = moduleMain;
    entry.liveBlocks = Host::get().allocator.liveBlocks();
    Host::get().packageEvents.push_back(entry);
    return 0;
}

void libRegisterModuleWithKARVEL(_tLibModuleInfo* module, tStatus& status)
{
    Host& host = Host::get();
    if (status < 0) return;
    ++host.registrations;
    // Check the records rather than trust them.
    auto problem = [&](const std::string& what) {
        host.registrationProblems.push_back(what);
        host.reportMisuse("registration: " + what);
    };
    if (module == nullptr) {
        problem("no module record");
        setFailure(status, sim::kHostBadArgument);
        return;
    }
    if (module->moduleMain == nullptr) problem("no module main");
    if (module->moduleName == nullptr) problem("no module name");
    const ModulePackageRecord* package = module->packageRecord;
    if (package == nullptr) {
        problem("no package record");
    } else {
        if (package->version != 1) problem("package record version is not 1");
        if (package->descriptor == nullptr || package->descriptor->value != 5) problem("descriptor missing or not 5");
        if (package->registryPath.Buffer != package->registryPathBuffer) problem("registry path not in the record");
        if (package->registryPath.MaximumLength != 520) problem("registry path maximum length is not 520");
        if (package->descriptor != nullptr && module->moduleName != package->descriptor->moduleName)
            problem("module name is not the descriptor's");
    }
    if (host.registrationFailure < 0) {
        setFailure(status, host.registrationFailure);
        return;
    }
    host.registeredModule = module;
}

void libUnregisterModuleWithKARVEL(_tLibModuleInfo* module, tStatus& status)
{
    Host& host = Host::get();
    if (status < 0) return;
    ++host.unregistrations;
    if (module != host.registeredModule) host.reportMisuse("unregistering a module that is not registered");
    host.registeredModule = nullptr;
    if (host.unregistrationFailure < 0) setFailure(status, host.unregistrationFailure);
}

void* _memNewUsingCRT(size_t size, tMemAllocationFlags flags, tStatus* status)
{
    if (flags != kMemAllocationDefault) Host::get().reportMisuse("allocation with flags other than 4");
    return Host::get().allocator.allocate(size, status);
}

void _memDelete(void* pointer)
{
    Host::get().allocator.release(pointer);
}

void _kvlLogEvent(const char* component, const char* location, uint32_t level, const char* tag,
                  const char* format, ...)
{
    sim::LogEntry entry;
    entry.component = component ? component : "(null)";
    entry.location = location ? location : "(null)";
    entry.level = level;
    entry.tag = tag ? tag : "(null)";
    entry.format = format ? format : "(null)";
    va_list arguments;
    va_start(arguments, format);
    entry.message = format ? sim::formatHostMessage(format, arguments) : "";
    va_end(arguments);
    Host::get().eventLog.push_back(entry);
}

int32_t ssprintf(const char* format, ...)
{
    va_list arguments;
    va_start(arguments, format);
    std::string line = format ? sim::formatHostMessage(format, arguments) : "";
    va_end(arguments);
    Host::get().debugLines.push_back(line);
    return static_cast<int32_t>(line.size());
}
