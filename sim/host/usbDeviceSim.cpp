#include <cstdio>

#include "simHost.h"

namespace sim {

UsbDeviceSim::UsbDeviceSim(uint32_t vendorId, uint32_t productId, uint32_t attribute21)
{
    attributes[1] = vendorId;
    attributes[2] = productId;
    attributes[21] = attribute21;
}

UsbDeviceSim::~UsbDeviceSim() = default;

uint32_t UsbDeviceSim::getAttribute(uint32_t id, tStatus* status)
{
    if (status != nullptr && *status < 0) return 0;
    ++attributeReads;
    auto it = attributes.find(id);
    if (failingAttributes.count(id) != 0 || it == attributes.end()) {
        if (status != nullptr) setFailure(*status, kHostFailure);
        return 0xFFFFFFFF;
    }
    return it->second;
}

ControlStream* UsbDeviceSim::openStream(nQVKORD100::tControlStreamParameterUSB*, tStatus& status)
{
    // A plain USB device has no loader to talk to.
    if (status < 0) return nullptr;
    ++streamOpenAttempts;
    setFailure(status, kHostFailure);
    return nullptr;
}

void UsbDeviceSim::closeStream(ControlStream*, tStatus& status)
{
    Host::get().reportMisuse("closeStream on " + describe() + ", which opened no stream");
    setFailure(status, kHostBadArgument);
}

void UsbDeviceSim::getDescriptor(nQVKORD100::tUSBDeviceDescriptorProxy* proxy, tStatus& status)
{
    if (status < 0) return;
    ++descriptorReads;
    if (failDescriptor || proxy == nullptr) {
        setFailure(status, kHostFailure);
        return;
    }
    uint8_t descriptor[18] = {18, 1, 0x00, 0x02, 0xFF, 0xFF, 0xFF, 64};
    uint16_t vendor = static_cast<uint16_t>(attributes[1]);
    uint16_t product = static_cast<uint16_t>(attributes[2]);
    descriptor[8] = vendor & 0xFF;
    descriptor[9] = vendor >> 8;
    descriptor[10] = product & 0xFF;
    descriptor[11] = product >> 8;
    descriptor[17] = 1;
    for (int i = 0; i < 18; ++i) proxy->descriptor[i] = descriptor[i];
    proxy->length = 18;
}

std::string UsbDeviceSim::describe() const
{
    char text[64];
    std::snprintf(text, sizeof text, "USB device %04X:%04X", attributes.at(1) & 0xFFFF, attributes.at(2) & 0xFFFF);
    return name.empty() ? text : name + " (" + text + ")";
}

}  // namespace sim
