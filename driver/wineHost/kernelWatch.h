// The module's kernel calls go to Wine's own ntoskrnl.exe. The harness only
// watches them: it puts a forwarding function into the module's import table
// for the calls the lab reports (key creation, value queries, file opens,
// closes), tells the lab what Wine answered, and counts the handles left open.
#pragma once

#include <windows.h>

#include <string>
#include <vector>

namespace winehost {

// Kernel failures a scenario injects. Wine's kernel has no such controls, so
// the watching function answers with the status in its place, exactly where
// the lab's kernel stand-in would.
struct KernelFaults {
    struct KeyFault {
        std::wstring keyPath;    // as the module names it; compared ignoring case
        std::wstring valueName;  // empty with !query
        bool query = false;      // the value's query fails; otherwise the key's creation
        LONG status = 0;
        uint64_t number = 0;  // 0: every call; N: only the Nth call of that key or value
        uint64_t seen = 0;    // calls of that key or value so far
    };
    std::vector<KeyFault> keys;
    LONG everyRead = 0;
    std::vector<std::pair<unsigned, LONG>> readNumbers;  // the Nth read on an open file, from 1
    LONG sizeQuery = 0;    // FileStandardInformation queries
    LONG setPosition = 0;  // FilePositionInformation changes
    // The Nth open or size query (0: every one) of one file, or of any file
    // when no file is named; each counts its own calls.
    struct FileCallFault {
        unsigned long long number = 0;
        LONG status = 0;
        std::wstring file;  // a DOS path, "C:\dir\file"; compared ignoring case and slash direction
        unsigned long long seen = 0;
    };
    std::vector<FileCallFault> opens;
    std::vector<FileCallFault> sizeQueries;
};
void setKernelFaults(const KernelFaults& faults);

// Patches the image's import table; false when an import is missing.
bool watchKernelCalls(HMODULE image, std::string& problem);
// Kernel handles the module holds now, described.
std::vector<std::string> openKernelHandles();
// Keys the module's ZwCreateKey created, as HKLM-relative names, oldest first.
std::vector<std::wstring> keysCreatedByModule();

}  // namespace winehost
