#include "fileCallFaults.h"

#include <algorithm>
#include <system_error>

namespace sim::kernel {

namespace {

// Sharing is decided on canonical paths; so are file faults.
std::filesystem::path identityOf(const std::filesystem::path& file)
{
    if (file.empty()) return file;
    std::error_code error;
    std::filesystem::path canonical = std::filesystem::weakly_canonical(file, error);
    return error ? file : canonical;
}

}  // namespace

uint64_t FileCallFaults::callsOf(const std::filesystem::path& file) const
{
    if (file.empty()) return calls_;
    auto it = callsByFile_.find(file);
    return it == callsByFile_.end() ? 0 : it->second;
}

void FileCallFaults::add(uint64_t nth, NTSTATUS status, const std::filesystem::path& file)
{
    Fault fault;
    fault.file = identityOf(file);
    fault.at = nth == 0 ? 0 : callsOf(fault.file) + nth;
    fault.status = status;
    faults_.push_back(fault);
}

NTSTATUS FileCallFaults::onCall(const std::filesystem::path& file)
{
    ++calls_;
    if (!file.empty()) ++callsByFile_[file];
    for (auto it = faults_.begin(); it != faults_.end(); ++it) {
        if (!it->file.empty() && it->file != file) continue;
        if (it->at != 0 && it->at != callsOf(it->file)) continue;
        NTSTATUS status = it->status;
        if (it->at != 0) faults_.erase(it);
        return status;
    }
    return 0;
}

}  // namespace sim::kernel
