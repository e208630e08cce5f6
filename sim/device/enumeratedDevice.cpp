#include "enumeratedDevice.h"

namespace sim {

EnumeratedDevice::EnumeratedDevice(std::shared_ptr<PhysicalDevice> hardware, uint16_t vendorId, uint16_t productId)
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
    if (!gone_) return UsbDeviceSim::getAttribute(id, status);
    if (status != nullptr) setFailure(*status, kHostDeviceGone);
    return 0xFFFFFFFF;
}

void EnumeratedDevice::getDescriptor(nQVKORD100::tUSBDeviceDescriptorProxy* proxy, tStatus& status)
{
    if (!gone_) return UsbDeviceSim::getDescriptor(proxy, status);
    setFailure(status, kHostDeviceGone);
}

}  // namespace sim
