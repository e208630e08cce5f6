// The module's one watcher of the host's device tree. It offers every present
// and arriving USB device to its arrival filter, which hands loader-mode
// devices of the family to the firmware update.
#pragma once

#include <stdint.h>

#include "../host/deviceTree.h"
#include "../host/karvelkStatus.h"
#include "loaderChannel.h"

// The table is reached through two callback interfaces, one per listener
// record. Each base forwards to the table, so that one host interface can
// serve two different events.
class DeviceTableArrivalBase : public DeviceEventCallback {
public:
    void onDeviceEvent(UsbDevice* device) override;
};

class DeviceTableRemovalBase : public DeviceEventCallback {
public:
    void onDeviceEvent(UsbDevice* device) override;
};

// Final, so that the calls from the two bases and from construction reach
// deviceArrived directly rather than through the table's virtual table.
class DeviceTable final : public DeviceTableArrivalBase, public DeviceTableRemovalBase {
public:
    explicit DeviceTable(tStatus& status);

    virtual void deviceArrived(UsbDevice* device, tStatus& status);
    virtual void deviceRemoved(UsbDevice* device, tStatus& status);
    virtual ~DeviceTable();

    // Firmware loading; these use none of the table's state, so they need
    // no table to be called on.
    static void updateFirmware(UsbDevice* device, uint16_t loaderProductId, tStatus& status);
    static void checkIdentity(LoaderChannel& channel, uint16_t& vendorId, uint16_t& productId,
                              uint32_t& serialNumber, tStatus& status);
    static bool isSerialInRanges(uint32_t serialNumber);

private:
    iDeviceTree* deviceTree;
    DeviceQuery* query;
    ListenerRecord* arrivalRecord;
    ListenerRecord* removalRecord;
};

// The table the module main created; null when there is none.
extern DeviceTable* gModuleDeviceTable;

constexpr uint16_t kFamilyVendorId = 0x5C1D;
constexpr uint16_t kLoaderProductIdSmall = 0x4A10;
constexpr uint16_t kLoaderProductIdLarge = 0x4A20;
