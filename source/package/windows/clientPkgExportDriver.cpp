// The export-driver frame: the records the host reads, the kernel's load and
// unload entry points, the host's wrapper exports and the module main.
#include <stdint.h>

#include "../../../host/karvelk.h"
#include "../../../host/moduleRecords.h"
#include "../../deviceTable.h"
#include "../../moduleMemory.h"
#include "../../statusCodes.h"
#include "moduleExports.h"
#include "staticObjects.h"

namespace {

tStatus ssMain(uint32_t reason);

constexpr char kModuleName[] = "morvanek";
constexpr char kEmptyName[] = "";
constexpr char kMainName[] = "ssMain";

constexpr ModuleDescriptor kModuleDescriptor = {
    5,
    kModuleName,
    // {1F4C7A92-3B5E-4D81-9C06-72E8A1B5D3F4}
    {0x92, 0x7A, 0x4C, 0x1F, 0x5E, 0x3B, 0x81, 0x4D, 0x9C, 0x06, 0x72, 0xE8, 0xA1, 0xB5, 0xD3, 0xF4},
};

ModulePackageRecord gModulePackageRecord = {1, &kModuleDescriptor, 0, {0, 0, nullptr}, {}, 0, 0, 0, 0, 0};

_tLibModuleInfo gLibModuleInfo = {&gModulePackageRecord, nullptr, ssMain, kEmptyName, kEmptyName};

void logPackageEvent(uint32_t event)
{
    pkgModulePackageEventLog(event, gLibModuleInfo.firstName, gLibModuleInfo.secondName, kMainName, ssMain);
}

void registerModule(const UNICODE_STRING* registryPath, tStatus& status)
{
    if (status < 0) return;
    ModulePackageRecord& record = *gLibModuleInfo.packageRecord;
    record.registryPath.Buffer = record.registryPathBuffer;
    record.registryPath.MaximumLength = sizeof(record.registryPathBuffer);
    RtlCopyUnicodeString(&record.registryPath, registryPath);
    gLibModuleInfo.moduleName = record.descriptor->moduleName;
    libRegisterModuleWithKARVEL(&gLibModuleInfo, status);
}

void destroyDeviceTable()
{
    delete gModuleDeviceTable;
    gModuleDeviceTable = nullptr;
}

tStatus startDeviceWork()
{
    // A table already watching stays as it is: replacing it would leave its
    // listeners registered with callbacks into a module about to go away.
    if (gModuleDeviceTable != nullptr) return 0;

    tStatus status = 0;
    startStaticObjects();
    void* memory = allocateFromHost(sizeof(DeviceTable));
    if (memory == nullptr) {
        gModuleDeviceTable = nullptr;
        return kStatusNotObtained;
    }
    gModuleDeviceTable = new (memory, ConstructInPlace{}) DeviceTable(status);
    if (status >= 0) return status;
    destroyDeviceTable();
    return status;
}

tStatus stopDeviceWork()
{
    destroyDeviceTable();
    stopStaticObjects();
    return 0;
}

tStatus ssMain(uint32_t reason)
{
    switch (reason) {
    case 0:
        return startDeviceWork();
    case 1:
        return stopDeviceWork();
    default:
        return 0;
    }
}

}  // namespace

extern "C" NTSTATUS DllInitialize(UNICODE_STRING* registryPath)
{
    tStatus status = 0;
    if (pkgIsKarvelkInitialized() == 0) return kStatusDriverUnableToLoad;
    logPackageEvent(0);
    startStaticObjects();
    registerModule(registryPath, status);
    if (status >= 0) return kStatusSuccess;
    // Nobody calls DllUnload after a failed load: give back the static start
    // so that no stop-list node stays behind in the host allocator.
    stopStaticObjects();
    return kStatusDriverUnableToLoad;
}

extern "C" NTSTATUS DllUnload()
{
    tStatus status = 0;
    libUnregisterModuleWithKARVEL(&gLibModuleInfo, status);
    // A host that unloads without stopping the module first would leave its
    // listeners calling into code that is gone: stop the device work here,
    // as ssMain(1) would have, before the unload's own static stop.
    if (gModuleDeviceTable != nullptr) stopDeviceWork();
    stopStaticObjects();
    logPackageEvent(1);
    return kStatusSuccess;
}

extern "C" const uint8_t* pkgSetWDMWrapperLoadStateAndGetGUID(uint32_t state)
{
    ModulePackageRecord* record = gLibModuleInfo.packageRecord;
    record->wdmWrapperLoadState = state;
    return record->descriptor->guid;
}

extern "C" tStatus pkgWDMWrapperCallSSMain(uint32_t reason)
{
    logPackageEvent(reason);
    tStatus result = gLibModuleInfo.moduleMain(reason);
    if (result < 0) {
        _kvlLogEvent("ssKernelExportDriver", ".\\source\\package\\windows\\clientPkgExportDriver:97 - ", 10, "",
                     "ssMain(%d) of %s failed with status %d\n", static_cast<int32_t>(reason),
                     gLibModuleInfo.moduleName, static_cast<int32_t>(result));
    }
    return result;
}

extern "C" void pkgSetLegacyWrapperLoadState(uint32_t state)
{
    ModulePackageRecord* record = gLibModuleInfo.packageRecord;
    record->legacyWrapperLoadState = state;
    if (state == 0) {
        record->legacyWord1 = 0;
        record->legacyWord2 = 0;
    }
}
