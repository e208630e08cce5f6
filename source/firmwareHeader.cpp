#include "firmwareHeader.h"

#include "imageLocation.h"
#include "moduleMemory.h"
#include "statusCodes.h"

namespace {

constexpr uint32_t kFieldDigits[] = {8, 8, 4, 4, 4, 2};
constexpr uint32_t kUnreadableHeaderRevision = 0x0100;
constexpr WCHAR kObjectPrefix[] = KTEXT("\\??\\");
constexpr uint32_t kObjectNameCharacters = 264;

bool hexDigitValue(uint8_t byte, uint32_t& value)
{
    if (byte >= '0' && byte <= '9') value = byte - '0';
    else if (byte >= 'A' && byte <= 'F') value = byte - 'A' + 10;
    else if (byte >= 'a' && byte <= 'f') value = byte - 'a' + 10;
    else return false;
    return true;
}

}  // namespace

int32_t openImageFile(const WCHAR* path, int32_t mode)
{
    if (path == nullptr) return kNoImageFile;
    uint32_t length = 0;
    while (length < kPathCharacters && path[length] != 0) ++length;
    if (length >= kPathCharacters) return kNoImageFile;

    WCHAR objectName[kObjectNameCharacters];
    uint32_t at = 0;
    for (; kObjectPrefix[at] != 0; ++at) objectName[at] = kObjectPrefix[at];
    fillBytes(objectName + at, 0, sizeof(objectName) - at * sizeof(WCHAR));
    for (uint32_t i = 0; i < length; ++i) objectName[at + i] = path[i];
    UNICODE_STRING name;
    RtlInitUnicodeString(&name, objectName);

    if (mode != kImageReadOnly) return kNoImageFile;

    OBJECT_ATTRIBUTES attributes;
    attributes.Length = sizeof(OBJECT_ATTRIBUTES);
    attributes.RootDirectory = nullptr;
    attributes.ObjectName = &name;
    attributes.Attributes = kObjCaseInsensitive | kObjKernelHandle;
    attributes.SecurityDescriptor = nullptr;
    attributes.SecurityQualityOfService = nullptr;
    IO_STATUS_BLOCK ioStatus;
    HANDLE file = nullptr;
    // Other readers may share the image (a version check reading its header
    // while a device is programmed from it); writers stay excluded, so the
    // image cannot change while it is programmed.
    NTSTATUS result = ZwCreateFile(&file, kFileReadAccess, &attributes, &ioStatus, nullptr, kFileAttributeNormal,
                                   kFileShareRead, kFileOpen,
                                   kFileNonDirectoryFile | kFileSynchronousIoNonalert | kFileSequentialOnly, nullptr, 0);
    if (result < 0) return kNoImageFile;
    return static_cast<int32_t>(reinterpret_cast<intptr_t>(file));
}

void readFirmwareHeader(FirmwareHeader& header, const WCHAR* path, tStatus& status)
{
    if (status < 0) return;
    int32_t file = openImageFile(path, kImageReadOnly);
    if (file == kNoImageFile) {
        setFailure(status, kStatusMissingOrMalformed);
        return;
    }

    // Bytes a short image or a failed read leaves unfilled read as skipped
    // NUL bytes rather than as whatever the stack held.
    uint8_t text[kHeaderTextBytes];
    fillBytes(text, 0, sizeof(text));
    IO_STATUS_BLOCK ioStatus;
    FILE_POSITION_INFORMATION position;
    position.CurrentByteOffset.QuadPart = kHeaderTextOffset;
    ZwSetInformationFile(imageFileHandle(file), &ioStatus, &position, sizeof(position), kFilePositionInformation);
    ZwReadFile(imageFileHandle(file), nullptr, nullptr, nullptr, &ioStatus, text, sizeof(text), nullptr, nullptr);
    ZwClose(imageFileHandle(file));

    // An unreadable header is not an error of the caller's.
    tStatus parseStatus = 0;
    uint32_t fields[6];
    const uint8_t* cursor = text;
    const uint8_t* const end = text + sizeof(text);
    for (uint32_t i = 0; i < 6; ++i) {
        uint64_t budget = i == 0 ? kHeaderTextBytes : static_cast<uint64_t>(end - cursor);
        fields[i] = parseHexField(cursor, budget, kFieldDigits[i], parseStatus);
    }
    if (parseStatus == kStatusMissingOrMalformed) {
        header.imageVersion = 0;
        header.field2 = 0;
        header.field3 = 0;
        header.field4 = 0;
        header.headerRevision = kUnreadableHeaderRevision;
        header.imageType = 0;
        return;
    }
    header.imageVersion = fields[0];
    header.field2 = fields[1];
    header.field3 = fields[2];
    header.field4 = fields[3];
    header.headerRevision = fields[4];
    header.imageType = fields[5];
}

uint32_t parseHexField(const uint8_t*& cursor, uint64_t budget, uint32_t digitCount, tStatus& status)
{
    if (status < 0 || budget == 0) return 0;
    uint32_t value = 0;
    uint32_t digits = 0;
    uint64_t consumed = 0;
    for (;;) {
        if (digits == digitCount) return value;
        uint8_t byte = *cursor;
        uint32_t digit;
        if (hexDigitValue(byte, digit)) {
            value = (value << 4) | digit;
            ++digits;
        } else if (byte != 0) {
            setFailure(status, kStatusMissingOrMalformed);
            return 0;
        }
        ++cursor;
        ++consumed;
        if (consumed >= budget) return value;
    }
}
