#include "usbDevice.h"

#include <algorithm>
#include <cstring>

#include "hostState.h"

namespace usbhost {

namespace {

constexpr uint32_t kAttributeVendorId = 1;
constexpr uint32_t kAttributeProductId = 2;
constexpr uint32_t kAttributeLocation = 21;

constexpr uint8_t kVendorOut = 0x40;
constexpr uint8_t kMemoryRequest = 0xB0;
constexpr uint8_t kPageErase = 0xB9;
constexpr uint8_t kRestart = 0xBA;
const uint8_t kCompletionMarker[] = {0xAA, 0x55};

const char* kAccessAdvice = "cannot open the device node: permission denied. Install the udev rule "
                            "70-morvanek.rules (it gives the logged-in user access to 5C1D:4A10 and 5C1D:4A20 "
                            "with TAG+=\"uaccess\"), then unplug and replug the device, or run as a user with access "
                            "to /dev/bus/usb";

bool sameLocation(libusb_device* candidate, uint8_t bus, uint8_t address, const std::vector<uint8_t>& ports)
{
    if (libusb_get_bus_number(candidate) != bus || libusb_get_device_address(candidate) != address) return false;
    uint8_t candidatePorts[8];
    int count = libusb_get_port_numbers(candidate, candidatePorts, sizeof candidatePorts);
    return count >= 0 && std::vector<uint8_t>(candidatePorts, candidatePorts + count) == ports;
}

}  // namespace

Device::Device(libusb_device* device, const libusb_device_descriptor& descriptor, DeviceInfo info)
    : device_(libusb_ref_device(device)), descriptor_(descriptor), info_(std::move(info))
{
}

Device::~Device()
{
    closeHandle();
    libusb_unref_device(device_);
}

uint32_t Device::getAttribute(uint32_t id, tStatus* status)
{
    if (status != nullptr && *status < 0) return 0;
    switch (id) {
    case kAttributeVendorId:
        return descriptor_.idVendor;
    case kAttributeProductId:
        return descriptor_.idProduct;
    case kAttributeLocation:
        return locationAttribute(libusb_get_bus_number(device_), libusb_get_device_address(device_));
    default:
        if (status != nullptr) setFailure(*status, kUnknownAttribute);
        return 0;
    }
}

void Device::getDescriptor(nQVKORD100::tUSBDeviceDescriptorProxy* proxy, tStatus& status)
{
    if (status < 0) return;
    if (proxy == nullptr) {
        reportMisuse("getDescriptor with no descriptor proxy");
        setFailure(status, kBadArgument);
        return;
    }
    if (gone_) {
        setFailure(status, kDeviceGone);
        return;
    }
    // As it crossed the bus: little-endian words.
    const libusb_device_descriptor& d = descriptor_;
    uint8_t* out = proxy->descriptor;
    out[0] = d.bLength;
    out[1] = d.bDescriptorType;
    out[2] = static_cast<uint8_t>(d.bcdUSB);
    out[3] = static_cast<uint8_t>(d.bcdUSB >> 8);
    out[4] = d.bDeviceClass;
    out[5] = d.bDeviceSubClass;
    out[6] = d.bDeviceProtocol;
    out[7] = d.bMaxPacketSize0;
    out[8] = static_cast<uint8_t>(d.idVendor);
    out[9] = static_cast<uint8_t>(d.idVendor >> 8);
    out[10] = static_cast<uint8_t>(d.idProduct);
    out[11] = static_cast<uint8_t>(d.idProduct >> 8);
    out[12] = static_cast<uint8_t>(d.bcdDevice);
    out[13] = static_cast<uint8_t>(d.bcdDevice >> 8);
    out[14] = d.iManufacturer;
    out[15] = d.iProduct;
    out[16] = d.iSerialNumber;
    out[17] = d.bNumConfigurations;
    proxy->length = 18;
}

ControlStream* Device::openStream(nQVKORD100::tControlStreamParameterUSB* parameter, tStatus& status)
{
    if (status < 0) return nullptr;
    talkedTo_ = true;
    if (parameter == nullptr || parameter->first != 3 || parameter->second != 0) {
        reportMisuse("openStream without a control stream parameter of 3 and 0");
        setFailure(status, kBadArgument);
        return nullptr;
    }
    tStatus opened = gone_ ? kDeviceGone : openHandle();
    if (opened < 0) {
        if (record_.firstFailure == 0) record_.firstFailure = opened;
        setFailure(status, opened);
        return nullptr;
    }
    std::lock_guard<std::mutex> lock(mutex_);
    streams_.push_back(std::make_unique<Stream>(*this));
    return streams_.back().get();
}

void Device::closeStream(ControlStream* stream, tStatus& status)
{
    if (status < 0) return;
    std::unique_lock<std::mutex> lock(mutex_);
    auto it = std::find_if(streams_.begin(), streams_.end(), [&](const auto& s) { return s.get() == stream; });
    if (it == streams_.end() || !(*it)->open) {
        lock.unlock();
        reportMisuse("closeStream of a stream that is not open");
        setFailure(status, kBadArgument);
        return;
    }
    (*it)->open = false;
    bool anyOpen = std::any_of(streams_.begin(), streams_.end(), [](const auto& s) { return s->open; });
    lock.unlock();
    // Nothing of the device stays open between updates, so a restart never
    // finds us holding its node.
    if (!anyOpen) closeHandle();
}

size_t Device::openStreams() const
{
    std::lock_guard<std::mutex> lock(mutex_);
    return static_cast<size_t>(std::count_if(streams_.begin(), streams_.end(), [](const auto& s) { return s->open; }));
}

// Each device gets a libusb context of its own: its transfers are waited for
// by its own thread, so a slow or silent device never holds up another's.
tStatus Device::openHandle()
{
    std::lock_guard<std::mutex> lock(mutex_);
    if (handle_ != nullptr) return 0;
    libusb_context* context = nullptr;
    if (libusb_init(&context) != 0) return kTransferFailed;
    uint8_t ports[8];
    int portCount = libusb_get_port_numbers(device_, ports, sizeof ports);
    std::vector<uint8_t> portPath(ports, ports + std::max(portCount, 0));
    uint8_t bus = libusb_get_bus_number(device_);
    uint8_t address = libusb_get_device_address(device_);

    libusb_device** list = nullptr;
    ssize_t count = libusb_get_device_list(context, &list);
    libusb_device* found = nullptr;
    for (ssize_t i = 0; i < count; ++i) {
        if (sameLocation(list[i], bus, address, portPath)) found = list[i];
    }
    int result = found != nullptr ? libusb_open(found, &handle_) : LIBUSB_ERROR_NO_DEVICE;
    if (count >= 0) libusb_free_device_list(list, 1);
    if (result != 0) {
        handle_ = nullptr;
        libusb_exit(context);
        if (result == LIBUSB_ERROR_ACCESS) {
            HostEvent event;
            event.kind = HostEvent::Kind::problem;
            event.text = kAccessAdvice;
            emit(std::move(event), this);
        }
        return statusFromLibusb(result);
    }
    ownContext_ = context;
    return 0;
}

void Device::closeHandle()
{
    std::lock_guard<std::mutex> lock(mutex_);
    if (handle_ != nullptr) libusb_close(handle_);
    if (ownContext_ != nullptr) libusb_exit(ownContext_);
    handle_ = nullptr;
    ownContext_ = nullptr;
}

void Device::beginDelivery()
{
    record_ = UpdateRecord();
    record_.device = info_;
    talkedTo_ = false;
    deliveryStart_ = std::chrono::steady_clock::now();
}

UpdateRecord Device::endDelivery()
{
    record_.seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - deliveryStart_).count();
    if (restarted_) {
        record_.outcome = Outcome::updated;
    } else if (record_.firstFailure == kAbandoned) {
        record_.outcome = Outcome::abandoned;
    } else if (talkedTo_) {
        record_.outcome = Outcome::failed;
    } else {
        record_.outcome = Outcome::ignored;
    }
    return record_;
}

