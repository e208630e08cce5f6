// What the loader did to one device, update by update, read from its request
// trace: identity writes, image, pages erased, blocks written and verified,
// marker, restart, and how long it would take on each bus speed.
#pragma once

#include <chrono>
#include <optional>
#include <string>
#include <vector>

#include "runRecord.h"

namespace lab {

struct IdentityWrite {
    uint16_t address = 0;
    std::string field;  // "product ID", "product ID copy", "vendor ID", or empty for another place
    std::vector<uint8_t> bytes;
    bool took = true;
};

struct UpdateStory {
    int index = 0;
    size_t requests = 0;
    size_t failedRequests = 0;
    std::vector<IdentityWrite> identityWrites;
    std::vector<std::string> registryValuesRead;  // "FVTPID", "Driver", ... as the update queried them
    std::vector<std::string> imagesOpened;  // DOS paths the update opened, in order, once each
    std::optional<uintmax_t> imageSize;
    std::vector<std::string> opensRefused;  // "path (status 0x...)"
    std::vector<uint16_t> pagesErased;
    size_t blocksWritten = 0;
    size_t blocksVerified = 0;
    std::vector<std::string> readBackDifferences;  // "block 1 at 0x0400 read back 0x12 at 0x0410 for 0x13"
    bool markerWritten = false;
    bool markerTook = false;
    bool restarted = false;
    std::vector<std::string> logLines;
    std::chrono::microseconds fullSpeed{0};
    std::chrono::microseconds highSpeed{0};
};

// How long a request took on a bus model; one that never reached the device took nothing.
std::chrono::microseconds requestDuration(const sim::TimingModel& model, const sim::RequestRecord& request);

// A request in the short form scenarios use: "read 0x37F8 2", "erase 1", "restart", "... failed".
std::string requestText(const sim::RequestRecord& request);

std::vector<UpdateStory> tellDeviceStory(const RunRecord& record, int device);

// "1-2, 5"
std::string pageRanges(const std::vector<uint16_t>& pages);
std::string hexBytesText(const std::vector<uint8_t>& bytes);
std::string durationText(std::chrono::microseconds duration);
// The identity block as it stands in a flash image, or nullopt without a layout.
std::optional<sim::IdentityValues> identityIn(const DeviceRecord& device, const std::vector<uint8_t>& flash);
std::string identityText(const sim::IdentityValues& identity);

}  // namespace lab
