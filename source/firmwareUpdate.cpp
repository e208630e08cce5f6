// The whole job for one loader-mode device: identity, image, erase, program
// block by block with read-back and compare, completion marker, restart.
#include "../host/karvelk.h"
#include "deviceTable.h"
#include "firmwareHeader.h"
#include "imageLocation.h"
#include "moduleIdentity.h"
#include "moduleMemory.h"
#include "statusCodes.h"

namespace {

constexpr uint32_t kLogLevel = 10;
constexpr char kLogTag[] = "[morvaneLoader]";
constexpr uint16_t kMarkerOffset = 6;
constexpr uint8_t kCompletionMarker[2] = {0xAA, 0x55};

// Reads the next `length` bytes of the image. The size was checked before
// anything was erased, so a read that brings fewer bytes (the end of the file
// included) is a failure too: otherwise the rest of the block buffer, never
// filled, would be programmed, verified against itself and marked complete.
void readImage(int32_t file, uint8_t* buffer, uint32_t length, tStatus& status)
{
    IO_STATUS_BLOCK ioStatus;
    ioStatus.Information = 0;
    NTSTATUS result =
        ZwReadFile(imageFileHandle(file), nullptr, nullptr, nullptr, &ioStatus, buffer, length, nullptr, nullptr);
    if (result < 0 || ioStatus.Information != length) setFailure(status, kStatusImageReadFailed);
}

void logFailure(const char* location, const char* format, uint16_t vendorId, uint16_t productId,
                uint32_t serialNumber, tStatus status)
{
    _kvlLogEvent(kModuleName, location, kLogLevel, kLogTag, format, static_cast<uint32_t>(vendorId),
                 static_cast<uint32_t>(productId), serialNumber, static_cast<int32_t>(status));
}

void logVerificationFailure(const char* location, uint32_t block)
{
    _kvlLogEvent(kModuleName, location, kLogLevel, kLogTag, "Flash write failed verification on page %d.",
                 static_cast<int32_t>(block));
}

// Writes one block, reads it back and compares it.
void programBlock(LoaderChannel& channel, uint16_t address, const uint8_t* block, uint32_t length, uint32_t index,
                  const char* location, tStatus& status)
{
    writeLoaderMemory(channel, address, block, length, status);
    const int32_t difference = verifyLoaderMemory(channel, address, block, length, status);
    if (status < 0) return;
    if (difference >= 0) {
        logVerificationFailure(location, index);
        setFailure(status, kStatusForeignOrUnverified);
    }
}

// Before anything is erased: the image must be known, non-empty, and fit
// between the firmware base and the identity page. A longer one would erase
// the device's identity, or wrap round to address 0.
void checkImageSize(const LoaderChannel& channel, NTSTATUS sizeQuery, const FILE_STANDARD_INFORMATION& information,
                    tStatus& status)
{
    if (sizeQuery < 0) {
        setFailure(status, kStatusImageReadFailed);
        return;
    }
    const int64_t size = information.EndOfFile.QuadPart;
    const int64_t room = static_cast<int64_t>(channel.identityPage) - channel.firmwareBase;
    if (size <= 0 || size > room) setFailure(status, kStatusMissingOrMalformed);
}

}  // namespace

void DeviceTable::updateFirmware(UsbDevice* device, uint16_t loaderProductId, tStatus& status)
{
    if (status < 0) return;

    LoaderChannel channel;
    openLoaderChannel(channel, device, loaderProductId, status);
    uint16_t vendorId = 0;
    uint16_t productId = 0;
    uint32_t serialNumber = 0;
    checkIdentity(channel, vendorId, productId, serialNumber, status);
    if (status < 0) {
        closeLoaderChannel(channel);
        return;
    }

    WCHAR path[kPathCharacters];
    locateFirmwareImage(vendorId, productId, serialNumber, path, status);
    if (status < 0) {
        logFailure("source\\DeviceTable:355 - ",
                   "Failed to determine the path to the firmware.  Leaving device %04X %04X %08X in loader mode.  "
                   "Status = %d",
                   vendorId, productId, serialNumber, status);
        closeLoaderChannel(channel);
        return;
    }

    FirmwareHeader header;
    readFirmwareHeader(header, path, status);
    if (status < 0) {
        closeLoaderChannel(channel);
        return;
    }

    const int32_t file = openImageFile(path, kImageReadOnly);
    if (file == kNoImageFile) {
        _kvlLogEvent(kModuleName, "source\\DeviceTable:385 - ", kLogLevel, kLogTag,
                     "Unable to open firmware image %S.  Leaving device %04X %04X %08X in loader mode.", path,
                     static_cast<uint32_t>(vendorId), static_cast<uint32_t>(productId), serialNumber);
        setFailure(status, kStatusMissingOrMalformed);
        closeLoaderChannel(channel);
        return;
    }

    IO_STATUS_BLOCK ioStatus;
    FILE_STANDARD_INFORMATION information;
    information.EndOfFile.QuadPart = -1;
    NTSTATUS sizeQuery = ZwQueryInformationFile(imageFileHandle(file), &ioStatus, &information, sizeof(information),
                                                kFileStandardInformation);
    checkImageSize(channel, sizeQuery, information, status);
    const uint32_t size = information.EndOfFile.u.LowPart;

    if (status >= 0) {
        const uint32_t firstPage = static_cast<uint32_t>(channel.firmwareBase) >> 9;
        const uint32_t lastPage = (static_cast<uint32_t>(channel.firmwareBase) + size - 1) >> 9;
        for (uint32_t page = firstPage; page <= lastPage && status >= 0; ++page) {
            eraseLoaderPage(channel, static_cast<uint16_t>(page), status);
        }
    }

    uint8_t block[kLoaderPageSize];
    const uint32_t wholeBlocks = size / kLoaderPageSize;
    const uint32_t partialLength = size % kLoaderPageSize;
    for (uint32_t i = 0; status >= 0 && i < wholeBlocks; ++i) {
        readImage(file, block, kLoaderPageSize, status);
        if (status < 0) break;
        const uint16_t address = static_cast<uint16_t>(channel.firmwareBase + kLoaderPageSize * i);
        programBlock(channel, address, block, kLoaderPageSize, i, "source\\DeviceTable:421 - ", status);
    }
    if (partialLength != 0 && status >= 0) {
        readImage(file, block, partialLength, status);
        if (status >= 0) {
            const uint16_t address = static_cast<uint16_t>(channel.firmwareBase + kLoaderPageSize * wholeBlocks);
            programBlock(channel, address, block, partialLength, wholeBlocks, "source\\DeviceTable:436 - ", status);
        }
    }
    ZwClose(imageFileHandle(file));

    if (status >= 0) {
        writeLoaderMemory(channel, static_cast<uint16_t>(channel.firmwareBase + kMarkerOffset), kCompletionMarker,
                          sizeof(kCompletionMarker), status);
    }
    restartLoader(channel, status);
    if (status < 0) {
        logFailure("source\\DeviceTable:451 - ",
                   "The firmware update failed.  Leaving device %04X %04X %08X in loader mode  Status = %d", vendorId,
                   productId, serialNumber, status);
    }
    closeLoaderChannel(channel);
}
