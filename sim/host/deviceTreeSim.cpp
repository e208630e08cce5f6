// The host's device tree: queries, the USB device search, listener records and
// the delivery of arrivals and removals.
#include <algorithm>
#include <cstdio>

#include "simHost.h"

namespace sim {

namespace {
constexpr uint32_t kUsbQueryAttribute = 1;
constexpr uint32_t kUsbQueryValue = 0x20757362;
constexpr int kMaxEventsPerDelivery = 1000;  // a runaway event loop stops here
}  // namespace

class DeviceTreeSim::Query final : public DeviceQuery {
public:
    Query(DeviceTreeSim& tree, uint32_t id) : tree_(tree), id_(id) {}
    void setAttribute(uint32_t id, const void* value, tStatus& status) override
    {
        tStatus injected = tree_.faults.setAttribute.statusFor(++tree_.setAttributeCalls_);
        if (status < 0) return;
        if (injected < 0 || value == nullptr) {
            setFailure(status, injected < 0 ? injected : kHostFailure);
            return;
        }
        attributes[id] = *static_cast<const uint32_t*>(value);
    }
    uint32_t getId() override
    {
        ++tree_.queryIdReads_;
        return id_;
    }
    uint32_t id() const { return id_; }
    bool selectsUsb() const
    {
        auto it = attributes.find(kUsbQueryAttribute);
        return it != attributes.end() && it->second == kUsbQueryValue;
    }
    std::map<uint32_t, uint32_t> attributes;

private:
    DeviceTreeSim& tree_;
    uint32_t id_;
};

DeviceTreeSim::DeviceTreeSim() = default;
DeviceTreeSim::~DeviceTreeSim() = default;

void DeviceTreeSim::addListener(ListenerRecord* record, tStatus& status)
{
    tStatus injected = faults.addListener.statusFor(++addListenerCalls_);
    if (status < 0) return;
    if (injected < 0) {
        setFailure(status, injected);
        return;
    }
    Host& host = Host::get();
    if (record == nullptr) {
        host.reportMisuse("addListener with no record");
        setFailure(status, kHostBadArgument);
        return;
    }
    bool knownQuery = std::any_of(queries_.begin(), queries_.end(),
                                  [&](const auto& q) { return q->id() == record->queryId; });
    if ((record->eventKind != kListenerArrival && record->eventKind != kListenerRemoval) || record->one != 1 ||
        record->zero != 0 || !knownQuery || record->callback == nullptr) {
        host.reportMisuse("addListener with a malformed record");
        setFailure(status, kHostBadArgument);
        return;
    }
    if (std::find(listeners_.begin(), listeners_.end(), record) != listeners_.end()) {
        host.reportMisuse("addListener of a record already added");
        return;
    }
    listeners_.push_back(record);
}

void DeviceTreeSim::removeListener(ListenerRecord* record, tStatus* status)
{
    ++removeListenerCalls_;
    if (status != nullptr && *status < 0) return;
    // A record never added is accepted; once this returns no callback comes.
    listeners_.erase(std::remove(listeners_.begin(), listeners_.end(), record), listeners_.end());
    if (faults.removeListener && status != nullptr) setFailure(*status, kHostFailure);
}

DeviceQuery* DeviceTreeSim::createQuery()
{
    if (faults.createQuery.statusFor(++createQueryCalls_) < 0) return nullptr;
    queries_.push_back(std::make_unique<Query>(*this, nextQueryId_++));
    return queries_.back().get();
}

void DeviceTreeSim::releaseQuery(DeviceQuery** query)
{
    if (query == nullptr || *query == nullptr) {
        Host::get().reportMisuse("releaseQuery of no query");
        return;
    }
    auto it = std::find_if(queries_.begin(), queries_.end(), [&](const auto& q) { return q.get() == *query; });
    if (it == queries_.end()) {
        Host::get().reportMisuse("releaseQuery of a query this tree did not create");
        return;
    }
    queries_.erase(it);
    *query = nullptr;
}

void DeviceTreeSim::findDevices(DeviceList* list, uint32_t selector, DeviceQuery* query, uint32_t flags,
                                tStatus& status)
{
    tStatus injected = faults.findDevices.statusFor(++findDevicesCalls_);
    if (status < 0) return;
    if (list == nullptr) {
        setFailure(status, kHostBadArgument);
        return;
    }
    // The array pointer is set before anything can fail.
    list->devices = nullptr;
    list->count = 0;
    std::vector<UsbDeviceSim*> found;
    auto* known = std::find_if(queries_.begin(), queries_.end(), [&](const auto& q) { return q.get() == query; }) !=
                          queries_.end()
                      ? static_cast<Query*>(query)
                      : nullptr;
    if (known != nullptr && known->selectsUsb() && selector == 4 && flags == 0) found = presentDevices();
    if (known == nullptr) Host::get().reportMisuse("findDevices with a query this tree did not create");
    tStatus allocationStatus = 0;
    list->devices = static_cast<UsbDevice**>(
        Host::get().allocator.allocate(sizeof(UsbDevice*) * (found.empty() ? 1 : found.size()), &allocationStatus,
                                       "the device list of findDevices"));
    if (injected < 0 || allocationStatus < 0) {
        setFailure(status, allocationStatus < 0 ? allocationStatus : injected);
        return;
    }
    for (size_t i = 0; i < found.size(); ++i) list->devices[i] = found[i];
    list->count = static_cast<uint32_t>(found.size());
}

UsbDeviceSim& DeviceTreeSim::plugIn(std::unique_ptr<UsbDeviceSim> device)
{
    UsbDeviceSim& added = *device;
    adopt(std::move(device));
    added.present = true;
    queueArrival(added);
    deliverPendingEvents();
    return added;
}

void DeviceTreeSim::unplug(UsbDeviceSim& device)
{
    device.present = false;
    queueRemoval(device);
    deliverPendingEvents();
}

void DeviceTreeSim::adopt(std::unique_ptr<UsbDeviceSim> device, const UsbDeviceSim* after)
{
    device->tree = this;
    auto place = std::find_if(devices_.begin(), devices_.end(), [&](const auto& d) { return d.get() == after; });
    if (after == nullptr || place == devices_.end()) {
        devices_.push_back(std::move(device));
    } else {
        devices_.insert(place + 1, std::move(device));
    }
}

void DeviceTreeSim::queueArrival(UsbDeviceSim& device)
{
    device.present = true;
    pending_.push_back(Event{true, &device});
}

void DeviceTreeSim::queueRemoval(UsbDeviceSim& device)
{
    device.present = false;
    pending_.push_back(Event{false, &device});
}

void DeviceTreeSim::deliver(const Event& event)
{
    uint32_t kind = event.arrival ? kListenerArrival : kListenerRemoval;
    // A copy: a callback may remove listeners.
    std::vector<ListenerRecord*> targets = listeners_;
    for (ListenerRecord* record : targets) {
        if (record->eventKind != kind) continue;
        if (std::find(listeners_.begin(), listeners_.end(), record) == listeners_.end()) continue;
        record->callback->onDeviceEvent(event.device);
    }
}

void DeviceTreeSim::deliverPendingEvents()
{
    // Events raised while delivering wait for the current delivery to return.
    if (delivering_) return;
    delivering_ = true;
    int delivered = 0;
    while (!pending_.empty()) {
        if (++delivered > kMaxEventsPerDelivery) {
            Host::get().reportMisuse("device events keep coming; delivery stopped");
            pending_.clear();
            break;
        }
        Event event = pending_.front();
        pending_.pop_front();
        deliver(event);
    }
    delivering_ = false;
}

std::vector<UsbDeviceSim*> DeviceTreeSim::presentDevices() const
{
    std::vector<UsbDeviceSim*> result;
    for (const auto& device : devices_) {
        if (device->present) result.push_back(device.get());
    }
    return result;
}

std::vector<UsbDeviceSim*> DeviceTreeSim::allDevices() const
{
    std::vector<UsbDeviceSim*> result;
    for (const auto& device : devices_) result.push_back(device.get());
    return result;
}

size_t DeviceTreeSim::liveQueries() const
{
    return queries_.size();
}

std::vector<std::string> DeviceTreeSim::describeLeftovers() const
{
    std::vector<std::string> result;
    if (!queries_.empty()) result.push_back(std::to_string(queries_.size()) + " device query(ies) not released");
    if (!listeners_.empty()) result.push_back(std::to_string(listeners_.size()) + " listener record(s) still added");
    for (const auto& device : devices_) {
        if (device->openStreams() != 0)
            result.push_back(std::to_string(device->openStreams()) + " control stream(s) open on " + device->describe());
    }
    return result;
}

}  // namespace sim

iDeviceTree* iDeviceTree::getDeviceTree()
{
    sim::Host& host = sim::Host::get();
    return host.treePresent() ? host.tree() : nullptr;
}
