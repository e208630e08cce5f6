// One loader-mode device's control channel: its stream, its one transfer
// buffer, and the flash map of its loader product ID.
#pragma once

#include <stdint.h>

#include "../host/deviceTree.h"
#include "../host/karvelkStatus.h"

constexpr uint32_t kLoaderPageSize = 0x200;
constexpr uint32_t kLoaderReadChunk = 64;      // an IN data stage carries at most this much
constexpr uint32_t kTransferBufferSize = 512;  // and an OUT data stage at most this much

// The loader's vendor requests, all addressed to the device.
constexpr uint8_t kRequestTypeVendorIn = 0xC0;
constexpr uint8_t kRequestTypeVendorOut = 0x40;
constexpr uint8_t kRequestMemory = 0xB0;  // read or write, told apart by direction
constexpr uint8_t kRequestPageErase = 0xB9;
constexpr uint8_t kRequestRestart = 0xBA;

struct FlashMap {
    uint16_t loaderProductId;
    uint16_t firmwareBase;
    uint16_t identityPage;
};

// Null for a product ID without a map.
const FlashMap* findFlashMap(uint16_t loaderProductId);

struct LoaderChannel {
    UsbDevice* device;             // borrowed
    ControlStream* stream;         // owned
    uint8_t* transferBuffer;       // owned, from the stream
    uint16_t loaderProductId;
    uint16_t firmwareBase;
    uint16_t identityPage;
};

void openLoaderChannel(LoaderChannel& channel, UsbDevice* device, uint16_t loaderProductId, tStatus& status);
void readLoaderMemory(LoaderChannel& channel, uint16_t address, void* destination, uint32_t count,
                      tStatus& status);
// Reads count bytes back, in the same requests as readLoaderMemory, and
// compares them with expected. Returns the index of the first byte that
// differs, or -1 (also when the status is negative on return).
int32_t verifyLoaderMemory(LoaderChannel& channel, uint16_t address, const uint8_t* expected, uint32_t count,
                           tStatus& status);
// count is 1 to 512; anything else is refused with no request.
void writeLoaderMemory(LoaderChannel& channel, uint16_t address, const void* source, uint32_t count,
                       tStatus& status);
void eraseLoaderPage(LoaderChannel& channel, uint16_t page, tStatus& status);
void restartLoader(LoaderChannel& channel, tStatus& status);
void closeLoaderChannel(LoaderChannel& channel);
