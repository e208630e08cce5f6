// Failures injected into one kind of file call (opens, size queries): on the
// Nth call of any file, on the Nth call of one file, or on every call of one
// file. Numbers count from the moment the fault is set, from 1.
#pragma once

#include <cstdint>
#include <filesystem>
#include <map>
#include <vector>

#include "../../kernel/ntkernel.h"

namespace sim::kernel {

class FileCallFaults {
public:
    // nth 0: every call. An empty file: calls of any file.
    void add(uint64_t nth, NTSTATUS status, const std::filesystem::path& file);
    // Counts one call on `file` (canonical; empty when the name did not
    // resolve) and says how it must fail: 0 when it must not. A numbered
    // fault is spent once it has fired.
    NTSTATUS onCall(const std::filesystem::path& file);

private:
    struct Fault {
        uint64_t at = 0;  // the call count that fails; 0: every call
        std::filesystem::path file;
        NTSTATUS status = 0;
    };
    uint64_t callsOf(const std::filesystem::path& file) const;

    std::vector<Fault> faults_;
    uint64_t calls_ = 0;
    std::map<std::filesystem::path, uint64_t> callsByFile_;
};

}  // namespace sim::kernel
