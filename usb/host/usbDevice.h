// One USB device as the host shows it to the module: attributes and the
// device descriptor from what the kernel enumerated, and control streams that
// carry the module's requests as synchronous libusb control transfers.
#pragma once

#include <libusb.h>

#include <atomic>
#include <chrono>
#include <map>
#include <memory>
#include <mutex>
#include <vector>

#include "../../host/deviceTree.h"
#include "usbHost.h"

namespace usbhost {

class Device;

class Stream final : public ControlStream {
  public:
    explicit Stream(Device& device) : device_(device) {}

    void* allocateBuffer(uint32_t size, tStatus& status) override;
    void freeBuffer(void* buffer, tStatus& status) override;
    void transfer(nQVKORD100::tTransferParameterUSBControl* request, tStatus& status) override;

    bool open = true;
    size_t buffersHeld() const { return buffers_.size(); }

  private:
    bool insideLiveBuffer(const void* data, uint32_t length) const;

    Device& device_;
    std::map<const uint8_t*, uint32_t> buffers_;  // used by the one thread that owns the stream
};

class Device final : public UsbDevice {
  public:
    // Takes a reference on the libusb device of the host's enumeration context.
    Device(libusb_device* device, const libusb_device_descriptor& descriptor, DeviceInfo info);
    ~Device();
    Device(const Device&) = delete;
    Device& operator=(const Device&) = delete;

    uint32_t getAttribute(uint32_t id, tStatus* status) override;
    ControlStream* openStream(nQVKORD100::tControlStreamParameterUSB* parameter, tStatus& status) override;
    void closeStream(ControlStream* stream, tStatus& status) override;
    void getDescriptor(nQVKORD100::tUSBDeviceDescriptorProxy* proxy, tStatus& status) override;

    const DeviceInfo& info() const { return info_; }
    libusb_device* usbDevice() const { return device_; }
    bool isLoader() const { return info_.productId == 0x4A10 || info_.productId == 0x4A20; }
    void markGone() { gone_ = true; }
    bool gone() const { return gone_; }
    bool restarted() const { return restarted_; }
    size_t openStreams() const;

    // One delivery to the module: counts requests and tells how it ended.
    void beginDelivery();
    UpdateRecord endDelivery();

    // For the device's streams: one control transfer, its outcome as a status.
    tStatus controlTransfer(const nQVKORD100::tTransferParameterUSBControl& request);

  private:
    tStatus openHandle();
    void closeHandle();
    void count(const nQVKORD100::tTransferParameterUSBControl& request, tStatus outcome);
    void expectRestart(bool expected);

    libusb_device* device_;
    libusb_device_descriptor descriptor_;
    DeviceInfo info_;
    std::atomic<bool> gone_{false};
    std::atomic<bool> restarted_{false};

    mutable std::mutex mutex_;  // the handle and the streams
    libusb_context* ownContext_ = nullptr;
    libusb_device_handle* handle_ = nullptr;
    // Closed streams are kept, so that a late call on one is caught, not undefined.
    std::vector<std::unique_ptr<Stream>> streams_;

    UpdateRecord record_;
    bool talkedTo_ = false;
    std::chrono::steady_clock::time_point deliveryStart_;
};

}  // namespace usbhost
