#include "DeviceTable.h"

void DeviceTable::checkIdentity(LoaderChannel&, uint16_t&, uint16_t&, uint32_t&, tStatus&) {}

bool DeviceTable::isSerialInRanges(uint32_t)
{
    return false;
}
