// The host's view of one enumeration of an emulated device. A restart ends an
// enumeration: its object stays alive, gone, and a new one arrives.
#pragma once

#include <memory>
#include <vector>

#include "physicalDevice.h"

namespace sim {

class EnumeratedDevice : public UsbDeviceSim {
public:
    EnumeratedDevice(std::shared_ptr<PhysicalDevice> hardware, uint32_t vendorId, uint32_t productId);
    ~EnumeratedDevice() override;

    uint32_t getAttribute(uint32_t id, tStatus* status) override;
    void getDescriptor(nQVKORD100::tUSBDeviceDescriptorProxy* proxy, tStatus& status) override;

    PhysicalDevice& hardware() const { return *hardware_; }
    bool gone() const { return gone_; }
    void markGone() { gone_ = true; }

protected:
    std::shared_ptr<PhysicalDevice> hardware_;
    bool gone_ = false;
};

// The device's firmware running: it no longer speaks the loader's protocol,
// so it opens no stream, like any other device.
class ProductDevice : public EnumeratedDevice {
public:
    using EnumeratedDevice::EnumeratedDevice;
};

// The loader: control streams whose requests reach the hardware.
class LoaderModeDevice : public EnumeratedDevice {
public:
    explicit LoaderModeDevice(std::shared_ptr<PhysicalDevice> hardware);
    ~LoaderModeDevice() override;

    ControlStream* openStream(nQVKORD100::tControlStreamParameterUSB* parameter, tStatus& status) override;
    void closeStream(ControlStream* stream, tStatus& status) override;
    size_t openStreams() const override;

    int openStreamCalls = 0;
    int closeStreamCalls = 0;

private:
    class Stream;
    Stream* findStream(ControlStream* stream) const;

    // Closed streams are kept, so that a late call on one is caught, not undefined.
    std::vector<std::unique_ptr<Stream>> streams_;
};

}  // namespace sim
