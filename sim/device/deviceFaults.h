// What an emulated device is told to get wrong.
#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <set>
#include <vector>

namespace sim {

// The loader's requests, told apart by bmRequestType and bRequest.
enum class RequestKind { Read, Write, Erase, Restart, Unknown };

// A flash cell that reads back wrong: the stored byte is untouched, only the
// data of memory reads covering it is altered.
struct ReadCorruption {
    uint16_t address = 0;
    uint8_t xorMask = 0;
    std::optional<uint8_t> replacement;  // when set, read back instead of the stored byte
};

// A read whose IN data stage ends early, as a flaky bus or a worn-out loader
// can make it, while the transfer still reports success: only the first
// `bytes` bytes reach the host's buffer, the rest of it stays as it was.
struct ShortRead {
    uint64_t read = 0;  // the device's Nth read request, from 1 over its life
    uint32_t bytes = 0;
};

struct DeviceFaults {
    // What the host reports about the device: attribute reads (1 vendor ID,
    // 2 product ID, 21 the host's own) that fail with a status, and a
    // descriptor read that fails (0: it does not). A failed attribute reads
    // as 0xFFFFFFFF, so attribute 21, read with no status, bars the update.
    std::map<uint32_t, int32_t> attributeFailures;
    int32_t descriptorFailure = 0;

    // Request numbers count every request the device is handed, from 1.
    std::set<uint64_t> stallRequests;
    std::set<RequestKind> stallKinds;
    std::vector<ReadCorruption> readCorruptions;
    std::vector<ShortRead> shortReads;
    // From this request on the device no longer answers and leaves the tree;
    // its flash stays as it was. 0: never.
    uint64_t unplugAtRequest = 0;
    bool refuseOpenStream = false;
    bool refuseAllocateBuffer = false;
};

}  // namespace sim
