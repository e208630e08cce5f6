// ZwCreateFile as the module uses it: open an existing file for reading, by
// its DOS name, sharing it with other readers or with nobody.
#include <cstdio>
#include <fstream>
#include <iterator>
#include <memory>
#include <string>
#include <system_error>

#include "fileDosPath.h"
#include "fileWorld.h"
#include "kernelHandles.h"
#include "kernelLock.h"
#include "kernelUtf16.h"

namespace sim::kernel {
namespace {

constexpr uint32_t kFileReadData = 0x1;
constexpr uint32_t kGenericRead = 0x80000000u;
// Everything a reader may ask for; any other right would let it change something.
constexpr uint32_t kReadingRights = kFileReadData | 0x8 /* FILE_READ_EA */ | 0x80 /* FILE_READ_ATTRIBUTES */ |
                                    0x20000 /* READ_CONTROL */ | 0x100000 /* SYNCHRONIZE */ | kGenericRead;
constexpr uint32_t kAllShareModes = 0x7; // read, write, delete
// Reads without an offset need a synchronous file; directories cannot be read.
constexpr uint32_t kRequiredOptions = kFileNonDirectoryFile | kFileSynchronousIoNonalert;
constexpr uint32_t kAcceptedOptions = kRequiredOptions | kFileSequentialOnly;

NTSTATUS misuse(NTSTATUS status, const std::string& what)
{
    reportMisuse("ZwCreateFile: " + what);
    return status;
}

std::string hex(uint32_t value)
{
    char text[16];
    std::snprintf(text, sizeof text, "0x%X", value);
    return text;
}

NTSTATUS readObjectName(const OBJECT_ATTRIBUTES* attributes, std::u16string& name)
{
    if (attributes == nullptr) return misuse(fileStatus::invalidParameter, "no object attributes");
    if (attributes->Length != sizeof(OBJECT_ATTRIBUTES))
        return misuse(fileStatus::invalidParameter,
                      "object attributes of length " + std::to_string(attributes->Length));
    if (attributes->RootDirectory != nullptr)
        return misuse(fileStatus::invalidParameter, "a root directory, which the stand-in does not resolve");
    // A handle without OBJ_KERNEL_HANDLE belongs to whatever process the
    // calling thread runs in, where user mode can reach it.
    if (attributes->Attributes != (kObjCaseInsensitive | kObjKernelHandle))
        return misuse(fileStatus::invalidParameter, "object attributes flags " + hex(attributes->Attributes) +
                                                        ", not OBJ_CASE_INSENSITIVE | OBJ_KERNEL_HANDLE (0x240)");
    if (attributes->SecurityDescriptor != nullptr || attributes->SecurityQualityOfService != nullptr)
        return misuse(fileStatus::invalidParameter, "a security descriptor or quality of service on an open");
    const UNICODE_STRING* objectName = attributes->ObjectName;
    if (objectName == nullptr) return misuse(fileStatus::invalidParameter, "no object name");
    if (objectName->Length % 2 != 0 || objectName->Length > objectName->MaximumLength ||
        (objectName->Buffer == nullptr && objectName->Length > 0))
        return misuse(fileStatus::objectNameInvalid, "a malformed counted name");
    name.assign(objectName->Buffer, objectName->Length / sizeof(WCHAR));
    return kStatusSuccess;
}

NTSTATUS checkRequest(uint32_t desiredAccess, uint32_t shareAccess, uint32_t disposition, uint32_t options,
                      const void* eaBuffer, uint32_t eaLength)
{
    if ((desiredAccess & ~kReadingRights) != 0 || (desiredAccess & (kFileReadData | kGenericRead)) == 0)
        return misuse(fileStatus::accessDenied, "desired access " + hex(desiredAccess) + " is not read-only access");
    if (disposition != kFileOpen)
        return misuse(fileStatus::invalidParameter, "disposition " + std::to_string(disposition) + ", not FILE_OPEN");
    if ((options & kRequiredOptions) != kRequiredOptions || (options & ~kAcceptedOptions) != 0)
        return misuse(fileStatus::invalidParameter, "create options " + hex(options));
    if ((shareAccess & ~kAllShareModes) != 0)
        return misuse(fileStatus::invalidParameter, "share access " + hex(shareAccess));
    if (eaBuffer != nullptr || eaLength != 0) return misuse(fileStatus::invalidParameter, "extended attributes");
    return kStatusSuccess;
}

// Every opener here reads, so two opens conflict unless both share reading.
bool conflictsWithOpenFiles(const FileWorld& world, const std::filesystem::path& file, bool sharesRead)
{
    for (const auto& held : world.heldElsewhere)
        if (held.second == file) return true;
    for (const auto& open : world.open)
        if (open.second.hostPath == file && !(sharesRead && open.second.sharesRead)) return true;
    return false;
}

NTSTATUS takeSnapshot(const std::filesystem::path& file, std::vector<uint8_t>& bytes)
{
    std::ifstream stream(file, std::ios::binary | std::ios::ate);
    if (!stream) return fileStatus::accessDenied;
    // One read of the whole file: images are read at every update.
    std::streamoff size = stream.tellg();
    if (size < 0) return fileStatus::accessDenied;
    bytes.resize(static_cast<size_t>(size));
    stream.seekg(0);
    stream.read(reinterpret_cast<char*>(bytes.data()), size);
    return stream.gcount() == size ? kStatusSuccess : fileStatus::accessDenied;
}

NTSTATUS openResolvedFile(const std::u16string& name, uint32_t shareAccess, FileOpenRecord& record)
{
    FileWorld& world = fileWorld();
    DosPathResolution resolution = resolveDosPath(name, world.drives);
    NTSTATUS injected = world.faults.opens.onCall(resolution.status < 0 ? std::filesystem::path() : resolution.hostPath);
    if (injected < 0) return injected;
    if (resolution.status < 0) return resolution.status;
    record.hostPath = resolution.hostPath;
    if (resolution.isDirectory) return fileStatus::fileIsADirectory;
    std::error_code error;
    if (!std::filesystem::is_regular_file(resolution.hostPath, error))
        return fileStatus::accessDenied; // a device or pipe
    bool sharesRead = (shareAccess & kFileShareRead) != 0;
    if (conflictsWithOpenFiles(world, resolution.hostPath, sharesRead)) return fileStatus::sharingViolation;

    OpenFile file;
    file.hostPath = resolution.hostPath;
    file.sharesRead = sharesRead;
    NTSTATUS status = takeSnapshot(resolution.hostPath, file.bytes);
    if (status < 0) return status;

    // The handle's value is known only once the table hands it out.
    auto key = std::make_shared<intptr_t>(0);
    HANDLE handle = openHandle(
        HandleKind::file, [key] { fileWorld().open.erase(*key); },
        "file " + record.dosPath + " (" + resolution.hostPath.string() + ")");
    *key = reinterpret_cast<intptr_t>(handle);
    world.open[*key] = std::move(file);
    record.handle = handle;
    return kStatusSuccess;
}

} // namespace
} // namespace sim::kernel

