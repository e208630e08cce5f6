// Built with mingw-w64, so the record layouts are asserted by a third
// compiler here, and read back from a module built by another.
#include "moduleRecordView.h"

#include "../../host/moduleRecords.h"

namespace {

const _tLibModuleInfo& info(const void* moduleInfo)
{
    return *static_cast<const _tLibModuleInfo*>(moduleInfo);
}

}  // namespace

std::string registeredModuleName(const void* moduleInfo)
{
    const char* name = info(moduleInfo).moduleName;
    return name != nullptr ? name : "(null)";
}

std::u16string registeredRegistryPath(const void* moduleInfo)
{
    const UNICODE_STRING& path = info(moduleInfo).packageRecord->registryPath;
    return std::u16string(reinterpret_cast<const char16_t*>(path.Buffer), path.Length / sizeof(WCHAR));
}

uint32_t registeredWdmLoadState(const void* moduleInfo)
{
    return info(moduleInfo).packageRecord->wdmWrapperLoadState;
}

const uint8_t* registeredModuleGuid(const void* moduleInfo)
{
    return info(moduleInfo).packageRecord->descriptor->guid;
}
