// What the device saw: one record per request it was handed.
#pragma once

#include <chrono>
#include <cstdint>
#include <string>
#include <vector>

#include "../../host/karvelkStatus.h"
#include "deviceFaults.h"

namespace sim {

struct RequestRecord {
    uint64_t sequence = 0;  // from 1, over the device's whole life
    uint64_t enumeration = 0;  // which of the device's enumerations it came through, from 1
    RequestKind kind = RequestKind::Unknown;
    uint8_t bmRequestType = 0;
    uint8_t bRequest = 0;
    uint16_t wValue = 0;
    uint16_t wIndex = 0;
    uint32_t length = 0;
    bool dataPointerGiven = false;
    tStatus outcome = 0;        // 0, or the failure the transfer reported
    std::vector<uint8_t> data;  // the data stage as it crossed the bus; empty when refused
    std::chrono::microseconds finishedAt{0};  // on the device's virtual clock
};

const char* requestKindName(RequestKind kind);
// One line, e.g. "#12 write 40 B0 0000 0200 len 512 ok".
std::string describeRequest(const RequestRecord& record);

}  // namespace sim
