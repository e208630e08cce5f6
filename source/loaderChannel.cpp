#include "loaderChannel.h"

#include "moduleMemory.h"
#include "statusCodes.h"

namespace {

constexpr FlashMap kFlashMaps[] = {
    {0x4A10, 0x0200, 0x3600},
    {0x4A20, 0x0600, 0x7C00},
};

// One request object on the stack per request; the host reads it by layout.
void sendRequest(LoaderChannel& channel, uint8_t requestType, uint8_t request, uint16_t value, uint16_t index,
                 void* data, uint32_t length, tStatus& status)
{
    nQVKORD100::tTransferParameterUSBControl parameter;
    parameter.data = data;
    parameter.length = length;
    parameter.bmRequestType = requestType;
    parameter.bRequest = request;
    parameter.wValue = value;
    parameter.wIndex = index;
    channel.stream->transfer(&parameter, status);
}

}  // namespace

const FlashMap* findFlashMap(uint16_t loaderProductId)
{
    for (const FlashMap& map : kFlashMaps) {
        if (map.loaderProductId == loaderProductId) return &map;
    }
    return nullptr;
}

void openLoaderChannel(LoaderChannel& channel, UsbDevice* device, uint16_t loaderProductId, tStatus& status)
{
    channel.device = device;
    channel.loaderProductId = loaderProductId;
    channel.stream = nullptr;
    channel.transferBuffer = nullptr;
    channel.firmwareBase = 0;
    channel.identityPage = 0;
    if (status < 0) return;

    const FlashMap* map = findFlashMap(loaderProductId);
    if (map == nullptr) {
        setFailure(status, kStatusMissingOrMalformed);
        return;
    }
    channel.firmwareBase = map->firmwareBase;
    channel.identityPage = map->identityPage;

    nQVKORD100::tControlStreamParameterUSB parameter;
    parameter.first = 3;
    parameter.second = 0;
    channel.stream = device->openStream(&parameter, status);
    if (channel.stream != nullptr && status >= 0) {
        channel.transferBuffer = static_cast<uint8_t*>(channel.stream->allocateBuffer(kTransferBufferSize, status));
    }
}

void readLoaderMemory(LoaderChannel& channel, uint16_t address, void* destination, uint32_t count,
                      tStatus& status)
{
    if (status < 0) return;
    uint8_t* target = static_cast<uint8_t*>(destination);
    uint32_t remaining = count;
    uint16_t current = address;
    // The status is not tested between chunks: after a failure the host's
    // transfer does nothing, and the caller sees the first failure.
    while (remaining != 0) {
        uint32_t chunk = remaining > kLoaderReadChunk ? kLoaderReadChunk : remaining;
        sendRequest(channel, kRequestTypeVendorIn, kRequestMemory, 0, current, channel.transferBuffer, chunk, status);
        if (target != nullptr) {
            copyBytes(target, channel.transferBuffer, chunk);
            target += chunk;
        }
        remaining -= chunk;
        current = static_cast<uint16_t>(current + chunk);
    }
}

int32_t verifyLoaderMemory(LoaderChannel& channel, uint16_t address, const uint8_t* expected, uint32_t count,
                           tStatus& status)
{
    if (status < 0) return -1;
    int32_t difference = -1;
    uint32_t done = 0;
    uint16_t current = address;
    while (done < count) {
        uint32_t chunk = count - done > kLoaderReadChunk ? kLoaderReadChunk : count - done;
        // A transfer may report success with fewer bytes than asked. The
        // buffer still holds what the write before it sent, so a byte the
        // device did not deliver must not be able to match: each one starts
        // as the complement of what is expected there.
        for (uint32_t i = 0; i < chunk; ++i) channel.transferBuffer[i] = static_cast<uint8_t>(~expected[done + i]);
        sendRequest(channel, kRequestTypeVendorIn, kRequestMemory, 0, current, channel.transferBuffer, chunk, status);
        if (difference < 0) {
            int32_t at = findFirstDifference(expected + done, channel.transferBuffer, chunk);
            if (at >= 0) difference = static_cast<int32_t>(done) + at;
        }
        done += chunk;
        current = static_cast<uint16_t>(current + chunk);
    }
    return status < 0 ? -1 : difference;
}

void writeLoaderMemory(LoaderChannel& channel, uint16_t address, const void* source, uint32_t count,
                       tStatus& status)
{
    if (status < 0) return;
    // The data stage passes through the 512-byte transfer buffer.
    if (count == 0 || count > kTransferBufferSize) {
        setFailure(status, kStatusMissingOrMalformed);
        return;
    }
    copyBytes(channel.transferBuffer, source, count);
    sendRequest(channel, kRequestTypeVendorOut, kRequestMemory, 0, address, channel.transferBuffer, count, status);
}

void eraseLoaderPage(LoaderChannel& channel, uint16_t page, tStatus& status)
{
    if (status < 0) return;
    sendRequest(channel, kRequestTypeVendorOut, kRequestPageErase, page, 0, nullptr, 0, status);
}

void restartLoader(LoaderChannel& channel, tStatus& status)
{
    if (status < 0) return;
    sendRequest(channel, kRequestTypeVendorOut, kRequestRestart, 0, 0, nullptr, 0, status);
}

void closeLoaderChannel(LoaderChannel& channel)
{
    if (channel.transferBuffer != nullptr) {
        tStatus releaseStatus = 0;
        channel.stream->freeBuffer(channel.transferBuffer, releaseStatus);
        channel.transferBuffer = nullptr;
    }
    if (channel.stream != nullptr) {
        tStatus releaseStatus = 0;
        channel.device->closeStream(channel.stream, releaseStatus);
        channel.stream = nullptr;
    }
}
