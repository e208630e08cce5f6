// Reading an open file, and asking for or changing its size and position.
// Every open file is synchronous: reads without an offset follow the file's
// position, and every successful read moves it.
#include <algorithm>
#include <cstring>
#include <string>

#include "fileWorld.h"
#include "kernelHandles.h"
#include "kernelLock.h"

namespace sim::kernel {
namespace {

constexpr uint32_t kAllocationUnit = 4096;

// The documented "use the file position" offset of a synchronous file.
bool isUseFilePosition(const LARGE_INTEGER& offset)
{
    return offset.u.HighPart == -1 && offset.u.LowPart == 0xFFFFFFFEu;
}

NTSTATUS injectedReadFailure(FileWorld& world)
{
    uint64_t number = ++world.readCount;
    auto byNumber = world.faults.readsByNumber.find(number);
    if (byNumber != world.faults.readsByNumber.end()) {
        NTSTATUS status = byNumber->second;
        world.faults.readsByNumber.erase(byNumber);
        return status;
    }
    return world.faults.everyRead;
}

void complete(IO_STATUS_BLOCK* ioStatus, NTSTATUS status, uintptr_t information)
{
    ioStatus->Status = status;
    ioStatus->Information = information;
}

NTSTATUS queryStandardInformation(const OpenFile& file, void* information, uint32_t length, uintptr_t& written)
{
    if (length < sizeof(FILE_STANDARD_INFORMATION)) return fileStatus::infoLengthMismatch;
    if (fileWorld().faults.sizeQuery < 0) return fileWorld().faults.sizeQuery;
    NTSTATUS injected = fileWorld().faults.sizeQueries.onCall(file.hostPath);
    if (injected < 0) return injected;
    int64_t size = static_cast<int64_t>(file.bytes.size());
    FILE_STANDARD_INFORMATION standard{};
    standard.AllocationSize.QuadPart = (size + kAllocationUnit - 1) / kAllocationUnit * kAllocationUnit;
    standard.EndOfFile.QuadPart = size;
    standard.NumberOfLinks = 1;
    standard.DeletePending = 0;
    standard.Directory = 0;
    std::memcpy(information, &standard, sizeof standard);
    written = sizeof standard;
    return kStatusSuccess;
}

NTSTATUS queryPosition(const OpenFile& file, void* information, uint32_t length, uintptr_t& written)
{
    if (length < sizeof(FILE_POSITION_INFORMATION)) return fileStatus::infoLengthMismatch;
    FILE_POSITION_INFORMATION position{};
    position.CurrentByteOffset.QuadPart = file.position;
    std::memcpy(information, &position, sizeof position);
    written = sizeof position;
    return kStatusSuccess;
}

NTSTATUS setPosition(OpenFile& file, const void* information, uint32_t length)
{
    if (length < sizeof(FILE_POSITION_INFORMATION)) return fileStatus::infoLengthMismatch;
    if (fileWorld().faults.setPosition < 0) return fileWorld().faults.setPosition;
    FILE_POSITION_INFORMATION position;
    std::memcpy(&position, information, sizeof position);
    if (position.CurrentByteOffset.QuadPart < 0) return fileStatus::invalidParameter;
    file.position = position.CurrentByteOffset.QuadPart; // past the end is allowed; reads there meet the end
    return kStatusSuccess;
}

void logInformationCall(HANDLE handle, bool set, int informationClass, NTSTATUS status)
{
    fileWorld().informationCalls.push_back(FileInformationRecord{handle, set, informationClass, status});
}

} // namespace
} // namespace sim::kernel

extern "C" NTSTATUS ZwReadFile(HANDLE fileHandle, HANDLE event, void* apcRoutine, void* apcContext,
                               IO_STATUS_BLOCK* ioStatus, void* buffer, uint32_t length, LARGE_INTEGER* byteOffset,
                               uint32_t* key)
{
    std::lock_guard<std::recursive_mutex> callLock(sim::kernel::kernelCallLock());
    using namespace sim::kernel;
    OpenFile* file = findOpenFile(fileHandle, "ZwReadFile");
    if (file == nullptr) return fileStatus::invalidHandle;
    if (ioStatus == nullptr || (buffer == nullptr && length > 0)) {
        reportMisuse("ZwReadFile without an I/O status block or a buffer");
        return fileStatus::invalidParameter;
    }
    if (event != nullptr || apcRoutine != nullptr || apcContext != nullptr || key != nullptr) {
        reportMisuse("ZwReadFile with an event, APC or key, which a synchronous read of the stand-in does not take");
        return fileStatus::invalidParameter;
    }
    int64_t start = file->position;
    if (byteOffset != nullptr && !isUseFilePosition(*byteOffset)) {
        if (byteOffset->QuadPart < 0) {
            reportMisuse("ZwReadFile at negative offset " + std::to_string(byteOffset->QuadPart));
            return fileStatus::invalidParameter;
        }
        start = byteOffset->QuadPart;
    }

    FileWorld& world = fileWorld();
    NTSTATUS status = injectedReadFailure(world);
    uint32_t count = 0;
    int64_t size = static_cast<int64_t>(file->bytes.size());
    if (status < 0) {
        // The position stays where it was.
    } else if (length > 0 && start >= size) {
        status = fileStatus::endOfFile;
    } else {
        count = static_cast<uint32_t>(std::min<int64_t>(length, size - std::min(start, size)));
        if (count > 0) std::memcpy(buffer, file->bytes.data() + start, count);
        file->position = start + count;
    }
    complete(ioStatus, status, count);
    world.reads.push_back(FileReadRecord{fileHandle, length, start, count, status});
    return status;
}

extern "C" NTSTATUS ZwQueryInformationFile(HANDLE fileHandle, IO_STATUS_BLOCK* ioStatus, void* information,
                                           uint32_t length, int informationClass)
{
    std::lock_guard<std::recursive_mutex> callLock(sim::kernel::kernelCallLock());
    using namespace sim::kernel;
    OpenFile* file = findOpenFile(fileHandle, "ZwQueryInformationFile");
    if (file == nullptr) return fileStatus::invalidHandle;
    if (ioStatus == nullptr || information == nullptr) {
        reportMisuse("ZwQueryInformationFile without an I/O status block or a buffer");
        return fileStatus::invalidParameter;
    }
    uintptr_t written = 0;
    NTSTATUS status = fileStatus::invalidInfoClass;
    if (informationClass == kFileStandardInformation)
        status = queryStandardInformation(*file, information, length, written);
    if (informationClass == kFilePositionInformation) status = queryPosition(*file, information, length, written);
    complete(ioStatus, status, written);
    logInformationCall(fileHandle, false, informationClass, status);
    return status;
}

extern "C" NTSTATUS ZwSetInformationFile(HANDLE fileHandle, IO_STATUS_BLOCK* ioStatus, void* information,
                                         uint32_t length, int informationClass)
{
    std::lock_guard<std::recursive_mutex> callLock(sim::kernel::kernelCallLock());
    using namespace sim::kernel;
    OpenFile* file = findOpenFile(fileHandle, "ZwSetInformationFile");
    if (file == nullptr) return fileStatus::invalidHandle;
    if (ioStatus == nullptr || information == nullptr) {
        reportMisuse("ZwSetInformationFile without an I/O status block or a buffer");
        return fileStatus::invalidParameter;
    }
    NTSTATUS status = fileStatus::invalidInfoClass;
    if (informationClass == kFilePositionInformation) status = setPosition(*file, information, length);
    complete(ioStatus, status, 0);
    logInformationCall(fileHandle, true, informationClass, status);
    return status;
}
