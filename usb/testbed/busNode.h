// One device node of the emulated bus: answers usbfs ioctls for one
// enumeration of an emulated device. Standard requests are answered as a
// device's USB core would; vendor requests go to the emulated loader.
#pragma once

#include <condition_variable>
#include <deque>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "sim/device/enumeratedDevice.h"

typedef struct _UMockdevIoctlBase UMockdevIoctlBase;
typedef struct _UMockdevIoctlClient UMockdevIoctlClient;
typedef struct _UMockdevIoctlData UMockdevIoctlData;

namespace usbtestbed {

class EmulatedBus;

class Node {
  public:
    Node(EmulatedBus& bus, std::string busPath, int address, std::shared_ptr<sim::PhysicalDevice> hardware,
         std::string serial);
    ~Node();
    Node(const Node&) = delete;
    Node& operator=(const Node&) = delete;

    const std::string busPath;
    const int address;
    const std::string devNode;
    const std::string sysPath;
    UMockdevIoctlBase* handler() const { return handler_; }
    std::shared_ptr<sim::PhysicalDevice> hardwareShared() const { return hardware_; }
    uint16_t vendorId() const { return vendorId_; }
    uint16_t productId() const { return productId_; }
    // The sysfs and udev description umockdev adds the device from.
    std::string description() const;

    // Ends every URB with a disconnect; later ioctls fail as on a gone device.
    void goDead();
    void stop();

  private:
    struct Urb;
    static int onIoctl(UMockdevIoctlBase* handler, UMockdevIoctlClient* client, void* self);
    static void onVanished(UMockdevIoctlBase* handler, UMockdevIoctlClient* client, void* self);
    bool handle(UMockdevIoctlClient* client);
    void work();
    // Fills the URB's result; the caller holds the mutex.
    void finish(Urb& urb, int status, int actualLength);
    void answerReaps();
    int standardRequest(const uint8_t* setup, uint8_t* data, int& actualLength) const;
    int vendorRequest(const uint8_t* setup, uint8_t* data, int& actualLength);
    std::vector<uint8_t> deviceDescriptor() const;
    std::vector<uint8_t> configurationDescriptor() const;

    EmulatedBus& bus_;
    std::shared_ptr<sim::PhysicalDevice> hardware_;
    sim::EnumeratedDevice* enumeration_;
    uint16_t vendorId_;
    uint16_t productId_;
    std::string serial_;
    UMockdevIoctlBase* handler_;

    std::mutex mutex_;
    std::condition_variable wake_;
    std::deque<std::shared_ptr<Urb>> queue_;    // submitted, not yet carried out
    std::vector<std::shared_ptr<Urb>> flying_;  // submitted, not yet reaped
    struct Reap {
        UMockdevIoctlClient* client;
        UMockdevIoctlData* slot;  // where the reaped URB's address goes, resolved on the handler thread
    };
    std::vector<Reap> waitingReaps_;
    bool dead_ = false;
    bool stopping_ = false;
    std::thread worker_;
};

}  // namespace usbtestbed