tStatus Device::controlTransfer(const nQVKORD100::tTransferParameterUSBControl& request)
{
    // A device told to restart can leave the bus and come back before this
    // thread sees the transfer end, so the restart is noted before it is sent.
    bool restart = request.bmRequestType == kVendorOut && request.bRequest == kRestart;
    if (restart) expectRestart(true);
    tStatus outcome = 0;
    if (state().abandoning) {
        outcome = kAbandoned;
    } else if (gone_ || handle_ == nullptr) {
        outcome = kDeviceGone;
    } else {
        unsigned timeout = state().options.transferTimeoutMs;
        int result = libusb_control_transfer(handle_, request.bmRequestType, request.bRequest, request.wValue,
                                             request.wIndex, static_cast<unsigned char*>(request.data),
                                             static_cast<uint16_t>(request.length), timeout);
        bool in = (request.bmRequestType & LIBUSB_ENDPOINT_IN) != 0;
        if (result < 0) {
            outcome = statusFromLibusb(result);
            if (outcome == kDeviceGone) gone_ = true;
        } else if (in && static_cast<uint32_t>(result) < request.length) {
            // The module cannot see how many bytes came; the rest of its
            // buffer would be stale bytes taken for the device's.
            outcome = kShortTransfer;
        }
    }
    if (restart && outcome < 0) expectRestart(false);
    count(request, outcome);
    return outcome;
}

