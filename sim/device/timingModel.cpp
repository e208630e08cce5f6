#include "timingModel.h"

namespace sim {

namespace {
constexpr uint32_t kMaxPacket = 64;  // endpoint 0 on full and high speed alike
}

TimingModel TimingModel::fullSpeed()
{
    // A full-speed host completes about one control transfer per 1 ms frame;
    // 64 bytes take some 50 us on the 12 Mbit/s wire.
    TimingModel model;
    model.requestOverhead = std::chrono::microseconds(1000);
    model.perPacket = std::chrono::microseconds(50);
    model.pageErase = std::chrono::microseconds(5000);
    model.programPerByte = std::chrono::microseconds(20);
    return model;
}

TimingModel TimingModel::highSpeed()
{
    // 125 us microframes; setup, data and status stages land in about two.
    TimingModel model;
    model.requestOverhead = std::chrono::microseconds(250);
    model.perPacket = std::chrono::microseconds(2);
    model.pageErase = std::chrono::microseconds(5000);
    model.programPerByte = std::chrono::microseconds(20);
    return model;
}

std::chrono::microseconds TimingModel::duration(uint32_t dataLength, bool erased, uint32_t programmedBytes) const
{
    uint32_t packets = (dataLength + kMaxPacket - 1) / kMaxPacket;
    return requestOverhead + perPacket * packets + (erased ? pageErase : std::chrono::microseconds(0)) +
           programPerByte * programmedBytes;
}

}  // namespace sim