extern "C" NTSTATUS ZwCreateFile(HANDLE* fileHandle, uint32_t desiredAccess, OBJECT_ATTRIBUTES* objectAttributes,
                                 IO_STATUS_BLOCK* ioStatus, LARGE_INTEGER* /*allocationSize: unused by an open*/,
                                 uint32_t /*fileAttributes: unused by an open*/, uint32_t shareAccess,
                                 uint32_t createDisposition, uint32_t createOptions, void* eaBuffer, uint32_t eaLength)
{
    std::lock_guard<std::recursive_mutex> callLock(sim::kernel::kernelCallLock());
    using namespace sim::kernel;
    if (fileHandle == nullptr || ioStatus == nullptr)
        return misuse(fileStatus::invalidParameter, "no handle or I/O status block to fill");

    FileOpenRecord record;
    std::u16string name;
    NTSTATUS status = readObjectName(objectAttributes, name);
    record.dosPath = toUtf8(name);
    if (status >= 0)
        status = checkRequest(desiredAccess, shareAccess, createDisposition, createOptions, eaBuffer, eaLength);
    if (status >= 0) status = openResolvedFile(name, shareAccess, record);

    // The handle is written only when there is one.
    if (status >= 0) *fileHandle = record.handle;
    ioStatus->Status = status;
    ioStatus->Information = status >= 0 ? fileStatus::fileOpened : 0;
    record.status = status;
    fileWorld().opens.push_back(std::move(record));
    return status;
}
