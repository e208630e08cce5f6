#include "hostState.h"

#include "usbDevice.h"

namespace usbhost {

namespace {
thread_local const Device* tServedDevice = nullptr;
}

void* Allocator::allocate(size_t size, tStatus* status)
{
    if (status != nullptr && *status < 0) return nullptr;
    void* block = ::operator new(size == 0 ? 1 : size, std::nothrow);
    if (block == nullptr) {
        if (status != nullptr) setFailure(*status, kOutOfMemory);
        return nullptr;
    }
    std::lock_guard<std::mutex> lock(mutex_);
    live_[block] = size;
    return block;
}

bool Allocator::release(void* pointer)
{
    if (pointer == nullptr) return true;
    {
        std::lock_guard<std::mutex> lock(mutex_);
        auto it = live_.find(pointer);
        if (it == live_.end()) return false;
        live_.erase(it);
    }
    ::operator delete(pointer);
    return true;
}

size_t Allocator::liveBlocks() const
{
    std::lock_guard<std::mutex> lock(mutex_);
    return live_.size();
}

size_t Allocator::liveBytes() const
{
    std::lock_guard<std::mutex> lock(mutex_);
    size_t bytes = 0;
    for (const auto& block : live_) bytes += block.second;
    return bytes;
}

HostState& state()
{
    static HostState instance;
    return instance;
}

Allocator& allocator()
{
    static Allocator instance;
    return instance;
}

const Device* currentDevice()
{
    return tServedDevice;
}

void setCurrentDevice(const Device* device)
{
    tServedDevice = device;
}

void emit(HostEvent event, const Device* device)
{
    if (device == nullptr) device = tServedDevice;
    if (device != nullptr && !event.hasDevice) {
        event.hasDevice = true;
        event.device = device->info();
    }
    // The observer is fixed before the first thread starts and never changes.
    const auto& observer = state().options.observer;
    if (observer) observer(event);
}

void reportMisuse(const std::string& what)
{
    ++state().misuse;
    HostEvent event;
    event.kind = HostEvent::Kind::misuse;
    event.text = what;
    emit(std::move(event));
}

tStatus statusFromLibusb(int error)
{
    switch (error) {
    case LIBUSB_ERROR_PIPE:
        return kStalled;
    case LIBUSB_ERROR_NO_DEVICE:
    case LIBUSB_ERROR_NOT_FOUND:
        return kDeviceGone;
    case LIBUSB_ERROR_TIMEOUT:
        return kTimedOut;
    case LIBUSB_ERROR_ACCESS:
        return kAccessDenied;
    case LIBUSB_ERROR_NO_MEM:
        return kOutOfMemory;
    default:
        return kTransferFailed;
    }
}

uint32_t locationAttribute(uint8_t bus, uint8_t address)
{
    return static_cast<uint32_t>(bus) << 8 | address;
}

const char* outcomeName(Outcome outcome)
{
    switch (outcome) {
    case Outcome::ignored:
        return "ignored";
    case Outcome::updated:
        return "updated";
    case Outcome::failed:
        return "failed";
    case Outcome::abandoned:
        return "abandoned";
    }
    return "?";
}

}  // namespace usbhost