void Device::expectRestart(bool expected)
{
    restarted_ = expected;
    std::lock_guard<std::mutex> lock(state().mutex);
    if (expected) {
        state().restarted[info_.busPath] = Comeback{info_.busPath};
    } else {
        state().restarted.erase(info_.busPath);
    }
}

void Device::count(const nQVKORD100::tTransferParameterUSBControl& request, tStatus outcome)
{
    ++record_.requests;
    if (outcome < 0) {
        if (record_.firstFailure == 0) record_.firstFailure = outcome;
        return;
    }
    if (request.bmRequestType != kVendorOut) return;
    bool progress = false;
    if (request.bRequest == kPageErase) {
        ++record_.pagesErased;
        progress = true;
    } else if (request.bRequest == kMemoryRequest && record_.pagesErased != 0) {
        bool marker = request.length == sizeof kCompletionMarker &&
                      std::memcmp(request.data, kCompletionMarker, sizeof kCompletionMarker) == 0;
        if (!marker) {
            ++record_.blocksWritten;
            progress = true;
        }
    }
    if (progress) {
        HostEvent event;
        event.kind = HostEvent::Kind::progress;
        event.update = record_;
        emit(std::move(event), this);
    }
}

void* Stream::allocateBuffer(uint32_t size, tStatus& status)
{
    if (status < 0) return nullptr;
    if (!open) {
        reportMisuse("allocateBuffer on a closed stream");
        setFailure(status, kBadArgument);
        return nullptr;
    }
    void* buffer = allocator().allocate(size, &status);
    if (buffer != nullptr) buffers_[static_cast<const uint8_t*>(buffer)] = size;
    return buffer;
}

void Stream::freeBuffer(void* buffer, tStatus& status)
{
    if (status < 0) return;
    auto it = buffers_.find(static_cast<const uint8_t*>(buffer));
    if (!open || it == buffers_.end()) {
        reportMisuse(open ? "freeBuffer of a buffer this stream did not hand out" : "freeBuffer on a closed stream");
        setFailure(status, kBadArgument);
        return;
    }
    buffers_.erase(it);
    allocator().release(buffer);
}

void Stream::transfer(nQVKORD100::tTransferParameterUSBControl* request, tStatus& status)
{
    if (status < 0) return;
    if (request == nullptr || !open) {
        reportMisuse(request == nullptr ? "transfer with no request" : "transfer on a closed stream");
        setFailure(status, kBadArgument);
        return;
    }
    // A control data stage is at most 0xFFFF bytes, and it must lie in a
    // buffer of this stream: that is where the module expects IN data.
    if (request->length > 0xFFFF || (request->length != 0 && !insideLiveBuffer(request->data, request->length))) {
        reportMisuse("transfer whose data stage is not inside a live buffer of its stream");
        setFailure(status, kBadArgument);
        return;
    }
    tStatus outcome = device_.controlTransfer(*request);
    if (outcome < 0) setFailure(status, outcome);
}

bool Stream::insideLiveBuffer(const void* data, uint32_t length) const
{
    const uint8_t* start = static_cast<const uint8_t*>(data);
    if (start == nullptr || buffers_.empty()) return false;
    auto it = buffers_.upper_bound(start);
    if (it == buffers_.begin()) return false;
    --it;
    size_t offset = static_cast<size_t>(start - it->first);
    return offset < it->second && length <= it->second - offset;
}

}  // namespace usbhost
