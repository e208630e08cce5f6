// The host's device tree over libusb: queries, the module's listener records,
// and the delivery of arrivals and removals through them.
#pragma once

#include <condition_variable>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "../../host/deviceTree.h"

namespace usbhost {

class Tree final : public iDeviceTree {
  public:
    void addListener(ListenerRecord* record, tStatus& status) override;
    void releaseQuery(DeviceQuery** query) override;
    void removeListener(ListenerRecord* record, tStatus* status) override;
    DeviceQuery* createQuery() override;
    void findDevices(DeviceList* list, uint32_t selector, DeviceQuery* query, uint32_t flags, tStatus& status) override;

    // Calls every record of that kind with the device, on the calling thread.
    // A record being removed waits until such calls through it have returned.
    void deliver(uint32_t eventKind, UsbDevice* device);

    size_t liveListeners() const;
    size_t liveQueries() const;

  private:
    class Query;
    struct Listener {
        ListenerRecord* record;
        int inFlight = 0;
        bool removed = false;
    };

    mutable std::mutex mutex_;
    std::condition_variable callbacksReturned_;
    std::vector<std::unique_ptr<Query>> queries_;
    std::vector<std::shared_ptr<Listener>> listeners_;
    uint32_t nextQueryId_ = 0x51;
};

}  // namespace usbhost
