// The run's requests laid out on one modelled bus clock, device after device
// in the order the module served them, each tagged with the part of the
// update it belongs to. What the timeline pictures and the summary's bus time
// are drawn from.
#pragma once

#include <chrono>
#include <cstddef>
#include <vector>

#include "runRecord.h"

namespace lab {

enum class BusPhase { identity, erase, program, verify, marker, restart, other };
constexpr int kBusPhases = 7;
const char* busPhaseName(BusPhase phase);

struct TimedRequest {
    int device = 0;
    size_t traceIndex = 0;  // into the device's trace
    int update = 0;         // the device's update, from 0
    BusPhase phase = BusPhase::other;
    bool failed = false;
    std::chrono::microseconds start{0};
    std::chrono::microseconds duration{0};
};

struct BusTimeline {
    std::vector<TimedRequest> requests;  // in the order the run made them
    std::chrono::microseconds total{0};  // the whole run's bus time
};

// A device is modelled on the bus its scenario gives it, or on a full-speed
// bus when it gives none.
const sim::TimingModel& busModelOf(const DeviceRecord& device);
const char* busModelName(const DeviceRecord& device);

// The phase of each of a device's requests, in trace order.
std::vector<BusPhase> requestPhases(const DeviceRecord& device);

BusTimeline layOutBusTimeline(const RunRecord& record);

}  // namespace lab
