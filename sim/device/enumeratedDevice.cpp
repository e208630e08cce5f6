#include "enumeratedDevice.h"

namespace sim {

EnumeratedDevice::EnumeratedDevice(std::shared_ptr<PhysicalDevice> hardware, uint32_t vendorId, uint32_t productId)
    : UsbDeviceSim(vendorId, productId, hardware->options().attribute21), hardware_(std::move(hardware))
{
    name = hardware_->options().name;
    hardware_->attach(*this);
}

EnumeratedDevice::~EnumeratedDevice()
{
    hardware_->forget(*this);
}

uint32_t EnumeratedDevice::getAttribute(uint32_t id, tStatus* status)
{
    if (status != nullptr && *status < 0) return 0;
    auto injected = hardware_->faults.attributeFailures.find(id);
    if (!gone_ && injected == hardware_->faults.attributeFailures.end()) return UsbDeviceSim::getAttribute(id, status);
    ++attributeReads;
    if (status != nullptr) setFailure(*status, gone_ ? kHostDeviceGone : injected->second);
    return 0xFFFFFFFF;
}

void EnumeratedDevice::getDescriptor(nQVKORD100::tUSBDeviceDescriptorProxy* proxy, tStatus& status)
{
    tStatus injected = hardware_->faults.descriptorFailure;
    if (!gone_ && injected >= 0) return UsbDeviceSim::getDescriptor(proxy, status);
    if (status < 0) return;
    ++descriptorReads;
    setFailure(status, gone_ ? kHostDeviceGone : injected);
}

}  // namespace sim
