// The host library's plain functions over the shared state: registration,
// memory, the event log and debug lines.
#include <cstdarg>
#include <cstdio>

#include "../../sim/host/simHost.h"
#include "hostState.h"

using usbhost::state;

int32_t pkgIsKarvelkInitialized()
{
    std::lock_guard<std::mutex> lock(state().mutex);
    return state().started ? 1 : 0;
}

tStatus pkgModulePackageEventLog(uint32_t, const char*, const char*, const char*, tModuleMain)
{
    return 0;
}

void libRegisterModuleWithKARVEL(_tLibModuleInfo* module, tStatus& status)
{
    if (status < 0) return;
    if (module == nullptr || module->moduleMain == nullptr || module->moduleName == nullptr) {
        usbhost::reportMisuse("registration without a module record, a module main or a name");
        setFailure(status, usbhost::kBadArgument);
        return;
    }
    std::lock_guard<std::mutex> lock(state().mutex);
    state().module = module;
}

void libUnregisterModuleWithKARVEL(_tLibModuleInfo* module, tStatus& status)
{
    if (status < 0) return;
    std::unique_lock<std::mutex> lock(state().mutex);
    bool registered = module != nullptr && module == state().module;
    state().module = nullptr;
    lock.unlock();
    if (!registered) usbhost::reportMisuse("unregistering a module that is not registered");
}

void* _memNewUsingCRT(size_t size, tMemAllocationFlags flags, tStatus* status)
{
    if (flags != kMemAllocationDefault) usbhost::reportMisuse("allocation with flags other than 4");
    return usbhost::allocator().allocate(size, status);
}

void _memDelete(void* pointer)
{
    if (!usbhost::allocator().release(pointer))
        usbhost::reportMisuse("_memDelete of a block the host did not hand out");
}

void _kvlLogEvent(const char* component, const char* location, uint32_t level, const char* tag, const char* format, ...)
{
    usbhost::HostEvent event;
    event.kind = usbhost::HostEvent::Kind::log;
    event.component = component ? component : "(null)";
    event.location = location ? location : "(null)";
    event.level = level;
    event.tag = tag ? tag : "(null)";
    event.format = format ? format : "(null)";
    va_list arguments;
    va_start(arguments, format);
    event.text = format ? sim::formatHostMessage(format, arguments) : "";
    va_end(arguments);
    usbhost::emit(std::move(event));
}

int32_t ssprintf(const char* format, ...)
{
    usbhost::HostEvent event;
    event.kind = usbhost::HostEvent::Kind::debug;
    va_list arguments;
    va_start(arguments, format);
    event.text = format ? sim::formatHostMessage(format, arguments) : "";
    va_end(arguments);
    int32_t length = static_cast<int32_t>(event.text.size());
    usbhost::emit(std::move(event));
    return length;
}
