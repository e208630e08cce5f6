// The test host's device tree: no devices of its own, one query, a few
// listener slots, and a device the harness can offer to the arrival listeners.
#include "../../host/deviceTree.h"
#include "../../host/karvelk.h"
#include "fakeHost.h"

namespace {

constexpr tStatus kFakeTreeRefused = -52000;
constexpr uint32_t kListenerSlots = 4;
constexpr uint32_t kQueryId = 0x51;
constexpr uint32_t kAttributeVendorId = 1;
constexpr uint32_t kAttributeProductId = 2;

class FakeQuery final : public DeviceQuery {
public:
    void setAttribute(uint32_t, const void*, tStatus&) override {}
    uint32_t getId() override { return kQueryId; }
};

// Any device offered: it answers its IDs and refuses a stream.
class FakeDevice final : public UsbDevice {
public:
    uint32_t getAttribute(uint32_t id, tStatus*) override
    {
        ++fakeHost().attributeReads;
        if (id == kAttributeVendorId) return vendorId;
        if (id == kAttributeProductId) return productId;
        return 0;
    }
    ControlStream* openStream(nQVKORD100::tControlStreamParameterUSB*, tStatus& status) override
    {
        ++fakeHost().streamsOpened;
        setFailure(status, kFakeTreeRefused);
        return nullptr;
    }
    void closeStream(ControlStream*, tStatus&) override {}
    void getDescriptor(nQVKORD100::tUSBDeviceDescriptorProxy*, tStatus&) override {}

    uint16_t vendorId = 0;
    uint16_t productId = 0;
};

class FakeDeviceTree final : public iDeviceTree {
public:
    void addListener(ListenerRecord* record, tStatus& status) override
    {
        if (status < 0) return;
        for (ListenerRecord*& slot : slots) {
            if (slot != nullptr) continue;
            slot = record;
            ++fakeHost().listeners;
            fakeHost().listenerKindMask |= 1u << (record->eventKind & 31);
            return;
        }
        setFailure(status, kFakeTreeRefused);
    }

    void releaseQuery(DeviceQuery** query) override
    {
        if (*query == nullptr) return;
        --fakeHost().openQueries;
        *query = nullptr;
    }

    void removeListener(ListenerRecord* record, tStatus*) override
    {
        fakeHost().listenerKindMask = 0;
        for (ListenerRecord*& slot : slots) {
            if (slot == record) {
                slot = nullptr;
                --fakeHost().listeners;
            } else if (slot != nullptr) {
                fakeHost().listenerKindMask |= 1u << (slot->eventKind & 31);
            }
        }
    }

    DeviceQuery* createQuery() override
    {
        ++fakeHost().openQueries;
        return &onlyQuery;
    }

    void findDevices(DeviceList* list, uint32_t, DeviceQuery*, uint32_t, tStatus& status) override
    {
        // The array comes from the host allocator even when empty: the
        // module must give it back.
        list->devices = static_cast<UsbDevice**>(_memNewUsingCRT(sizeof(UsbDevice*), kMemAllocationDefault, &status));
        list->count = 0;
    }

    void offer(UsbDevice* device)
    {
        for (ListenerRecord* slot : slots) {
            if (slot != nullptr && slot->eventKind == kListenerArrival) slot->callback->onDeviceEvent(device);
        }
    }

    ListenerRecord* slots[kListenerSlots] = {};
    FakeQuery onlyQuery;
};

FakeDeviceTree gTree;
FakeDevice gDevice;
bool gTreePresent = true;

}  // namespace

iDeviceTree* iDeviceTree::getDeviceTree()
{
    return gTreePresent ? &gTree : nullptr;
}

extern "C" void fakeHostSetDeviceTreePresent(int32_t present)
{
    gTreePresent = present != 0;
}

extern "C" void fakeHostOfferDevice(uint16_t vendorId, uint16_t productId)
{
    gDevice.vendorId = vendorId;
    gDevice.productId = productId;
    gTree.offer(&gDevice);
}
