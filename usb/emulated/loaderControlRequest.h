// One control request from a real bus, carried out by an emulated device as
// its loader (or its firmware) would: the part of a bus that the umockdev bed
// and the FunctionFS gadget share.
#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <string>

#include "sim/device/physicalDevice.h"

namespace usbemulated {

constexpr int kSetupSize = 8;

struct ControlOutcome {
    // 0 when the request went through, else the errno a host controller
    // gives: EPIPE for a stall, ESHUTDOWN for a device that went away while
    // answering, EPROTO for any other failure.
    int error = 0;
    int actualLength = 0;  // bytes of the data stage that crossed the bus
    // The device let go of the bus in this request: after a successful
    // restart it comes back, after a failure it is gone.
    bool leftTheBus = false;
    std::chrono::microseconds spent{0};  // on the device's timing model
};

// A vendor request on the enumeration that stands for the device now;
// `enumeration` is the one the request came through. Only the loader speaks
// the protocol: any other request, or one that reaches the firmware, stalls.
// `data` holds the OUT data stage, or receives the IN one (length from the
// setup packet). Where the OUT data stage has still to be taken from the bus,
// `takeOutData` fetches it into `data` once the device will accept it, and
// returns false when the host gave up on the request (then nothing is
// served: error ECONNRESET). Not thread-safe: one request at a time per device.
ControlOutcome serveVendorRequest(sim::PhysicalDevice& hardware, const sim::EnumeratedDevice* enumeration,
                                  const uint8_t* setup, uint8_t* data,
                                  const std::function<bool()>& takeOutData = nullptr);

// The vendor and product ID an enumeration shows in its device descriptor.
uint16_t vendorIdOf(sim::EnumeratedDevice& enumeration);
uint16_t productIdOf(sim::EnumeratedDevice& enumeration);
// "5C1D:4A10", as the buses' histories name an enumeration.
std::string idText(uint16_t vendorId, uint16_t productId);

}  // namespace usbemulated
