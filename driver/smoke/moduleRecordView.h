// Reads the module's registration records as the host would, apart from the
// harness's Win32 code: the kernel's declarations and <windows.h> clash.
#pragma once

#include <cstdint>
#include <string>

// `moduleInfo` is the _tLibModuleInfo the module registered.
std::string registeredModuleName(const void* moduleInfo);
std::u16string registeredRegistryPath(const void* moduleInfo);
uint32_t registeredWdmLoadState(const void* moduleInfo);
const uint8_t* registeredModuleGuid(const void* moduleInfo);
