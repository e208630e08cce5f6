// One emulated device of the family as a piece of hardware: its flash, the
// faults it is told to have, the trace of what it was asked, its virtual clock.
// Each time it enumerates, a new UsbDeviceSim stands for it in the host's tree
// (LoaderModeDevice in loader mode, ProductDevice once its firmware runs); all
// of them share this one object.
#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "../host/simHost.h"
#include "deviceFaults.h"
#include "flashMemory.h"
#include "requestTrace.h"
#include "timingModel.h"

namespace sim {

class EnumeratedDevice;
class LoaderModeDevice;

constexpr uint16_t kDeviceFamilyVendorId = 0x5C1D;

// Where a loader keeps the firmware and the identity block, by the product ID it enumerates with.
struct LoaderFlashLayout {
    uint16_t loaderProductId;
    uint16_t firmwareBase;
    uint16_t identityPage;
};
const LoaderFlashLayout* findLoaderFlashLayout(uint16_t loaderProductId);  // null: no such loader

// The identity block's fields in host order; in flash each is big-endian.
struct IdentityValues {
    uint16_t vendorId = kDeviceFamilyVendorId;
    uint16_t productId = 0xFFFF;
    uint32_t serialNumber = 0xFFFFFFFF;
    uint16_t productIdCopy = 0xFFFF;
    uint16_t altProductId = 0xFFFF;
};

struct MemoryBytes {
    uint16_t address = 0;
    std::vector<uint8_t> bytes;
};

struct EmulatedDeviceOptions {
    std::string name;
    // The USB attributes 2 and 1 the loader enumerates with: 32-bit values of
    // which the module compares the low 16 bits, as the flash layout is chosen.
    uint32_t loaderProductId = 0x4A10;
    uint32_t vendorId = kDeviceFamilyVendorId;  // the loader's own, not the identity block's
    uint32_t attribute21 = 0;
    // Initial flash, over a blank part: the identity block, an image already
    // installed at the firmware base, then any further bytes, in that order.
    std::optional<IdentityValues> identity;
    std::vector<uint8_t> image;
    std::vector<MemoryBytes> memory;
    DeviceFaults faults;
    std::optional<TimingModel> timing;
    bool trace = true;
    int maxLoaderComebacks = 3;  // restarts in a row that come back in loader mode and are announced
};

class PhysicalDevice : public std::enable_shared_from_this<PhysicalDevice> {
public:
    explicit PhysicalDevice(const EmulatedDeviceOptions& options);

    FlashMemory flash;
    DeviceFaults faults;
    std::optional<TimingModel> timing;
    bool traceEnabled = true;
    std::vector<RequestRecord> trace;
    std::chrono::microseconds elapsed{0};  // virtual time spent on requests
    std::vector<std::string> notes;         // what the lab may want to show; not errors
    uint64_t transferBufferRequests = 0;    // allocateBuffer calls on its streams, over its life
    // Called after each request has been carried out (or refused), before it
    // goes to the trace and before a restart re-enumerates the device; the
    // flash already shows the request's effect. For observers such as the lab.
    std::function<void(const PhysicalDevice&, const RequestRecord&)> requestObserver;

    const EmulatedDeviceOptions& options() const { return options_; }
    const LoaderFlashLayout* layout() const
    {
        return findLoaderFlashLayout(static_cast<uint16_t>(options_.loaderProductId));
    }
    uint64_t requestCount() const { return requests_; }
    uint64_t readRequestCount() const { return readRequests_; }
    int loaderComebacks() const { return loaderComebacks_; }
    bool unplugged() const { return unplugged_; }
    // The enumeration that currently stands for the device, or null when it is unplugged.
    EnumeratedDevice* current() const { return current_; }

    // Flash helpers for tests and scenarios; they need the loader's flash layout.
    void setIdentity(const IdentityValues& identity);
    IdentityValues identity() const;
    void loadImage(const std::vector<uint8_t>& image);
    std::vector<uint8_t> readMemory(uint16_t address, size_t count) const { return flash.read(address, count); }
    bool completionMarkerInPlace() const;

    // How the device starts when it is plugged in: held in its loader, in
    // its firmware, or as it starts at power-up, which is what the restart
    // does too: the firmware when the completion marker is in place, the
    // loader otherwise. Its flash is whatever it held when it was pulled out.
    enum class PowerUp { loader, firmware, asFlashSays };

    // Comes into the tree and is announced, after any earlier enumeration of
    // it and in that one's place in the host's search order (it stays on its
    // port). An unplugAtRequest fault that has fired is spent; one that has
    // not stays armed (request numbers count over the device's life). The
    // count of loader-mode comebacks starts again.
    EnumeratedDevice& plugIn(DeviceTreeSim& tree, PowerUp how);
    LoaderModeDevice& plugIn(DeviceTreeSim& tree);  // held in its loader
    bool everPluggedIn() const { return lastEnumeration_ != nullptr; }
    // Pulled out: the current enumeration is gone and its removal delivered.
    void unplug();

    // Called by the loader-mode enumeration's streams. refusal is the host's
    // verdict before the device sees the request (0 when it passes); the
    // result is the transfer's outcome.
    tStatus serve(nQVKORD100::tTransferParameterUSBControl& request, tStatus refusal);
    // What the next request will come to by its setup packet alone, before
    // any OUT data stage: a stall or a disconnect (0 when the data decides,
    // or nothing stops it). A bus whose controller accepts an OUT data stage
    // as it arrives must refuse such a request before it takes the data.
    tStatus outcomeBeforeData(const nQVKORD100::tTransferParameterUSBControl& request) const;

    // Called by an enumeration as it is made and destroyed. Only one is live
    // at a time: one made while another stands for the device starts gone.
    void attach(EnumeratedDevice& enumeration);
    void forget(const EnumeratedDevice& enumeration);

private:
    tStatus carryOut(nQVKORD100::tTransferParameterUSBControl& request, RequestRecord& record);
    void leaveLoaderMode();
    void disconnect();  // the current enumeration leaves the tree
    DeviceTreeSim& treeOf(const EnumeratedDevice& enumeration) const;

    EmulatedDeviceOptions options_;
    EnumeratedDevice* current_ = nullptr;
    const UsbDeviceSim* lastEnumeration_ = nullptr;  // where the next enumeration takes its place; never read through
    bool unplugFired_ = false;
    uint64_t requests_ = 0;
    uint64_t enumerations_ = 0;  // live enumerations so far
    uint64_t readRequests_ = 0;
    int loaderComebacks_ = 0;
    bool unplugged_ = false;
};

// A device built from options, not yet in any tree.
std::shared_ptr<PhysicalDevice> makeEmulatedDevice(const EmulatedDeviceOptions& options);
// A device built from options, plugged into the host's tree in loader mode.
LoaderModeDevice& plugInLoaderDevice(const EmulatedDeviceOptions& options = {});

}  // namespace sim
