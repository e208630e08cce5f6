// Drives an emulated loader request by request, and records the arrivals the
// host delivers.
#pragma once

#include <cstring>
#include <vector>

#include "sim/device/enumeratedDevice.h"
#include "tests/support/worldTest.h"

namespace device_tests {

using DeviceTest = testing_support::WorldTest;
constexpr uint8_t kIn = 0xC0;
constexpr uint8_t kOut = 0x40;

class RawLink {
  public:
    explicit RawLink(sim::UsbDeviceSim& device, uint32_t bufferSize = 512) : device_(device)
    {
        nQVKORD100::tControlStreamParameterUSB parameter;
        parameter.first = 3;
        parameter.second = 0;
        stream = device.openStream(&parameter, openStatus);
        if (stream != nullptr) buffer = static_cast<uint8_t*>(stream->allocateBuffer(bufferSize, openStatus));
    }
    ~RawLink() { close(); }

    void close()
    {
        tStatus status = 0;
        if (buffer != nullptr) stream->freeBuffer(buffer, status);
        if (stream != nullptr) device_.closeStream(stream, status);
        buffer = nullptr;
        stream = nullptr;
    }

    tStatus send(uint8_t type, uint8_t request, uint16_t value, uint16_t index, uint32_t length, void* data)
    {
        nQVKORD100::tTransferParameterUSBControl parameter;
        parameter.data = data;
        parameter.length = length;
        parameter.bmRequestType = type;
        parameter.bRequest = request;
        parameter.wValue = value;
        parameter.wIndex = index;
        tStatus status = stream == nullptr ? sim::kHostFailure : 0;
        if (stream != nullptr) stream->transfer(&parameter, status);
        return status;
    }
    std::vector<uint8_t> read(uint16_t address, uint32_t length)
    {
        send(kIn, 0xB0, 0, address, length, buffer);
        return std::vector<uint8_t>(buffer, buffer + length);
    }
    tStatus write(uint16_t address, const std::vector<uint8_t>& bytes)
    {
        std::memcpy(buffer, bytes.data(), bytes.size());
        return send(kOut, 0xB0, 0, address, static_cast<uint32_t>(bytes.size()), buffer);
    }
    tStatus erase(uint16_t page) { return send(kOut, 0xB9, page, 0, 0, nullptr); }
    tStatus restart() { return send(kOut, 0xBA, 0, 0, 0, nullptr); }

    tStatus openStatus = 0;
    ControlStream* stream = nullptr;
    uint8_t* buffer = nullptr;

  private:
    sim::UsbDeviceSim& device_;
};

// Records the arrivals the host delivers, for as long as it lives.
class ArrivalLog : public DeviceEventCallback {
  public:
    explicit ArrivalLog(sim::DeviceTreeSim& tree) : tree_(tree), query_(tree.createQuery())
    {
        tStatus status = 0;
        tree.addListener(&record_, status);
    }
    ~ArrivalLog()
    {
        tree_.removeListener(&record_, nullptr);
        tree_.releaseQuery(&query_);
    }
    void onDeviceEvent(UsbDevice* device) override { arrivals.push_back(static_cast<sim::UsbDeviceSim*>(device)); }

    std::vector<sim::UsbDeviceSim*> arrivals;

  private:
    sim::DeviceTreeSim& tree_;
    DeviceQuery* query_;
    ListenerRecord record_{kListenerArrival, 1, 0, query_->getId(), {}, this};
};

}  // namespace device_tests
