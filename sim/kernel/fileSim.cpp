// Placeholder until the file stand-in lands.
#include "../../kernel/ntkernel.h"

extern "C" NTSTATUS ZwCreateFile(HANDLE*, uint32_t, OBJECT_ATTRIBUTES*, IO_STATUS_BLOCK*, LARGE_INTEGER*, uint32_t,
                                 uint32_t, uint32_t, uint32_t, void*, uint32_t)
{
    return kStatusObjectNameNotFound;
}

extern "C" NTSTATUS ZwReadFile(HANDLE, HANDLE, void*, void*, IO_STATUS_BLOCK*, void*, uint32_t, LARGE_INTEGER*,
                               uint32_t*)
{
    return static_cast<NTSTATUS>(0xC0000008u);
}

extern "C" NTSTATUS ZwQueryInformationFile(HANDLE, IO_STATUS_BLOCK*, void*, uint32_t, int)
{
    return static_cast<NTSTATUS>(0xC0000008u);
}

extern "C" NTSTATUS ZwSetInformationFile(HANDLE, IO_STATUS_BLOCK*, void*, uint32_t, int)
{
    return static_cast<NTSTATUS>(0xC0000008u);
}

#include "fileSim.h"

namespace sim::kernel {
void FileSystem::reset() {}
FileSystem& files()
{
    static FileSystem instance;
    return instance;
}
}  // namespace sim::kernel
