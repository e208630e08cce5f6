// The host's device tree and USB objects, operations in virtual order, and the
// records the module exchanges with the tree.
#pragma once

#include <stddef.h>
#include <stdint.h>

#include "karvelkStatus.h"
#include "transferParameters.h"

class UsbDevice;
class DeviceQuery;
class ControlStream;

// Implemented by the module; the host calls it for each registered record.
class DeviceEventCallback {
public:
    virtual void onDeviceEvent(UsbDevice* device) = 0;

protected:
    ~DeviceEventCallback() = default;
};

// Exchanged with the host: tells the tree which events to report to whom.
struct ListenerRecord {
    uint32_t eventKind;  // 2 arrival, 1 removal
    uint32_t one;
    uint64_t zero;
    uint32_t queryId;
    uint8_t unused[4];
    DeviceEventCallback* callback;
};
static_assert(sizeof(ListenerRecord) == 32, "listener record is 32 bytes");
static_assert(offsetof(ListenerRecord, one) == 4, "second word at 4");
static_assert(offsetof(ListenerRecord, zero) == 8, "64-bit zero at 8");
static_assert(offsetof(ListenerRecord, queryId) == 16, "query id at 16");
static_assert(offsetof(ListenerRecord, callback) == 24, "callback at 24");

constexpr uint32_t kListenerArrival = 2;
constexpr uint32_t kListenerRemoval = 1;

// Filled by the tree's device search; the array comes from the host allocator.
struct DeviceList {
    uint8_t reserved[8];
    uint32_t count;
    UsbDevice** devices;
};
static_assert(sizeof(DeviceList) == 24, "device list is 24 bytes");
static_assert(offsetof(DeviceList, count) == 8, "count at 8");
static_assert(offsetof(DeviceList, devices) == 16, "array at 16");

class DeviceQuery {
public:
    virtual void setAttribute(uint32_t id, const void* value, tStatus& status) = 0;
    virtual uint32_t getId() = 0;

protected:
    ~DeviceQuery() = default;
};

class ControlStream {
public:
    virtual void* allocateBuffer(uint32_t size, tStatus& status) = 0;
    virtual void freeBuffer(void* buffer, tStatus& status) = 0;
    virtual void transfer(nQVKORD100::tTransferParameterUSBControl* request, tStatus& status) = 0;

protected:
    ~ControlStream() = default;
};

class UsbDevice {
public:
    virtual uint32_t getAttribute(uint32_t id, tStatus* status) = 0;  // status may be null
    virtual ControlStream* openStream(nQVKORD100::tControlStreamParameterUSB* parameter, tStatus& status) = 0;
    virtual void closeStream(ControlStream* stream, tStatus& status) = 0;
    virtual void getDescriptor(nQVKORD100::tUSBDeviceDescriptorProxy* proxy, tStatus& status) = 0;

protected:
    ~UsbDevice() = default;
};

class iDeviceTree {
public:
    static iDeviceTree* getDeviceTree();

    virtual void addListener(ListenerRecord* record, tStatus& status) = 0;
    virtual void releaseQuery(DeviceQuery** query) = 0;
    virtual void removeListener(ListenerRecord* record, tStatus* status) = 0;  // status may be null
    virtual DeviceQuery* createQuery() = 0;
    virtual void findDevices(DeviceList* list, uint32_t selector, DeviceQuery* query, uint32_t flags,
                             tStatus& status) = 0;

protected:
    ~iDeviceTree() = default;
};
