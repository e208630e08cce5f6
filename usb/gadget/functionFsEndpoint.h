// The control endpoint of a FunctionFS function (ep0), through which user
// space acts as the device's firmware: every control request the host sends
// (the USB core answers only the standard ones) arrives here as an event,
// and is answered with its data stage, an acknowledgement or a stall.
#pragma once

#include <linux/usb/ch9.h>

#include <cstdint>
#include <string>

namespace usbgadget {

class FunctionFsEndpoint {
  public:
    // Mounts the FunctionFS instance at `mountPoint` (made if missing), opens
    // its ep0 and writes a function with one vendor interface and no
    // endpoints, which receives the control requests of every recipient,
    // also while the device is not configured.
    FunctionFsEndpoint(const std::string& instance, const std::string& mountPoint);
    ~FunctionFsEndpoint();
    FunctionFsEndpoint(const FunctionFsEndpoint&) = delete;
    FunctionFsEndpoint& operator=(const FunctionFsEndpoint&) = delete;

    int descriptor() const { return ep0_; }

    enum class EventKind { setup, bound, unbound, enabled, disabled, suspended, resumed, none };
    struct Event {
        EventKind kind = EventKind::none;
        usb_ctrlrequest setup{};
    };
    // The next event; waits for one. EventKind::none when the read was cut short.
    Event next();

    // Answers of the request the last setup event brought. Each returns
    // false when the host gave up on the request meanwhile (a new setup, a
    // reset, a disconnect); the caller goes on with the next event.
    bool sendIn(const uint8_t* data, size_t length);  // the IN data stage, possibly short
    bool receiveOut(uint8_t* data, size_t length);    // the OUT data stage, then its status stage
    bool acknowledge();                               // the status stage of a request without data
    bool stall(bool directionIn);

  private:
    std::string mountPoint_;
    bool mounted_ = false;
    int ep0_ = -1;
};

}  // namespace usbgadget
