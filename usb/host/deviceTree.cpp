#include "deviceTree.h"

#include <algorithm>

#include "hostState.h"

namespace usbhost {

namespace {
constexpr uint32_t kUsbQueryAttribute = 1;
constexpr uint32_t kUsbQueryValue = 0x20757362;  // ' usb'
}  // namespace

class Tree::Query final : public DeviceQuery {
  public:
    explicit Query(uint32_t id) : id_(id) {}
    void setAttribute(uint32_t id, const void* value, tStatus& status) override
    {
        if (status < 0) return;
        if (value == nullptr) {
            reportMisuse("setAttribute with no value");
            setFailure(status, kBadArgument);
            return;
        }
        // Every device this host shows is a USB device; other selections find nothing.
        if (id == kUsbQueryAttribute) selectsUsb_ = *static_cast<const uint32_t*>(value) == kUsbQueryValue;
    }
    uint32_t getId() override { return id_; }

  private:
    uint32_t id_;
    bool selectsUsb_ = false;
};

Tree& tree()
{
    static Tree instance;
    return instance;
}

void Tree::addListener(ListenerRecord* record, tStatus& status)
{
    if (status < 0) return;
    std::unique_lock<std::mutex> lock(mutex_);
    bool knownQuery = record != nullptr && std::any_of(queries_.begin(), queries_.end(),
                                                       [&](const auto& q) { return q->getId() == record->queryId; });
    if (record == nullptr || (record->eventKind != kListenerArrival && record->eventKind != kListenerRemoval) ||
        record->callback == nullptr || !knownQuery) {
        lock.unlock();
        reportMisuse("addListener with a malformed record");
        setFailure(status, kBadArgument);
        return;
    }
    bool added = std::any_of(listeners_.begin(), listeners_.end(),
                             [&](const auto& l) { return l->record == record && !l->removed; });
    if (added) {
        lock.unlock();
        reportMisuse("addListener of a record already added");
        return;
    }
    auto listener = std::make_shared<Listener>();
    listener->record = record;
    listeners_.push_back(listener);
}

void Tree::removeListener(ListenerRecord* record, tStatus* status)
{
    if (status != nullptr && *status < 0) return;
    std::unique_lock<std::mutex> lock(mutex_);
    // A record never added is accepted. Once this returns, no callback comes
    // through the record: calls already running are waited for.
    for (auto& listener : listeners_) {
        if (listener->record == record) listener->removed = true;
    }
    callbacksReturned_.wait(lock, [&] {
        return std::none_of(listeners_.begin(), listeners_.end(),
                            [&](const auto& l) { return l->record == record && l->inFlight != 0; });
    });
    listeners_.erase(
        std::remove_if(listeners_.begin(), listeners_.end(), [&](const auto& l) { return l->record == record; }),
        listeners_.end());
}

DeviceQuery* Tree::createQuery()
{
    std::lock_guard<std::mutex> lock(mutex_);
    queries_.push_back(std::make_unique<Query>(nextQueryId_++));
    return queries_.back().get();
}

void Tree::releaseQuery(DeviceQuery** query)
{
    if (query == nullptr) {
        reportMisuse("releaseQuery with no query pointer");
        return;
    }
    std::unique_lock<std::mutex> lock(mutex_);
    auto it = std::find_if(queries_.begin(), queries_.end(), [&](const auto& q) { return q.get() == *query; });
    if (it == queries_.end()) {
        lock.unlock();
        reportMisuse("releaseQuery of a query this tree did not create");
        return;
    }
    queries_.erase(it);
    *query = nullptr;
}

// The search reports no device: every device present is announced through
// the arrival records instead, each on a thread of its own, so that devices
// found at start are updated side by side like devices that arrive later.
void Tree::findDevices(DeviceList* list, uint32_t, DeviceQuery* query, uint32_t, tStatus& status)
{
    if (list != nullptr) {
        list->count = 0;
        list->devices = nullptr;
    }
    if (status < 0) return;
    std::unique_lock<std::mutex> lock(mutex_);
    bool knownQuery = std::any_of(queries_.begin(), queries_.end(), [&](const auto& q) { return q.get() == query; });
    lock.unlock();
    if (list == nullptr || !knownQuery) {
        reportMisuse("findDevices without a list or with a query this tree did not create");
        setFailure(status, kBadArgument);
    }
}

void Tree::deliver(uint32_t eventKind, UsbDevice* device)
{
    std::vector<std::shared_ptr<Listener>> targets;
    {
        std::lock_guard<std::mutex> lock(mutex_);
        for (const auto& listener : listeners_) {
            if (listener->record->eventKind == eventKind && !listener->removed) {
                ++listener->inFlight;
                targets.push_back(listener);
            }
        }
    }
    for (const auto& listener : targets) {
        listener->record->callback->onDeviceEvent(device);
        std::lock_guard<std::mutex> lock(mutex_);
        --listener->inFlight;
        callbacksReturned_.notify_all();
    }
}

size_t Tree::liveListeners() const
{
    std::lock_guard<std::mutex> lock(mutex_);
    return listeners_.size();
}

size_t Tree::liveQueries() const
{
    std::lock_guard<std::mutex> lock(mutex_);
    return queries_.size();
}

}  // namespace usbhost

iDeviceTree* iDeviceTree::getDeviceTree()
{
    return &usbhost::tree();
}
