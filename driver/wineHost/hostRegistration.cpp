#include "hostRegistration.h"

#include "hostCall.h"
#include "karvelkBridge.h"

namespace karvelk {

namespace {

_tLibModuleInfo* gRegistered;

uint64_t addressOf(const void* pointer)
{
    return reinterpret_cast<uintptr_t>(pointer);
}

// The records as the lab rebuilds them: every field, and which pointers
// point into which record, because the stand-in checks those links.
void writeRecords(bridge::Writer& out, const _tLibModuleInfo& module)
{
    out.u64(addressOf(module.packageRecord));
    out.text(module.moduleName);
    out.u64(addressOf(reinterpret_cast<const void*>(module.moduleMain)));
    out.text(module.firstName);
    out.text(module.secondName);
    const ModulePackageRecord* package = module.packageRecord;
    out.u32(package != nullptr ? 1 : 0);
    if (package == nullptr) return;
    out.bytes(package, sizeof(*package));
    out.u32(package->registryPath.Buffer == package->registryPathBuffer ? 1 : 0);
    const ModuleDescriptor* descriptor = package->descriptor;
    out.u32(descriptor != nullptr ? 1 : 0);
    if (descriptor == nullptr) return;
    out.u32(descriptor->value);
    out.text(descriptor->moduleName);
    out.bytes(descriptor->guid, sizeof(descriptor->guid));
    out.u32(module.moduleName == descriptor->moduleName ? 1 : 0);
}

}  // namespace

void registerModule(_tLibModuleInfo* module, tStatus& status)
{
    HostCall call(bridge::kRegister);
    call.out().u64(addressOf(module));
    call.out().u32(static_cast<uint32_t>(status));
    call.out().u32(module != nullptr ? 1 : 0);
    if (module != nullptr) writeRecords(call.out(), *module);
    bridge::Reader& reply = call.send();
    status = static_cast<tStatus>(reply.u32());
    if (reply.u32() != 0) gRegistered = module;
}

void unregisterModule(_tLibModuleInfo* module, tStatus& status)
{
    HostCall call(bridge::kUnregister);
    call.out().u64(addressOf(module));
    call.out().u32(static_cast<uint32_t>(status));
    bridge::Reader& reply = call.send();
    status = static_cast<tStatus>(reply.u32());
    if (reply.u32() == 0) gRegistered = nullptr;
}

_tLibModuleInfo* registeredModule()
{
    return gRegistered;
}

}  // namespace karvelk

extern "C" int32_t karvelkCallModuleMain(uint32_t reason, int32_t* result)
{
    _tLibModuleInfo* module = karvelk::registeredModule();
    if (module == nullptr || module->moduleMain == nullptr) return 0;
    *result = module->moduleMain(reason);
    return 1;
}
