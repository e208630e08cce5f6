// The file stand-in's state, shared by its controls and its kernel calls.
#pragma once

#include <cstdint>
#include <filesystem>
#include <map>
#include <vector>

#include "fileCallFaults.h"
#include "fileSim.h"

namespace sim::kernel {

struct OpenFile {
    std::filesystem::path hostPath; // canonical: the identity used for sharing
    std::vector<uint8_t> bytes;     // as they were at open time
    int64_t position = 0;
    bool sharesRead = false;
};

struct FileFaults {
    NTSTATUS everyRead = 0;
    std::map<uint64_t, NTSTATUS> readsByNumber; // by the read count that fails
    NTSTATUS sizeQuery = 0;
    NTSTATUS setPosition = 0;
    FileCallFaults opens;       // ZwCreateFile calls with a well-formed request
    FileCallFaults sizeQueries; // FileStandardInformation queries
};

struct FileWorld {
    std::map<char, std::filesystem::path> drives; // upper-case letters
    std::map<intptr_t, OpenFile> open;            // by handle value
    std::map<FileHoldToken, std::filesystem::path> heldElsewhere;
    FileHoldToken nextHold = 1;
    FileFaults faults;
    uint64_t readCount = 0; // ZwReadFile calls on valid handles so far
    std::vector<FileOpenRecord> opens;
    std::vector<FileReadRecord> reads;
    std::vector<FileInformationRecord> informationCalls;
};

FileWorld& fileWorld();

// The open file behind a handle, or null after a misuse report.
OpenFile* findOpenFile(HANDLE handle, const char* call);

} // namespace sim::kernel
