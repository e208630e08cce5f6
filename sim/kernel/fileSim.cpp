#include "fileSim.h"

#include <algorithm>
#include <cctype>
#include <cstdio>
#include <system_error>

#include "fileWorld.h"
#include "kernelHandles.h"

namespace sim::kernel {

FileWorld& fileWorld()
{
    static FileWorld instance;
    return instance;
}

OpenFile* findOpenFile(HANDLE handle, const char* call)
{
    auto& open = fileWorld().open;
    auto it = open.find(reinterpret_cast<intptr_t>(handle));
    // Both must agree: a handle table reset on its own leaves stale entries here.
    if (it != open.end() && findHandle(handle, HandleKind::file) != nullptr) return &it->second;
    char text[96];
    std::snprintf(text, sizeof text, "%s on handle %p, which is not an open file", call, handle);
    reportMisuse(text);
    return nullptr;
}

FileSystem& files()
{
    static FileSystem instance;
    return instance;
}

void FileSystem::reset()
{
    fileWorld() = FileWorld{};
}

void FileSystem::mapDrive(char letter, const std::filesystem::path& folder)
{
    fileWorld().drives[static_cast<char>(std::toupper(static_cast<unsigned char>(letter)))] = folder;
}

void FileSystem::unmapDrive(char letter)
{
    fileWorld().drives.erase(static_cast<char>(std::toupper(static_cast<unsigned char>(letter))));
}

FileHoldToken FileSystem::holdOpenElsewhere(const std::filesystem::path& hostFile)
{
    FileWorld& world = fileWorld();
    std::error_code error;
    std::filesystem::path identity = std::filesystem::weakly_canonical(hostFile, error);
    FileHoldToken token = world.nextHold++;
    world.heldElsewhere[token] = error ? hostFile : identity;
    return token;
}

void FileSystem::releaseHold(FileHoldToken token)
{
    fileWorld().heldElsewhere.erase(token);
}

void FileSystem::failReads(NTSTATUS status)
{
    fileWorld().faults.everyRead = status;
}

void FileSystem::failReadNumber(unsigned nth, NTSTATUS status)
{
    FileWorld& world = fileWorld();
    if (nth == 0) return;
    if (status == 0) {
        world.faults.readsByNumber.erase(world.readCount + nth);
    } else {
        world.faults.readsByNumber[world.readCount + nth] = status;
    }
}

void FileSystem::failSizeQuery(NTSTATUS status)
{
    fileWorld().faults.sizeQuery = status;
}

void FileSystem::failOpenNumber(unsigned nth, NTSTATUS status, const std::filesystem::path& hostFile)
{
    fileWorld().faults.opens.add(nth, status, hostFile);
}

void FileSystem::failSizeQueryNumber(unsigned nth, NTSTATUS status, const std::filesystem::path& hostFile)
{
    fileWorld().faults.sizeQueries.add(nth, status, hostFile);
}

void FileSystem::failSetPosition(NTSTATUS status)
{
    fileWorld().faults.setPosition = status;
}

void FileSystem::clearFaults()
{
    fileWorld().faults = FileFaults{};
}

const std::vector<FileOpenRecord>& FileSystem::opens() const
{
    return fileWorld().opens;
}

const std::vector<FileReadRecord>& FileSystem::reads() const
{
    return fileWorld().reads;
}

const std::vector<FileInformationRecord>& FileSystem::informationCalls() const
{
    return fileWorld().informationCalls;
}

size_t FileSystem::openFileCount() const
{
    return fileWorld().open.size();
}

std::vector<std::filesystem::path> FileSystem::filesOpened() const
{
    std::vector<std::filesystem::path> result;
    for (const FileOpenRecord& record : fileWorld().opens) {
        if (record.status < 0) continue;
        if (std::find(result.begin(), result.end(), record.hostPath) == result.end()) result.push_back(record.hostPath);
    }
    return result;
}

} // namespace sim::kernel
