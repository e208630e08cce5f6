// The loader's four vendor requests as the device carries them out, and the
// stall with which it refuses anything else.
#include <cstring>

#include "enumeratedDevice.h"

namespace sim {

namespace {

constexpr uint8_t kVendorIn = 0xC0;
constexpr uint8_t kVendorOut = 0x40;
constexpr uint8_t kMemory = 0xB0;
constexpr uint8_t kPageErase = 0xB9;
constexpr uint8_t kRestart = 0xBA;
constexpr uint32_t kMaxRead = 64;
constexpr uint32_t kMaxWrite = 512;

RequestKind classify(uint8_t requestType, uint8_t request)
{
    if (requestType == kVendorIn && request == kMemory) return RequestKind::Read;
    if (requestType != kVendorOut) return RequestKind::Unknown;
    if (request == kMemory) return RequestKind::Write;
    if (request == kPageErase) return RequestKind::Erase;
    if (request == kRestart) return RequestKind::Restart;
    return RequestKind::Unknown;
}

bool wellFormed(RequestKind kind, const nQVKORD100::tTransferParameterUSBControl& request)
{
    switch (kind) {
    case RequestKind::Read:
        return request.wValue == 0 && request.length >= 1 && request.length <= kMaxRead;
    case RequestKind::Write:
        return request.wValue == 0 && request.length >= 1 && request.length <= kMaxWrite;
    case RequestKind::Erase:
        return request.wIndex == 0 && request.length == 0 && request.wValue < FlashMemory::kPages;
    case RequestKind::Restart:
        return request.wValue == 0 && request.wIndex == 0 && request.length == 0;
    case RequestKind::Unknown:
        break;
    }
    return false;
}

}  // namespace

tStatus PhysicalDevice::serve(nQVKORD100::tTransferParameterUSBControl& request, tStatus refusal)
{
    RequestRecord record;
    record.sequence = ++requests_;
    record.enumeration = enumerations_;
    record.kind = classify(request.bmRequestType, request.bRequest);
    record.bmRequestType = request.bmRequestType;
    record.bRequest = request.bRequest;
    record.wValue = request.wValue;
    record.wIndex = request.wIndex;
    record.length = request.length;
    record.dataPointerGiven = request.data != nullptr;
    if (record.kind == RequestKind::Read) ++readRequests_;

    tStatus outcome = refusal;
    if (outcome >= 0 && faults.unplugAtRequest != 0 && record.sequence >= faults.unplugAtRequest) {
        std::string who = current_ != nullptr ? current_->describe() : options_.name;
        notes.push_back(who + " stopped answering at request " + std::to_string(record.sequence));
        unplugged_ = true;
        unplugFired_ = true;
        disconnect();
        outcome = kHostDeviceGone;
    }
    bool reachedDevice = outcome >= 0;
    bool stallInjected = faults.stallRequests.count(record.sequence) != 0 || faults.stallKinds.count(record.kind) != 0;
    if (reachedDevice && stallInjected) outcome = kHostTransferStalled;
    if (outcome >= 0) outcome = carryOut(request, record);
    bool tookEffect = outcome >= 0;
    if (tookEffect && faults.lostStatus.count(record.sequence) != 0) {
        notes.push_back("request " + std::to_string(record.sequence) + " took effect, but its status stage was lost");
        outcome = kHostTransferStalled;
    }

    if (timing && reachedDevice) {
        bool done = tookEffect;
        uint32_t length = done ? record.length : 0;
        bool erased = done && record.kind == RequestKind::Erase;
        uint32_t programmed = done && record.kind == RequestKind::Write ? record.length : 0;
        elapsed += timing->duration(length, erased, programmed);
    }
    record.outcome = outcome;
    record.finishedAt = elapsed;
    RequestKind kind = record.kind;
    if (requestObserver) requestObserver(*this, record);
    if (traceEnabled) trace.push_back(std::move(record));

    if (tookEffect && kind == RequestKind::Restart) leaveLoaderMode();
    return outcome;
}

tStatus PhysicalDevice::outcomeBeforeData(const nQVKORD100::tTransferParameterUSBControl& request) const
{
    uint64_t sequence = requests_ + 1;
    if (faults.unplugAtRequest != 0 && sequence >= faults.unplugAtRequest) return kHostDeviceGone;
    RequestKind kind = classify(request.bmRequestType, request.bRequest);
    if (faults.stallRequests.count(sequence) != 0 || faults.stallKinds.count(kind) != 0) return kHostTransferStalled;
    if (!wellFormed(kind, request)) return kHostTransferStalled;
    return 0;
}

tStatus PhysicalDevice::carryOut(nQVKORD100::tTransferParameterUSBControl& request, RequestRecord& record)
{
    if (!wellFormed(record.kind, request)) return kHostTransferStalled;
    auto* data = static_cast<uint8_t*>(request.data);
    switch (record.kind) {
    case RequestKind::Read: {
        std::vector<uint8_t> bytes = flash.read(request.wIndex, request.length);
        for (const ReadCorruption& corruption : faults.readCorruptions) {
            uint16_t offset = static_cast<uint16_t>(corruption.address - request.wIndex);
            if (offset >= request.length) continue;
            bytes[offset] = corruption.replacement ? *corruption.replacement : bytes[offset] ^ corruption.xorMask;
        }
        for (const ShortRead& shortRead : faults.shortReads) {
            if (shortRead.read == readRequests_ && shortRead.bytes < bytes.size()) bytes.resize(shortRead.bytes);
        }
        if (!bytes.empty()) std::memcpy(data, bytes.data(), bytes.size());
        if (traceEnabled) record.data = std::move(bytes);
        break;
    }
    case RequestKind::Write: {
        // Stuck bits keep their value: programming them with 1 leaves them as they are.
        std::vector<uint8_t> programmed(data, data + request.length);
        for (const StuckBits& stuck : faults.stuckBits) {
            uint16_t offset = static_cast<uint16_t>(stuck.address - request.wIndex);
            if (offset < request.length) programmed[offset] |= stuck.mask;
        }
        flash.program(request.wIndex, programmed.data(), programmed.size());
        if (traceEnabled) record.data.assign(data, data + request.length);
        break;
    }
    case RequestKind::Erase:
        if (faults.deadErases.count(request.wValue) != 0) break;
        flash.erasePage(request.wValue);
        for (const StuckBits& stuck : faults.stuckBits) {
            if (stuck.address / FlashMemory::kPageSize != request.wValue) continue;
            std::vector<uint8_t> cleared{static_cast<uint8_t>(flash.at(stuck.address) & ~stuck.mask)};
            flash.load(stuck.address, cleared);
        }
        break;
    case RequestKind::Restart:
    case RequestKind::Unknown:
        break;
    }
    return 0;
}

}  // namespace sim
