#include "moduleImage.h"

#include <dlfcn.h>

#include <stdexcept>

#include "../host/simHost.h"

namespace sim {

// Itanium names of the version exports; the driver exports their MSVC forms.
constexpr const char* kGetCurrentVersion = "_ZN12nMORVANE_1_417getCurrentVersionERi";
constexpr const char* kGetOldestCompatibleVersion = "_ZN12nMORVANE_1_426getOldestCompatibleVersionERi";
constexpr const char* kCompareVersion = "_ZN12nMORVANE_1_414compareVersionERK10tSSVersionS2_RiPKc";
constexpr const char* kCompareFirmwareVersion = "_ZN12nMORVANE_1_222compareFirmwareVersionE10tSSVersiontRi";

std::string ModuleImage::defaultPath()
{
#ifdef MORVANEK_MODULE_PATH
    return MORVANEK_MODULE_PATH;
#else
    return "libmorvanek.so";
#endif
}

ModuleImage::ModuleImage(const std::string& path)
{
    // dlopen of an empty name gives the program itself, not a module.
    if (path.empty()) throw std::runtime_error("cannot load the module: no path given");
    handle_ = dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL);
    if (handle_ == nullptr) throw std::runtime_error(std::string("cannot load the module: ") + dlerror());
    dllInitialize = reinterpret_cast<DllInitializeFn>(resolve("DllInitialize"));
    dllUnload = reinterpret_cast<DllUnloadFn>(resolve("DllUnload"));
    setWdmLoadStateAndGetGuid = reinterpret_cast<SetWdmLoadStateFn>(resolve("pkgSetWDMWrapperLoadStateAndGetGUID"));
    callSsMain = reinterpret_cast<CallSsMainFn>(resolve("pkgWDMWrapperCallSSMain"));
    setLegacyLoadState = reinterpret_cast<SetLegacyLoadStateFn>(resolve("pkgSetLegacyWrapperLoadState"));
    getCurrentVersion = reinterpret_cast<GetVersionFn>(resolve(kGetCurrentVersion));
    getOldestCompatibleVersion = reinterpret_cast<GetVersionFn>(resolve(kGetOldestCompatibleVersion));
    compareVersion = reinterpret_cast<CompareVersionFn>(resolve(kCompareVersion));
    compareFirmwareVersion = reinterpret_cast<CompareFirmwareVersionFn>(resolve(kCompareFirmwareVersion));
    if (!dllInitialize || !dllUnload) {
        dlclose(handle_);
        throw std::runtime_error("the module does not export DllInitialize and DllUnload");
    }
}

ModuleImage::~ModuleImage()
{
    if (handle_ != nullptr) dlclose(handle_);
}

void* ModuleImage::resolve(const char* name) const
{
    return handle_ != nullptr ? dlsym(handle_, name) : nullptr;
}

NTSTATUS ModuleImage::initialize(const std::string& registryPath)
{
    std::u16string path = utf8ToUtf16(registryPath);
    UNICODE_STRING counted;
    counted.Buffer = path.data();
    counted.Length = static_cast<uint16_t>(path.size() * 2);
    counted.MaximumLength = counted.Length;
    return dllInitialize(&counted);
}

}  // namespace sim
