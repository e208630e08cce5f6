#include "createFileSpy.h"

#include <dlfcn.h>

#include <cstdlib>

#include "sim/host/simHost.h"

namespace create_file_spy {

namespace {

struct Spy {
    std::vector<CreateFileCall> calls;
    size_t refusedCall = 0;  // the call count that is refused; 0: none
    NTSTATUS refusal = 0;
};

Spy& spy()
{
    static Spy instance;
    return instance;
}

using CreateFileFn = NTSTATUS (*)(HANDLE*, uint32_t, OBJECT_ATTRIBUTES*, IO_STATUS_BLOCK*, LARGE_INTEGER*, uint32_t,
                                  uint32_t, uint32_t, uint32_t, void*, uint32_t);

CreateFileFn kernelCreateFile()
{
    static CreateFileFn next = reinterpret_cast<CreateFileFn>(dlsym(RTLD_NEXT, "ZwCreateFile"));
    if (next == nullptr) std::abort();
    return next;
}

}  // namespace

const std::vector<CreateFileCall>& calls()
{
    return spy().calls;
}

void refuseOpen(unsigned nth, NTSTATUS status)
{
    spy().refusedCall = spy().calls.size() + nth;
    spy().refusal = status;
}

void reset()
{
    spy() = Spy{};
}

}  // namespace create_file_spy

extern "C" NTSTATUS ZwCreateFile(HANDLE* fileHandle, uint32_t desiredAccess, OBJECT_ATTRIBUTES* objectAttributes,
                                 IO_STATUS_BLOCK* ioStatus, LARGE_INTEGER* allocationSize, uint32_t fileAttributes,
                                 uint32_t shareAccess, uint32_t createDisposition, uint32_t createOptions,
                                 void* eaBuffer, uint32_t eaLength)
{
    using namespace create_file_spy;
    CreateFileCall call;
    if (objectAttributes != nullptr) {
        const UNICODE_STRING* name = objectAttributes->ObjectName;
        if (name != nullptr && name->Buffer != nullptr) call.name = sim::utf16ToUtf8(name->Buffer, name->Length / 2);
        call.objectAttributesLength = objectAttributes->Length;
        call.rootDirectory = objectAttributes->RootDirectory != nullptr;
        call.objectAttributes = objectAttributes->Attributes;
        call.securityGiven =
            objectAttributes->SecurityDescriptor != nullptr || objectAttributes->SecurityQualityOfService != nullptr;
    }
    call.desiredAccess = desiredAccess;
    call.allocationSizeGiven = allocationSize != nullptr;
    call.fileAttributes = fileAttributes;
    call.shareAccess = shareAccess;
    call.createDisposition = createDisposition;
    call.createOptions = createOptions;
    call.extendedAttributesGiven = eaBuffer != nullptr || eaLength != 0;
    spy().calls.push_back(call);

    if (spy().refusedCall == spy().calls.size()) return spy().refusal;
    return kernelCreateFile()(fileHandle, desiredAccess, objectAttributes, ioStatus, allocationSize, fileAttributes,
                              shareAccess, createDisposition, createOptions, eaBuffer, eaLength);
}
