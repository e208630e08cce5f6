#include "deviceTable.h"

#include "moduleMemory.h"
#include "statusCodes.h"

DeviceTable* gModuleDeviceTable;

namespace {

constexpr uint32_t kQueryAttribute = 1;
constexpr uint32_t kQueryAttributeUsb = 0x20757362;  // ' ', 'u', 's', 'b'
constexpr uint32_t kAttributeVendorId = 1;
constexpr uint32_t kAttributeProductId = 2;
constexpr uint32_t kAttributeUpdateBar = 21;
constexpr uint32_t kUpdateBarred = 0xFFFFFFFF;
constexpr uint32_t kDeviceSearchSelector = 4;

// The query's id is read once the record exists, and only then.
ListenerRecord* makeListenerRecord(uint32_t eventKind, DeviceQuery* query, DeviceEventCallback* callback)
{
    ListenerRecord* record = static_cast<ListenerRecord*>(allocateFromHost(sizeof(ListenerRecord)));
    if (record == nullptr) return nullptr;
    record->eventKind = eventKind;
    record->one = 1;
    record->zero = 0;
    record->queryId = query->getId();
    record->callback = callback;
    return record;
}

bool isLoaderProductId(uint16_t productId)
{
    return productId == kLoaderProductIdSmall || productId == kLoaderProductIdLarge;
}

}  // namespace

void DeviceTableArrivalBase::onDeviceEvent(UsbDevice* device)
{
    tStatus status = 0;
    static_cast<DeviceTable*>(this)->deviceArrived(device, status);
}

void DeviceTableRemovalBase::onDeviceEvent(UsbDevice* device)
{
    tStatus status = 0;
    static_cast<DeviceTable*>(this)->deviceRemoved(device, status);
}

DeviceTable::DeviceTable(tStatus& status)
    : deviceTree(nullptr), query(nullptr), arrivalRecord(nullptr), removalRecord(nullptr)
{
    deviceTree = iDeviceTree::getDeviceTree();
    if (deviceTree == nullptr) {
        setFailure(status, kStatusMissingOrMalformed);
        return;
    }
    query = deviceTree->createQuery();
    if (query == nullptr) {
        setFailure(status, kStatusNotObtained);
        return;
    }
    const uint32_t usb = kQueryAttributeUsb;
    query->setAttribute(kQueryAttribute, &usb, status);
    if (status < 0) return;

    DeviceList list;
    list.count = 0;
    list.devices = nullptr;
    deviceTree->findDevices(&list, kDeviceSearchSelector, query, 0, status);
    if (status < 0) {
        _memDelete(list.devices);
        return;
    }

    // Present devices are handled before any listener exists, each on its own
    // status, so one device's failure neither stops the walk nor the table.
    for (uint32_t i = 0; i < list.count; ++i) {
        tStatus deviceStatus = 0;
        // Named, not dispatched: the table is still being built.
        DeviceTable::deviceArrived(list.devices[i], deviceStatus);
    }

    arrivalRecord = makeListenerRecord(kListenerArrival, query, static_cast<DeviceTableArrivalBase*>(this));
    removalRecord = makeListenerRecord(kListenerRemoval, query, static_cast<DeviceTableRemovalBase*>(this));
    if (arrivalRecord == nullptr || removalRecord == nullptr) {
        setFailure(status, kStatusNotObtained);
    } else if (status >= 0) {
        gModuleDeviceTable = this;
        deviceTree->addListener(arrivalRecord, status);
        deviceTree->addListener(removalRecord, status);
    }
    _memDelete(list.devices);
}

void DeviceTable::deviceArrived(UsbDevice* device, tStatus& status)
{
    if (status < 0) return;
    uint16_t vendorId = static_cast<uint16_t>(device->getAttribute(kAttributeVendorId, &status));
    uint16_t productId = static_cast<uint16_t>(device->getAttribute(kAttributeProductId, &status));
    if (vendorId != kFamilyVendorId || !isLoaderProductId(productId)) return;

    nQVKORD100::tUSBDeviceDescriptorProxy descriptor;
    device->getDescriptor(&descriptor, status);
    uint32_t updateBar = device->getAttribute(kAttributeUpdateBar, nullptr);
    if (updateBar != kUpdateBarred) updateFirmware(device, productId, status);
}

void DeviceTable::deviceRemoved(UsbDevice* device, tStatus& status)
{
    (void)device;
    (void)status;
}

DeviceTable::~DeviceTable()
{
    if (arrivalRecord != nullptr) {
        deviceTree->removeListener(arrivalRecord, nullptr);
        _memDelete(arrivalRecord);
    }
    if (removalRecord != nullptr) {
        deviceTree->removeListener(removalRecord, nullptr);
        _memDelete(removalRecord);
    }
    if (query != nullptr) deviceTree->releaseQuery(&query);
}
