// Loads the module the way the kernel loads an export driver: by file, with
// its exports resolved by name. Every load starts with fresh static state.
#pragma once

#include <cstdint>
#include <string>

#include "../../host/karvelk.h"
#include "../../kernel/ntkernel.h"

namespace sim {

class ModuleImage {
public:
    using DllInitializeFn = NTSTATUS (*)(UNICODE_STRING*);
    using DllUnloadFn = NTSTATUS (*)();
    using SetWdmLoadStateFn = const uint8_t* (*)(uint32_t);
    using CallSsMainFn = tStatus (*)(uint32_t);
    using SetLegacyLoadStateFn = void (*)(uint32_t);
    using GetVersionFn = tSSVersion (*)(tStatus&);
    using CompareVersionFn = void (*)(const tSSVersion&, const tSSVersion&, tStatus&, const char*);
    using CompareFirmwareVersionFn = void (*)(tSSVersion, uint16_t, tStatus&);

    // The module built alongside this program, unless a path is given.
    explicit ModuleImage(const std::string& path = defaultPath());
    virtual ~ModuleImage();
    ModuleImage(const ModuleImage&) = delete;
    ModuleImage& operator=(const ModuleImage&) = delete;

    static std::string defaultPath();

    // Null when the module does not export the name.
    void* resolve(const char* name) const;

    // Calls DllInitialize with the registry path given as UTF-8.
    NTSTATUS initialize(const std::string& registryPath);

    DllInitializeFn dllInitialize = nullptr;
    DllUnloadFn dllUnload = nullptr;
    SetWdmLoadStateFn setWdmLoadStateAndGetGuid = nullptr;
    CallSsMainFn callSsMain = nullptr;
    SetLegacyLoadStateFn setLegacyLoadState = nullptr;
    GetVersionFn getCurrentVersion = nullptr;
    GetVersionFn getOldestCompatibleVersion = nullptr;
    CompareVersionFn compareVersion = nullptr;
    CompareFirmwareVersionFn compareFirmwareVersion = nullptr;

protected:
    // For a module loaded elsewhere (the lab's Windows engine): no library is
    // opened, and the subclass sets the function pointers.
    struct LoadedElsewhere {};
    explicit ModuleImage(LoadedElsewhere) {}

private:
    void* handle_ = nullptr;
};

}  // namespace sim
