// Watching the bus: libusb's enumeration and hotplug events turned into
// arrivals and removals for the module, each arrival served on its own thread.
#include <algorithm>
#include <fstream>

#include "deviceTree.h"
#include "hostState.h"
#include "usbDevice.h"

namespace usbhost {

namespace {

// A device whose new firmware does not take comes back in loader mode after
// every restart; it is updated again this many times in a row, not forever.
constexpr int kLoaderComebacksUpdated = 2;

std::string busPathOf(libusb_device* device)
{
    uint8_t ports[8];
    int count = libusb_get_port_numbers(device, ports, sizeof ports);
    std::string path = std::to_string(libusb_get_bus_number(device));
    for (int i = 0; i < count; ++i) path += (i == 0 ? "-" : ".") + std::to_string(ports[i]);
    return path;
}

// The kernel keeps the serial-number string it read at enumeration; reading
// it there needs no access to the device node.
std::string sysfsSerial(const std::string& busPath)
{
    std::ifstream file("/sys/bus/usb/devices/" + busPath + "/serial");
    std::string serial;
    std::getline(file, serial);
    return serial;
}

std::string descriptorSerial(libusb_device* device, uint8_t index)
{
    if (index == 0) return "";
    libusb_device_handle* handle = nullptr;
    if (libusb_open(device, &handle) != 0) return "";
    unsigned char text[256] = {};
    int length = libusb_get_string_descriptor_ascii(handle, index, text, sizeof text - 1);
    libusb_close(handle);
    return length > 0 ? std::string(reinterpret_cast<char*>(text), static_cast<size_t>(length)) : "";
}

bool selected(const HostOptions& options, const DeviceInfo& info)
{
    if (info.vendorId != kFamilyVendorId) return false;
    bool noSelection = options.busPaths.empty() && options.serials.empty();
    auto listed = [](const std::vector<std::string>& list, const std::string& value) {
        return std::find(list.begin(), list.end(), value) != list.end();
    };
    return noSelection || listed(options.busPaths, info.busPath) || listed(options.serials, info.serial);
}

int onHotplug(libusb_context*, libusb_device* device, libusb_hotplug_event event, void*)
{
    // Only queued here: libusb forbids opening devices inside this callback.
    std::lock_guard<std::mutex> lock(state().mutex);
    state().pendingEvents.emplace_back(event == LIBUSB_HOTPLUG_EVENT_DEVICE_ARRIVED, libusb_ref_device(device));
    return 0;
}

void joinFinishedDeliveries(bool all)
{
    std::vector<std::thread> done;
    {
        std::lock_guard<std::mutex> lock(state().mutex);
        auto& deliveries = state().deliveries;
        for (auto it = deliveries.begin(); it != deliveries.end();) {
            if (all || *it->finished) {
                done.push_back(std::move(it->thread));
                it = deliveries.erase(it);
            } else {
                ++it;
            }
        }
    }
    for (auto& thread : done) thread.join();
}

// The whole of one arrival's handling by the module, on the thread made for it.
void serveArrival(const std::shared_ptr<Device>& device, const std::shared_ptr<std::atomic<bool>>& finished)
{
    setCurrentDevice(device.get());
    device->beginDelivery();
    tree().deliver(kListenerArrival, device.get());
    UpdateRecord record = device->endDelivery();
    HostEvent event;
    event.kind = HostEvent::Kind::update;
    event.update = record;
    emit(std::move(event));
    setCurrentDevice(nullptr);
    {
        std::lock_guard<std::mutex> lock(state().mutex);
        state().finished.push_back(record);
        --state().running;
    }
    state().deliveriesChanged.notify_all();
    *finished = true;
}

void deliverArrival(std::shared_ptr<Device> device)
{
    auto finished = std::make_shared<std::atomic<bool>>(false);
    std::lock_guard<std::mutex> lock(state().mutex);
    ++state().running;
    state().deliveries.push_back({std::thread(serveArrival, device, finished), finished});
}

void skip(const Device& device, const char* why)
{
    HostEvent event;
    event.kind = HostEvent::Kind::skipped;
    event.text = why;
    emit(std::move(event), &device);
}

// A device on the bus: remembered, reported, and handed to the module unless
// the policy says otherwise.
bool arrived(libusb_device* usbDevice, bool atStart)
{
    HostState& host = state();
    {
        std::lock_guard<std::mutex> lock(host.mutex);
        if (host.devices.count(usbDevice) != 0) return false;  // seen both in the list and as an event
    }
    libusb_device_descriptor descriptor;
    if (libusb_get_device_descriptor(usbDevice, &descriptor) != 0) return false;
    DeviceInfo info;
    info.busPath = busPathOf(usbDevice);
    info.vendorId = descriptor.idVendor;
    info.productId = descriptor.idProduct;
    if (info.vendorId != kFamilyVendorId) return false;
    info.serial = sysfsSerial(info.busPath);
    if (info.serial.empty() && !host.options.serials.empty())
        info.serial = descriptorSerial(usbDevice, descriptor.iSerialNumber);
    if (!selected(host.options, info)) return false;

    auto device = std::make_shared<Device>(usbDevice, descriptor, info);
    bool comeback = false;
    int loaderComebacks = 0;
    {
        std::lock_guard<std::mutex> lock(host.mutex);
        host.devices[usbDevice] = device;
        if (atStart) host.presentAtStart.push_back(info.busPath);
        auto it = host.restarted.find(info.busPath);
        if (it != host.restarted.end() && !it->second.seen) {
            it->second.seen = true;
            it->second.inLoaderMode = device->isLoader();
            it->second.productId = info.productId;
            comeback = true;
            if (device->isLoader()) {
                loaderComebacks = ++host.loaderComebacksInARow[info.busPath];
            } else {
                host.loaderComebacksInARow.erase(info.busPath);
            }
        }
    }
    HostEvent event;
    event.kind = HostEvent::Kind::arrived;
    event.text = comeback ? "back after its restart" : (atStart ? "present at start" : "arrived");
    emit(std::move(event), device.get());

    if (!host.deliverArrivals) {
        skip(*device, "arrived while the program is stopping; not handed to the loader");
    } else if (loaderComebacks > kLoaderComebacksUpdated) {
        skip(*device, "came back in loader mode after each of its last restarts; not updated again until it is "
                      "plugged in anew");
    } else if (!atStart && device->isLoader() && !host.deliverNewLoaderArrivals) {
        skip(*device, comeback ? "came back in loader mode; not updated again in once mode"
                               : "arrived after the start; once mode updates only devices present at the start");
    } else {
        deliverArrival(device);
        return true;
    }
    return false;
}

void left(libusb_device* usbDevice)
{
    std::shared_ptr<Device> device;
    {
        std::lock_guard<std::mutex> lock(state().mutex);
        auto it = state().devices.find(usbDevice);
        if (it == state().devices.end()) return;
        device = it->second;
        state().devices.erase(it);
    }
    device->markGone();
    if (!device->restarted()) {
        std::lock_guard<std::mutex> lock(state().mutex);
        state().loaderComebacksInARow.erase(device->info().busPath);  // unplugged: a fresh start when it is back
    }
    HostEvent event;
    event.kind = HostEvent::Kind::left;
    event.text = device->restarted() ? "left the bus to restart" : "left the bus";
    emit(std::move(event), device.get());
    tree().deliver(kListenerRemoval, device.get());
}

}  // namespace

bool start(const HostOptions& options, std::string& error)
{
    HostState& host = state();
    host.options = options;
    if (host.options.transferTimeoutMs == 0) host.options.transferTimeoutMs = kDefaultTransferTimeoutMs;
    int result = libusb_init(&host.context);
    if (result != 0) {
        error = std::string("cannot start libusb: ") + libusb_error_name(result);
        return false;
    }
    if (!libusb_has_capability(LIBUSB_CAP_HAS_HOTPLUG)) {
        error = "this libusb cannot report device arrivals and removals";
        libusb_exit(host.context);
        host.context = nullptr;
        return false;
    }
    auto events =
        static_cast<libusb_hotplug_event>(LIBUSB_HOTPLUG_EVENT_DEVICE_ARRIVED | LIBUSB_HOTPLUG_EVENT_DEVICE_LEFT);
    result = libusb_hotplug_register_callback(host.context, events, static_cast<libusb_hotplug_flag>(0),
                                              kFamilyVendorId, LIBUSB_HOTPLUG_MATCH_ANY, LIBUSB_HOTPLUG_MATCH_ANY,
                                              onHotplug, nullptr, &host.hotplug);
    if (result != 0) {
        error = std::string("cannot watch the bus: ") + libusb_error_name(result);
        libusb_exit(host.context);
        host.context = nullptr;
        return false;
    }
    std::lock_guard<std::mutex> lock(host.mutex);
    host.started = true;
    return true;
}

tStatus callModuleMain(uint32_t reason)
{
    tModuleMain moduleMain = nullptr;
    {
        std::lock_guard<std::mutex> lock(state().mutex);
        if (state().module != nullptr) moduleMain = state().module->moduleMain;
    }
    if (moduleMain == nullptr) {
        reportMisuse("module main called while no module is registered");
        return kBadArgument;
    }
    return moduleMain(reason);
}

size_t announcePresentDevices()
{
    libusb_device** list = nullptr;
    ssize_t count = libusb_get_device_list(state().context, &list);
    size_t delivered = 0;
    for (ssize_t i = 0; i < count; ++i) delivered += arrived(list[i], true) ? 1 : 0;
    if (count >= 0) libusb_free_device_list(list, 1);
    return delivered;
}

void pumpEvents(int timeoutMs)
{
    timeval timeout{timeoutMs / 1000, (timeoutMs % 1000) * 1000};
    libusb_handle_events_timeout_completed(state().context, &timeout, nullptr);
    std::vector<std::pair<bool, libusb_device*>> events;
    {
        std::lock_guard<std::mutex> lock(state().mutex);
        events.swap(state().pendingEvents);
    }
    for (const auto& [arrival, device] : events) {
        if (arrival) {
            arrived(device, false);
        } else {
            left(device);
        }
        libusb_unref_device(device);
    }
    joinFinishedDeliveries(false);
}

void setDeliverNewLoaderArrivals(bool deliver)
{
    state().deliverNewLoaderArrivals = deliver;
}

void stopDeliveringArrivals()
{
    state().deliverArrivals = false;
}

void abandonUpdates()
{
    state().abandoning = true;
}

size_t updatesRunning()
{
    std::lock_guard<std::mutex> lock(state().mutex);
    return state().running;
}

bool waitForUpdates(int timeoutMs)
{
    std::unique_lock<std::mutex> lock(state().mutex);
    return state().deliveriesChanged.wait_for(lock, std::chrono::milliseconds(timeoutMs),
                                              [] { return state().running == 0; });
}

std::vector<UpdateRecord> finishedUpdates()
{
    std::lock_guard<std::mutex> lock(state().mutex);
    return state().finished;
}

std::vector<Comeback> comebacks()
{
    std::lock_guard<std::mutex> lock(state().mutex);
    std::vector<Comeback> result;
    for (const auto& entry : state().restarted) result.push_back(entry.second);
    return result;
}

std::vector<std::string> leftovers()
{
    std::vector<std::string> result;
    if (allocator().liveBlocks() != 0) {
        result.push_back(std::to_string(allocator().liveBlocks()) + " host allocation(s) live (" +
                         std::to_string(allocator().liveBytes()) + " bytes)");
    }
    if (tree().liveListeners() != 0)
        result.push_back(std::to_string(tree().liveListeners()) + " listener record(s) still added");
    if (tree().liveQueries() != 0)
        result.push_back(std::to_string(tree().liveQueries()) + " device query(ies) not released");
    std::lock_guard<std::mutex> lock(state().mutex);
    size_t streams = 0;
    for (const auto& entry : state().devices) streams += entry.second->openStreams();
    if (streams != 0) result.push_back(std::to_string(streams) + " control stream(s) open");
    return result;
}

size_t misuseCount()
{
    return state().misuse;
}

void shutdown()
{
    HostState& host = state();
    joinFinishedDeliveries(true);
    if (host.context == nullptr) return;
    libusb_hotplug_deregister_callback(host.context, host.hotplug);
    std::vector<std::pair<bool, libusb_device*>> events;
    {
        std::lock_guard<std::mutex> lock(host.mutex);
        events.swap(host.pendingEvents);
        host.devices.clear();
        host.started = false;
    }
    for (const auto& event : events) libusb_unref_device(event.second);
    libusb_exit(host.context);
    host.context = nullptr;
}

}  // namespace usbhost
