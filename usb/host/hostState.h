// The host's shared state: one per process, guarded for the threads that
// serve arrivals side by side.
#pragma once

#include <libusb.h>

#include <atomic>
#include <condition_variable>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "../../host/deviceTree.h"
#include "../../host/moduleRecords.h"
#include "usbHost.h"

namespace usbhost {

class Device;

// Counts live blocks so that leftovers show; safe for any thread.
class Allocator {
  public:
    void* allocate(size_t size, tStatus* status);
    bool release(void* pointer);  // false: not a block of ours
    size_t liveBlocks() const;
    size_t liveBytes() const;

  private:
    mutable std::mutex mutex_;
    std::map<void*, size_t> live_;
};

class Tree;
Tree& tree();

struct Delivery {
    std::thread thread;
    std::shared_ptr<std::atomic<bool>> finished;
};

struct HostState {
    std::mutex mutex;  // guards everything below that is not atomic
    HostOptions options;
    libusb_context* context = nullptr;  // enumeration and hotplug; transfers use each device's own
    libusb_hotplug_callback_handle hotplug = 0;
    bool started = false;
    _tLibModuleInfo* module = nullptr;

    std::atomic<bool> deliverArrivals{true};
    std::atomic<bool> deliverNewLoaderArrivals{true};
    std::atomic<bool> abandoning{false};
    std::atomic<size_t> misuse{0};

    // Devices on the bus now, by libusb's object for them.
    std::map<libusb_device*, std::shared_ptr<Device>> devices;
    // Hotplug events seen inside libusb's event handling, delivered after it.
    std::vector<std::pair<bool, libusb_device*>> pendingEvents;  // true: arrival; each holds a reference
    std::vector<std::string> presentAtStart;                     // bus paths
    std::map<std::string, Comeback> restarted;                   // by bus path
    std::map<std::string, int> loaderComebacksInARow;            // by bus path

    std::vector<Delivery> deliveries;
    size_t running = 0;
    std::condition_variable deliveriesChanged;
    std::vector<UpdateRecord> finished;
};

HostState& state();
Allocator& allocator();

// Sends an event to the program's observer; the device is the one the calling
// thread serves, if any, unless one is given.
void emit(HostEvent event, const Device* device = nullptr);
void reportMisuse(const std::string& what);

// The device whose delivery the calling thread is running, or null.
const Device* currentDevice();
void setCurrentDevice(const Device* device);

tStatus statusFromLibusb(int error);

}  // namespace usbhost
