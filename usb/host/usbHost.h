// The host library over libusb-1.0: what the program morvanek-usb uses to run
// the unchanged module against real USB devices. The module sees only the host
// interfaces it always sees; this header is the program's side.
//
// Every operation may be called from any thread; the host's allocator, event
// log and device tree are shared by the threads that serve arrivals.
#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "../../host/karvelkStatus.h"

namespace usbhost {

// Failures the host reports to the module; distinct, so a log can tell them apart.
constexpr tStatus kStalled = -53001;         // the device refused the request (a STALL)
constexpr tStatus kDeviceGone = -53002;      // unplugged, or it left the bus to restart
constexpr tStatus kTimedOut = -53003;        // no answer within the transfer time-out
constexpr tStatus kTransferFailed = -53004;  // any other USB error (I/O, babble, overflow)
constexpr tStatus kShortTransfer = -53005;   // an IN data stage came back shorter than asked
constexpr tStatus kAccessDenied = -53006;    // the device node is not ours to open
constexpr tStatus kOutOfMemory = -53007;
constexpr tStatus kBadArgument = -53008;  // misuse of an interface; also reported as such
constexpr tStatus kUnknownAttribute = -53009;
constexpr tStatus kAbandoned = -53010;  // the program is stopping and gave up the update

// Page erases stall the loader's CPU for a few milliseconds per page; five
// seconds leaves a wide margin over that and over a busy hub.
constexpr unsigned kDefaultTransferTimeoutMs = 5000;

constexpr uint16_t kFamilyVendorId = 0x5C1D;

// Attribute 21 of a device: its bus number and its address on that bus,
// (bus << 8) | address. Never 0xFFFFFFFF, so it never bars an update.
uint32_t locationAttribute(uint8_t bus, uint8_t address);

struct DeviceInfo {
    std::string busPath;  // "1-3.2": bus number, then the hub ports down to the device
    uint16_t vendorId = 0;
    uint16_t productId = 0;
    std::string serial;  // the USB serial-number string; empty when the device has none
};

// What happened to a device on one delivery to the module.
enum class Outcome {
    ignored,    // the module did not talk to it (not a loader-mode device, or filtered)
    updated,    // programmed and told to restart
    failed,     // the module talked to it and stopped without restarting it
    abandoned,  // the program stopped it part-way
};
const char* outcomeName(Outcome outcome);

struct UpdateRecord {
    DeviceInfo device;
    Outcome outcome = Outcome::ignored;
    tStatus firstFailure = 0;  // the first failed transfer's status, 0 if none failed
    unsigned requests = 0;
    unsigned pagesErased = 0;
    unsigned blocksWritten = 0;  // data writes of the image; the marker is not counted
    double seconds = 0;
};

// Everything the host has to tell; delivered from whichever thread it happens on.
struct HostEvent {
    enum class Kind {
        arrived,   // a device of the family arrived (or was found at start)
        left,      // it left the bus
        skipped,   // arrived but not delivered to the module; text says why
        progress,  // an erase or a block write went through
        update,    // the module returned from a device; see update
        log,       // an event-log line of the module
        debug,     // a debug line (ssprintf) of the module
        problem,   // something the user has to act on, such as access to a device node
        misuse,    // the module broke a rule of the host's interfaces
    };
    Kind kind = Kind::log;
    bool hasDevice = false;
    DeviceInfo device;
    // log: component, location, level, tag, format, text; debug and problem: text.
    std::string component, location, tag, format, text;
    uint32_t level = 0;
    UpdateRecord update;  // update, and progress (counts so far)
};

struct HostOptions {
    unsigned transferTimeoutMs = kDefaultTransferTimeoutMs;
    // Devices shown to the module; empty lists: every device of the family.
    std::vector<std::string> busPaths;
    std::vector<std::string> serials;
    std::function<void(const HostEvent&)> observer;  // called from many threads; must be thread-safe
};

// Starts libusb and watches the bus. False with a message when USB cannot be used.
bool start(const HostOptions& options, std::string& error);

// Calls the registered module's main with the reason, as the host does.
tStatus callModuleMain(uint32_t reason);

// Delivers every selected device present now to the module's arrival
// listeners, each on a thread of its own. Returns how many were delivered.
size_t announcePresentDevices();

// Runs libusb's event handling for up to the time given, and delivers the
// arrivals and removals it saw. Call it from one thread only.
void pumpEvents(int timeoutMs);

// Whether arrivals of loader-mode devices that were not present at start are
// handed to the module (watch) or only reported (once).
void setDeliverNewLoaderArrivals(bool deliver);

// No new arrival is delivered from now on (removals still are).
void stopDeliveringArrivals();
// Every transfer from now on fails with kAbandoned, so running updates end
// after the request they are in.
void abandonUpdates();

// Deliveries to the module that have not returned yet.
size_t updatesRunning();
// Waits until none is running or the time has passed; true when none is.
bool waitForUpdates(int timeoutMs);

// The outcome of every delivery so far, in the order they ended.
std::vector<UpdateRecord> finishedUpdates();

// Whether a device restarted by an update has come back on the same port, and as what.
struct Comeback {
    std::string busPath;
    bool seen = false;
    bool inLoaderMode = false;
    uint16_t productId = 0;
};
std::vector<Comeback> comebacks();

// What is still held: host allocations, open streams, listeners, queries; empty when nothing.
std::vector<std::string> leftovers();
size_t misuseCount();

// Stops libusb. The module must have been stopped and unloaded first.
void shutdown();

}  // namespace usbhost
