#include "loaderControlRequest.h"

#include <cerrno>
#include <cstdio>

#include "sim/device/enumeratedDevice.h"

namespace usbemulated {

namespace {

constexpr uint8_t kRequestTypeMask = 0x60;
constexpr uint8_t kVendorType = 0x40;
constexpr uint8_t kDirectionIn = 0x80;

int errnoOf(tStatus outcome)
{
    switch (outcome) {
    case sim::kHostTransferStalled:
        return EPIPE;
    case sim::kHostDeviceGone:
        return ESHUTDOWN;
    default:
        return EPROTO;
    }
}

}  // namespace

ControlOutcome serveVendorRequest(sim::PhysicalDevice& hardware, const sim::EnumeratedDevice* enumeration,
                                  const uint8_t* setup, uint8_t* data, const std::function<bool()>& takeOutData)
{
    ControlOutcome result;
    if ((setup[0] & kRequestTypeMask) != kVendorType || hardware.current() != enumeration ||
        dynamic_cast<const sim::LoaderModeDevice*>(enumeration) == nullptr) {
        result.error = EPIPE;
        return result;
    }
    nQVKORD100::tTransferParameterUSBControl request;
    request.bmRequestType = setup[0];
    request.bRequest = setup[1];
    request.wValue = static_cast<uint16_t>(setup[2] | setup[3] << 8);
    request.wIndex = static_cast<uint16_t>(setup[4] | setup[5] << 8);
    request.length = static_cast<uint16_t>(setup[6] | setup[7] << 8);
    request.data = request.length != 0 ? data : nullptr;
    bool outData = (request.bmRequestType & kDirectionIn) == 0 && request.length != 0;
    if (outData && takeOutData && hardware.outcomeBeforeData(request) >= 0 && !takeOutData()) {
        result.error = ECONNRESET;
        return result;
    }

    std::chrono::microseconds before = hardware.elapsed;
    tStatus outcome = hardware.serve(request, 0);
    result.spent = hardware.elapsed - before;
    result.leftTheBus = hardware.current() != enumeration;
    if (outcome < 0) {
        result.error = errnoOf(outcome);
        return result;
    }
    // A device may end an IN data stage early; its trace holds what it sent.
    size_t crossed = request.length;
    if ((request.bmRequestType & kDirectionIn) != 0 && hardware.traceEnabled && !hardware.trace.empty())
        crossed = hardware.trace.back().data.size();
    result.actualLength = static_cast<int>(crossed);
    return result;
}

std::string idText(uint16_t vendorId, uint16_t productId)
{
    char text[16];
    std::snprintf(text, sizeof text, "%04X:%04X", vendorId, productId);
    return text;
}

uint16_t vendorIdOf(sim::EnumeratedDevice& enumeration)
{
    return static_cast<uint16_t>(enumeration.getAttribute(1, nullptr));
}

uint16_t productIdOf(sim::EnumeratedDevice& enumeration)
{
    return static_cast<uint16_t>(enumeration.getAttribute(2, nullptr));
}

}  // namespace usbemulated
