// The kinds of fault the sweep injects, by the names its command line and
// reports use.
#pragma once

#include <optional>
#include <string>
#include <vector>

namespace lab {

enum class SweepKind {
    failedRequest,     // a request fails, at each request number
    unplug,            // the device is pulled out at each request number, then plugged in again
    lostStatus,        // a request takes effect but reports failure, at each request number
    readCorruption,    // a cell of each block reads back wrong
    stuckBits,         // a bit of each block does not program
    shortRead,         // the first read-back of each block brings fewer bytes, reported as success
    deadErase,         // each erase reports success and does nothing
    allocation,        // each host allocation fails
    releaseFailure,    // the device's freeBuffer, then its closeStream, report failure
    registryOpen,      // each ZwCreateKey fails
    registryQuery,     // each ZwQueryValueKey fails
    registryOverflow,  // each ZwQueryValueKey reports STATUS_BUFFER_OVERFLOW with the header filled
    fileOpen,          // each ZwCreateFile fails
    fileRead,          // each ZwReadFile fails
    fileShortRead,     // each ZwReadFile brings half of what it was asked for
    fileSizeQuery,     // each size query fails
    imageChange,       // the image changes between the header read and the programming open
};

const char* sweepKindName(SweepKind kind);
std::optional<SweepKind> sweepKindNamed(const std::string& name);
const std::vector<SweepKind>& allSweepKinds();

// "all", "none", or names separated by commas; nullopt names the first unknown one.
struct SweepKindChoice {
    std::vector<SweepKind> kinds;
    std::string unknown;
};
SweepKindChoice chooseSweepKinds(const std::string& text);

}  // namespace lab
