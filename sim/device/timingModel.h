// Durations of the loader's requests on a virtual clock, so that an update's
// length can be told for a bus speed without waiting for it.
#pragma once

#include <chrono>
#include <cstdint>

namespace sim {

struct TimingModel {
    std::chrono::microseconds requestOverhead{0};  // setup and status stages, scheduling
    std::chrono::microseconds perPacket{0};        // one data packet of up to 64 bytes
    std::chrono::microseconds pageErase{0};
    std::chrono::microseconds programPerByte{0};   // the loader's flash programming, per byte written

    static TimingModel fullSpeed();
    static TimingModel highSpeed();

    // How long a request with this data stage takes; erase and program times
    // only count when the device carried the request out.
    std::chrono::microseconds duration(uint32_t dataLength, bool erased, uint32_t programmedBytes) const;
};

}  // namespace sim
