// The loader-mode enumeration: control streams, their buffers from the host
// allocator, and the host's checks before a request reaches the device.
#include <algorithm>
#include <map>

#include "enumeratedDevice.h"

namespace sim {

class LoaderModeDevice::Stream final : public ControlStream {
public:
    explicit Stream(LoaderModeDevice& device) : device_(device) {}

    void* allocateBuffer(uint32_t size, tStatus& status) override
    {
        if (status < 0) return nullptr;
        if (!open) {
            Host::get().reportMisuse("allocateBuffer on a closed stream of " + device_.describe());
            setFailure(status, kHostBadArgument);
            return nullptr;
        }
        if (device_.gone()) {
            setFailure(status, kHostDeviceGone);
            return nullptr;
        }
        PhysicalDevice& hardware = device_.hardware();
        uint64_t request = ++hardware.transferBufferRequests;
        if (hardware.faults.refuseAllocateBuffer || hardware.faults.failTransferBuffers.count(request) != 0) {
            setFailure(status, kHostAllocationFailed);
            return nullptr;
        }
        std::string purpose = "the transfer buffer of " + hardware.options().name;
        void* buffer = Host::get().allocator.allocate(size, &status, purpose.c_str());
        if (buffer != nullptr) buffers_[static_cast<const uint8_t*>(buffer)] = size;
        return buffer;
    }

    // Releases even on a gone device: clean-up after a removal must still work.
    void freeBuffer(void* buffer, tStatus& status) override
    {
        if (status < 0) return;
        auto it = buffers_.find(static_cast<const uint8_t*>(buffer));
        if (!open || it == buffers_.end()) {
            Host::get().reportMisuse(std::string("freeBuffer of a buffer that ") +
                                     (open ? "this stream did not hand out" : "belongs to a closed stream") +
                                     " on " + device_.describe());
            setFailure(status, kHostBadArgument);
            return;
        }
        buffers_.erase(it);
        Host::get().allocator.release(buffer);
        // A host that reports a failed release has still released: nothing may leak.
        if (device_.hardware().faults.failFreeBuffer < 0) setFailure(status, device_.hardware().faults.failFreeBuffer);
    }

    void transfer(nQVKORD100::tTransferParameterUSBControl* request, tStatus& status) override
    {
        if (status < 0) return;
        if (request == nullptr) {
            Host::get().reportMisuse("transfer with no request on " + device_.describe());
            setFailure(status, kHostBadArgument);
            return;
        }
        tStatus refusal = 0;
        if (!open) {
            Host::get().reportMisuse("transfer on a closed stream of " + device_.describe());
            refusal = kHostTransferStalled;
        } else if (device_.gone()) {
            refusal = kHostDeviceGone;
        } else if (request->length != 0 && !insideLiveBuffer(request->data, request->length)) {
            Host::get().reportMisuse("transfer whose data stage is not inside a live buffer of its stream on " +
                                     device_.describe());
            refusal = kHostTransferStalled;
        }
        // Success leaves a zero or positive status as it was.
        tStatus outcome = device_.hardware().serve(*request, refusal);
        if (outcome < 0) setFailure(status, outcome);
    }

    bool open = true;

private:
    bool insideLiveBuffer(const void* data, uint32_t length) const
    {
        const uint8_t* start = static_cast<const uint8_t*>(data);
        if (start == nullptr || buffers_.empty()) return false;
        auto it = buffers_.upper_bound(start);  // the first buffer after start
        if (it == buffers_.begin()) return false;
        --it;
        // Compared as offsets, so that a pointer outside the buffer is never formed.
        size_t offset = static_cast<size_t>(start - it->first);
        return offset < it->second && length <= it->second - offset;
    }

    LoaderModeDevice& device_;
    std::map<const uint8_t*, uint32_t> buffers_;
};

LoaderModeDevice::LoaderModeDevice(std::shared_ptr<PhysicalDevice> hardware)
    : EnumeratedDevice(hardware, hardware->options().vendorId, hardware->options().loaderProductId)
{
}

// Buffers still held by a stream stay counted by the allocator: a leak shows.
LoaderModeDevice::~LoaderModeDevice() = default;

ControlStream* LoaderModeDevice::openStream(nQVKORD100::tControlStreamParameterUSB* parameter, tStatus& status)
{
    ++openStreamCalls;
    if (status < 0) return nullptr;
    if (gone_) {
        setFailure(status, kHostDeviceGone);
        return nullptr;
    }
    if (parameter == nullptr || parameter->first != 3 || parameter->second != 0) {
        Host::get().reportMisuse("openStream on " + describe() + " without a control stream parameter of 3 and 0");
        setFailure(status, kHostBadArgument);
        return nullptr;
    }
    if (hardware_->faults.refuseOpenStream) {
        setFailure(status, kHostFailure);
        return nullptr;
    }
    streams_.push_back(std::make_unique<Stream>(*this));
    return streams_.back().get();
}

void LoaderModeDevice::closeStream(ControlStream* stream, tStatus& status)
{
    ++closeStreamCalls;
    if (status < 0) return;
    Stream* known = findStream(stream);
    if (known == nullptr || !known->open) {
        Host::get().reportMisuse("closeStream of a stream that is not open on " + describe());
        setFailure(status, kHostBadArgument);
        return;
    }
    known->open = false;
    if (hardware_->faults.failCloseStream < 0) setFailure(status, hardware_->faults.failCloseStream);
}

size_t LoaderModeDevice::openStreams() const
{
    return static_cast<size_t>(
        std::count_if(streams_.begin(), streams_.end(), [](const auto& stream) { return stream->open; }));
}

LoaderModeDevice::Stream* LoaderModeDevice::findStream(ControlStream* stream) const
{
    for (const auto& candidate : streams_) {
        if (candidate.get() == stream) return candidate.get();
    }
    return nullptr;
}

}  // namespace sim
