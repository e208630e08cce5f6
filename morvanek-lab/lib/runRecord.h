// Everything a run showed: steps and their results, the host's log, each
// device's trace and flash, what was left behind. Taken while the world still
// stands, so that reports and expectations need nothing else.
#pragma once

#include <chrono>
#include <cstdint>
#include <filesystem>
#include <optional>
#include <string>
#include <vector>

#include "scenario.h"
#include "sim/host/simHost.h"
#include "sim/kernel/fileSim.h"
#include "sim/kernel/registrySim.h"

namespace lab {

struct StepRecord {
    StepPlan plan;
    std::string title;  // "load \Registry\...", "start through the module main"
    std::optional<int64_t> result;
    std::optional<int32_t> status;
    std::optional<std::string> guid;
    std::string resultText;  // as shown to people
    std::string problem;     // the step could not be taken (an export missing, a device already gone)
};

// Whose work a log line or a file open was: the device that made the last
// request before it, and which of that device's updates.
struct Owner {
    int device = -1;
    int update = -1;
};

struct LogRecord {
    sim::LogEntry entry;
    Owner owner;
};

struct FileOpenSeen {
    sim::kernel::FileOpenRecord open;
    Owner owner;
    uintmax_t size = 0;  // of the host file, when it resolved
};

// A write the loader acknowledged whose bytes are not what the flash holds
// right after it: flash programming can only clear bits.
struct WriteNotTaken {
    uint64_t sequence = 0;
    int update = 0;
    uint16_t address = 0;
    std::vector<uint8_t> written;
    std::vector<uint8_t> stored;
};

struct DeviceRecord {
    std::string name;
    sim::EmulatedDeviceOptions options;
    std::string timingName;
    const sim::LoaderFlashLayout* layout = nullptr;
    std::vector<uint8_t> flashBefore;
    std::vector<uint8_t> flashAfter;
    std::vector<sim::RequestRecord> trace;
    std::vector<int> updateOf;  // per trace entry: the update (enumeration in loader mode) it belongs to
    int updates = 0;
    std::vector<WriteNotTaken> writesNotTaken;
    std::string mode;  // "loader", "product", "unplugged"
    uint16_t enumeratedVendorId = 0;
    uint16_t enumeratedProductId = 0;
    bool markerInPlace = false;
    std::vector<std::string> notes;
    std::chrono::microseconds elapsed{0};
};

struct Finding {
    std::string device;  // empty: about the run as a whole
    std::string text;
};

struct RunRecord {
    std::vector<StepRecord> steps;
    std::vector<LogRecord> eventLog;
    std::vector<std::string> debugLines;
    std::vector<sim::PackageEvent> packageEvents;
    std::vector<DeviceRecord> devices;
    std::vector<int> requestOrder;  // the device of each request of the run, in the order they were made
    std::vector<FileOpenSeen> fileOpens;
    std::vector<Owner> registryCallOwners;  // beside registryCalls
    std::vector<std::string> createdKeys;
    std::vector<sim::kernel::RegistryCall> registryCalls;
    std::vector<std::string> leftovers;
    std::vector<std::string> misuse;
    size_t liveBlocks = 0;
    size_t liveBytes = 0;
    size_t totalAllocations = 0;
    size_t openHandles = 0;
    size_t liveListeners = 0;
    size_t liveQueries = 0;
    std::vector<Finding> findings;
};

}  // namespace lab
