// The records through which a module introduces itself to the host. The host
// reads them by layout.
#pragma once

#include <stddef.h>
#include <stdint.h>

#include "../kernel/ntkernel.h"
#include "karvelk.h"

struct ModuleDescriptor {
    uint32_t value;  // 5
    const char* moduleName;
    uint8_t guid[16];
};
static_assert(sizeof(ModuleDescriptor) == 32, "module descriptor is 32 bytes");
static_assert(offsetof(ModuleDescriptor, moduleName) == 8, "name at 8");
static_assert(offsetof(ModuleDescriptor, guid) == 16, "GUID at 16");

struct ModulePackageRecord {
    uint32_t version;  // 1
    const ModuleDescriptor* descriptor;
    uint64_t unused0;
    UNICODE_STRING registryPath;
    WCHAR registryPathBuffer[260];
    uint32_t unused1;
    uint32_t wdmWrapperLoadState;
    uint32_t legacyWrapperLoadState;
    uint32_t legacyWord1;  // cleared with a zero legacy state
    uint32_t legacyWord2;  // cleared with a zero legacy state
};
static_assert(offsetof(ModulePackageRecord, descriptor) == 8, "descriptor at 8");
static_assert(offsetof(ModulePackageRecord, unused0) == 16, "unused word at 16");
static_assert(offsetof(ModulePackageRecord, registryPath) == 24, "registry path at 24");
static_assert(offsetof(ModulePackageRecord, registryPath.MaximumLength) == 26, "maximum length at 26");
static_assert(offsetof(ModulePackageRecord, registryPath.Buffer) == 32, "path buffer pointer at 32");
static_assert(offsetof(ModulePackageRecord, registryPathBuffer) == 40, "path buffer at 40");
static_assert(offsetof(ModulePackageRecord, unused1) == 560, "unused word at 560");
static_assert(offsetof(ModulePackageRecord, wdmWrapperLoadState) == 564, "WDM load state at 564");
static_assert(offsetof(ModulePackageRecord, legacyWrapperLoadState) == 568, "legacy load state at 568");
static_assert(offsetof(ModulePackageRecord, legacyWord1) == 572, "legacy word at 572");
static_assert(offsetof(ModulePackageRecord, legacyWord2) == 576, "legacy word at 576");
static_assert(sizeof(ModulePackageRecord) == 584, "package record is 584 bytes");

struct _tLibModuleInfo {
    ModulePackageRecord* packageRecord;
    const char* moduleName;  // null until registration
    tModuleMain moduleMain;
    const char* firstName;
    const char* secondName;
};
static_assert(sizeof(_tLibModuleInfo) == 40, "module info is 40 bytes");
static_assert(offsetof(_tLibModuleInfo, moduleName) == 8, "name at 8");
static_assert(offsetof(_tLibModuleInfo, moduleMain) == 16, "module main at 16");
static_assert(offsetof(_tLibModuleInfo, firstName) == 24, "first name at 24");
static_assert(offsetof(_tLibModuleInfo, secondName) == 32, "second name at 32");
