// The file stand-in's controls: which folder each drive letter stands for,
// files held open by "another program", failures on request, and a log of
// what the module did with its files.
//
// The module's DOS names ("\??\C:\dir\file.bin") are looked up component by
// component in the drive's folder, ignoring ASCII case as Windows does, and a
// name can never reach outside that folder. An open takes a snapshot of the
// file's bytes, so later changes on disk do not show through an open handle.
#pragma once

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <string>
#include <vector>

#include "../../kernel/ntkernel.h"
#include "fileStatus.h"

namespace sim::kernel {

struct FileOpenRecord {
    std::string dosPath;            // the name the module asked for, as UTF-8
    std::filesystem::path hostPath; // what it resolved to; empty when it did not resolve
    NTSTATUS status = 0;
    HANDLE handle = nullptr; // set only when the open succeeded
};

struct FileReadRecord {
    HANDLE handle = nullptr;
    uint32_t length = 0; // asked for
    int64_t offset = 0;  // where the read started
    uint32_t bytesRead = 0;
    NTSTATUS status = 0;
};

// ZwQueryInformationFile and ZwSetInformationFile calls on open files.
struct FileInformationRecord {
    HANDLE handle = nullptr;
    bool set = false; // false: a query
    int informationClass = 0;
    NTSTATUS status = 0;
};

using FileHoldToken = uint64_t;

class FileSystem {
  public:
    // No drives, no holds, no faults, an empty log. Handles are forgotten,
    // not closed: the handle table is reset beside this.
    void reset();

    // The drive letter (either case) stands for the folder, which need not
    // exist yet; it is looked up at each open.
    void mapDrive(char letter, const std::filesystem::path& folder);
    void unmapDrive(char letter);

    // Holds the file open without sharing, as another program would, so that
    // every open of it by the module fails with a sharing violation until
    // released. Holding a file the module has open is allowed.
    FileHoldToken holdOpenElsewhere(const std::filesystem::path& hostFile);
    void releaseHold(FileHoldToken token);

    // Injected failures. A status of 0 switches a fault off. Read numbers
    // count from 1, the next ZwReadFile on a valid handle; a failed read
    // returns the status with nothing read and the position unchanged.
    void failReads(NTSTATUS status);
    void failReadNumber(unsigned nth, NTSTATUS status);
    void failSizeQuery(NTSTATUS status);   // FileStandardInformation queries
    // The Nth open (a well-formed ZwCreateFile) or size query from now fails
    // with the status: counted over every file, or over hostFile's calls only
    // when it is given; nth 0: every call. An injected open failure returns
    // no handle and wins over whatever else the open would meet.
    void failOpenNumber(unsigned nth, NTSTATUS status, const std::filesystem::path& hostFile = {});
    void failSizeQueryNumber(unsigned nth, NTSTATUS status, const std::filesystem::path& hostFile = {});
    void failSetPosition(NTSTATUS status); // FilePositionInformation changes
    void clearFaults();

    const std::vector<FileOpenRecord>& opens() const;
    const std::vector<FileReadRecord>& reads() const;
    const std::vector<FileInformationRecord>& informationCalls() const;

    // Handles the module holds now.
    size_t openFileCount() const;
    // Every file the module opened successfully, once each, in first-open order.
    std::vector<std::filesystem::path> filesOpened() const;
};

FileSystem& files();

} // namespace sim::kernel
