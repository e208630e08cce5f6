#include "DeviceTable.h"

void DeviceTable::updateFirmware(UsbDevice* device, uint16_t loaderProductId, tStatus& status)
{
    (void)device;
    (void)loaderProductId;
    (void)status;
}
