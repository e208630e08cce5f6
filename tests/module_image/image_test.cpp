// Opening image files and reading the header text at offset 514: the exact
// request the kernel gets, the paths and modes refused before any open, what
// each header text gives, and how the caller's status decides and is changed
// (digit forms and refused bytes of single fields are parseHexField's own
// tests). Then the update's exits that the device table cannot reach, called
// directly so that the status each leaves is seen: a status on entry, a loader
// product ID without a flash map, an image that opens for its header but not a
// second time to be programmed, a read that ends early with success, and a
// size beyond 4 GiB.
#include <dlfcn.h>

#include <array>
#include <cstdio>
#include <cstdlib>

#include "sim/device/enumeratedDevice.h"
#include "sim/host/simHost.h"
#include "sim/kernel/fileStatus.h"
#include "source/deviceTable.h"
#include "source/firmwareHeader.h"
#include "tests/support/loaderWorld.h"

// This program's own ZwCreateFile, ZwReadFile and ZwQueryInformationFile,
// which the module's linked-in objects call instead of the kernel stand-in's:
// they record each open exactly, and do what no file on the drive can be made
// to do within one update: refuse the open after the header read, end a read
// early with success, report a size beyond 4 GiB.
namespace {

std::vector<std::string> createFileCalls;  // the object name, then every other argument
size_t refusedCreateFile = 0;              // the call that is refused, counted from 1; 0: none
NTSTATUS createFileRefusal = 0;
size_t readFileCalls = 0;
size_t shortenedReadFile = 0;  // the call that reads one byte less than asked and succeeds; 0: none
int64_t addedToFileSize = 0;   // to every end-of-file position the kernel reports

template <typename Function>
Function kernelFunction(const char* name)
{
    auto function = reinterpret_cast<Function>(dlsym(RTLD_NEXT, name));
    if (function == nullptr) std::abort();
    return function;
}

}  // namespace

extern "C" NTSTATUS ZwReadFile(HANDLE file, HANDLE event, void* apcRoutine, void* apcContext,
                               IO_STATUS_BLOCK* ioStatus, void* buffer, uint32_t length, LARGE_INTEGER* byteOffset,
                               uint32_t* key)
{
    static const auto kernelReadFile = kernelFunction<decltype(&ZwReadFile)>("ZwReadFile");
    if (++readFileCalls == shortenedReadFile && length > 0) --length;
    return kernelReadFile(file, event, apcRoutine, apcContext, ioStatus, buffer, length, byteOffset, key);
}

extern "C" NTSTATUS ZwQueryInformationFile(HANDLE file, IO_STATUS_BLOCK* ioStatus, void* information,
                                           uint32_t length, int informationClass)
{
    static const auto kernelQuery = kernelFunction<decltype(&ZwQueryInformationFile)>("ZwQueryInformationFile");
    NTSTATUS result = kernelQuery(file, ioStatus, information, length, informationClass);
    if (result >= 0 && informationClass == kFileStandardInformation)
        static_cast<FILE_STANDARD_INFORMATION*>(information)->EndOfFile.QuadPart += addedToFileSize;
    return result;
}

extern "C" NTSTATUS ZwCreateFile(HANDLE* fileHandle, uint32_t desiredAccess, OBJECT_ATTRIBUTES* attributes,
                                 IO_STATUS_BLOCK* ioStatus, LARGE_INTEGER* allocationSize, uint32_t fileAttributes,
                                 uint32_t shareAccess, uint32_t disposition, uint32_t options, void* eaBuffer,
                                 uint32_t eaLength)
{
    const UNICODE_STRING& name = *attributes->ObjectName;
    char arguments[200];
    std::snprintf(arguments, sizeof arguments,
                  " access=%X length=%u root=%d attributes=%X security=%d allocation=%d file=%X share=%X "
                  "disposition=%u options=%X ea=%d",
                  desiredAccess, attributes->Length, attributes->RootDirectory != nullptr, attributes->Attributes,
                  attributes->SecurityDescriptor != nullptr || attributes->SecurityQualityOfService != nullptr,
                  allocationSize != nullptr, fileAttributes, shareAccess, disposition, options,
                  eaBuffer != nullptr || eaLength != 0);
    createFileCalls.push_back(sim::utf16ToUtf8(name.Buffer, name.Length / 2) + arguments);
    if (refusedCreateFile == createFileCalls.size()) return createFileRefusal;

    static const auto kernelCreateFile = kernelFunction<decltype(&ZwCreateFile)>("ZwCreateFile");
    return kernelCreateFile(fileHandle, desiredAccess, attributes, ioStatus, allocationSize, fileAttributes,
                            shareAccess, disposition, options, eaBuffer, eaLength);
}

namespace {

using Fields = std::array<uint32_t, 6>;
namespace fileStatus = sim::kernel::fileStatus;

class ImageFile : public testing_support::LoaderWorld {
protected:
    void SetUp() override
    {
        LoaderWorld::SetUp();
        createFileCalls.clear();
        refusedCreateFile = 0;
        readFileCalls = 0;
        shortenedReadFile = 0;
        addedToFileSize = 0;
    }

    static std::u16string wide(const std::string& text) { return sim::utf8ToUtf16(text); }
};

// "C:\" and a folder of 200 characters, then a file name that brings the whole path to `length`.
std::string pathOfLength(size_t length)
{
    std::string path = "C:\\" + std::string(200, 'd') + "\\";
    return path + std::string(length - path.size() - 4, 'f') + ".bin";
}

TEST_F(ImageFile, OpensAnExistingFileForReadingSharedOnlyWithReadersByPathsOfUpTo259Characters)
{
    for (const std::string& path : {std::string("C:\\images\\a.bin"), pathOfLength(259)}) {
        writeFile(path, {1, 2, 3});
        createFileCalls.clear();
        const int32_t file = openImageFile(wide(path).c_str(), 0x8000);
        ASSERT_NE(file, -1) << path.size();
        EXPECT_EQ(createFileCalls,
                  std::vector<std::string>{"\\??\\" + path +
                                           " access=20001 length=48 root=0 attributes=240 security=0 allocation=0 "
                                           "file=80 share=1 disposition=1 options=64 ea=0"});
        // The narrowed handle widens back to the kernel's own, which the caller closes.
        EXPECT_EQ(imageFileHandle(file), sim::kernel::files().opens().back().handle);
        EXPECT_EQ(ZwClose(imageFileHandle(file)), 0);
    }
}

// Two readers of one image, as when two devices of one product are updated
// at once or a version check reads the header of an image being programmed.
TEST_F(ImageFile, TwoOpensOfOneImageOverlap)
{
    const std::string image = "C:\\images\\a.bin";
    writeFile(image, testing_support::makeImage(1000));
    const int32_t first = openImageFile(wide(image).c_str(), 0x8000);
    const int32_t second = openImageFile(wide(image).c_str(), 0x8000);
    ASSERT_NE(first, -1);
    ASSERT_NE(second, -1);
    EXPECT_NE(first, second);
    FirmwareHeader header;
    tStatus status = 0;
    readFirmwareHeader(header, wide(image).c_str(), status);
    EXPECT_EQ(status, 0);
    EXPECT_EQ(header.imageVersion, 0x0143C000u);
    EXPECT_EQ(ZwClose(imageFileHandle(first)), 0);
    EXPECT_EQ(ZwClose(imageFileHandle(second)), 0);
}

TEST_F(ImageFile, RefusesWithoutAnOpenOrWhenTheKernelRefuses)
{
    const std::string image = "C:\\images\\a.bin";
    writeFile(image, {1});
    sim::kernel::files().holdOpenElsewhere(hostPath(image));  // so that every open of it is refused
    struct Case {
        std::string path;
        int32_t mode;
        size_t opens;
    };
    const Case cases[] = {
        {pathOfLength(260), 0x8000, 0}, {image, 0, 0}, {image, 0x8001, 0}, {image, 0x4000, 0},
        {"C:\\images\\b.bin", 0x8000, 1}, {"C:\\images", 0x8000, 1}, {image, 0x8000, 1},  // the last held elsewhere
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.path.substr(0, 20) + " mode " + std::to_string(c.mode));
        const size_t opensBefore = sim::kernel::files().opens().size();
        EXPECT_EQ(openImageFile(wide(c.path).c_str(), c.mode), -1);
        EXPECT_EQ(sim::kernel::files().opens().size() - opensBefore, c.opens);
    }
    EXPECT_EQ(openImageFile(nullptr, 0x8000), -1);
    EXPECT_EQ(sim::kernel::files().openFileCount(), 0u);
}

const Fields kFields = {0x0143C000, 1, 2, 3, 0x0201, 0x0A};
const Fields kUnreadable = {0, 0, 0, 0, 0x0100, 0};
const Fields kSentinel = {0xDEAD0001, 0xDEAD0002, 0xDEAD0003, 0xDEAD0004, 0xDEAD0005, 0xDEAD0006};
const std::string kDigits = "0143C000000000010002000302010A";  // 0143C000 00000001 0002 0003 0201 0A

// Each character followed by a NUL byte, as 16-bit little-endian characters are stored.
std::string sixteenBit(const std::string& text)
{
    std::string wideText;
    for (char c : text) wideText += std::string{c, '\0'};
    return wideText;
}

struct HeaderCase {
    const char* name;
    std::string text;      // at offset 514, amid bytes that are no digits: a text read from the wrong place shows
    Fields fields;         // the header starts as kSentinel
    size_t imageSize = 0;  // 0: the whole image, the text followed by 60 more bytes
    NTSTATUS readFailure = 0;
    tStatus entry = 0;
    tStatus expected = 0;
    size_t opens = 1;
    const char* path = "C:\\images\\image.bin";
};

const HeaderCase kHeaderCases[] = {
    {"SingleByteDigits", kDigits, kFields},
    {"SixteenBitDigits", sixteenBit(kDigits), kFields},
    {"AnythingAfterTheLastDigit", kDigits + " -.\r\n", kFields},
    {"SpaceBetweenFields", "0143C000 000000010002000302010A", kUnreadable},
    {"NoDigitInTheLastField", kDigits.substr(0, 29) + "G", kUnreadable},
    {"TextUsedUpBetweenFields", "0143C000" + std::string(50, '\0') + "12", {0x0143C000, 0x12, 0, 0, 0, 0}},
    {"TextUsedUpInsideTheLastField",
     std::string(2, '\0') + sixteenBit("0143C00000000001000200030201A5"), {0x0143C000, 1, 2, 3, 0x0201, 0xA}},
    {"ImageEndsInsideTheText", kDigits, {0x0143C000, 1, 2, 0, 0, 0}, 514 + 20},
    {"ImageEndsBeforeTheText", kDigits, {}, 300},
    {"ReadFails", kDigits, {}, 0, fileStatus::deviceDataError},
    {"PositiveStatusKept", kDigits, kFields, 0, 0, 7, 7},
    {"NegativeStatusOnEntry", kDigits, kSentinel, 0, 0, -3, -3, 0},
    {"MissingImage", kDigits, kSentinel, 0, 0, 0, -50150, 1, "C:\\images\\other.bin"},
};

// Fills the stack below the caller with digits, so that header text the module leaves unfilled reads as digits rather
// than as whatever NUL bytes happened to be there.
[[gnu::noinline]] void paintStack()
{
    volatile uint8_t area[8192];
    for (size_t i = 0; i < sizeof area; ++i) area[i] = '7';
}

TEST_F(ImageFile, HeaderTextsGiveTheirFieldsAndOnlyAMissingImageChangesTheStatus)
{
    for (const HeaderCase& c : kHeaderCases) {
        SCOPED_TRACE(c.name);
        std::string bytes = std::string(514, 'Z') + c.text + std::string(60, 'Z');
        if (c.imageSize != 0) bytes.resize(c.imageSize);
        writeFile("C:\\images\\image.bin", std::vector<uint8_t>(bytes.begin(), bytes.end()));
        sim::kernel::files().failReads(c.readFailure);
        const size_t opensBefore = sim::kernel::files().opens().size();
        FirmwareHeader header;
        header.imageVersion = kSentinel[0], header.field2 = kSentinel[1], header.field3 = kSentinel[2];
        header.field4 = kSentinel[3], header.headerRevision = kSentinel[4], header.imageType = kSentinel[5];
        tStatus status = c.entry;
        const std::u16string path = wide(c.path);
        paintStack();
        readFirmwareHeader(header, path.c_str(), status);
        EXPECT_EQ(status, c.expected);
        EXPECT_EQ((Fields{header.imageVersion, header.field2, header.field3, header.field4, header.headerRevision,
                          header.imageType}),
                  c.fields);
        EXPECT_EQ(sim::kernel::files().opens().size() - opensBefore, c.opens);
        EXPECT_EQ(sim::kernel::files().openFileCount(), 0u);
    }
}

std::string updateFailed(tStatus status)
{
    return "source\\DeviceTable:451 - The firmware update failed.  Leaving device 5C1D 4B01 0001E240 in loader mode  "
           "Status = " +
           std::to_string(status);
}

struct ExitCase {
    const char* name;
    tStatus entry;
    tStatus expected;
    size_t requests;  // the loader stream is opened for any
    uint16_t loaderProductId = 0x4A10;
    bool secondOpenRefused = false;
    std::vector<std::string> log = {};  // location and message
    size_t shortenedRead = 0;           // read 1 is the header's, read 2 block 0's
    int64_t addedToSize = 0;
};

class UpdateExits : public ImageFile, public ::testing::WithParamInterface<ExitCase> {};

TEST_P(UpdateExits, EndWithTheirStatus)
{
    const ExitCase& c = GetParam();
    writeDefaultImage(0x4B01, testing_support::makeImage(1000));
    sim::EmulatedDeviceOptions options = deviceWithIdentity(c.loaderProductId, 0x4B01);
    options.attribute21 = 0xFFFFFFFF;  // the table's own walk leaves the device alone
    if (c.loaderProductId == 0x4A30) options.identity.reset();
    auto hardware = sim::makeEmulatedDevice(options);
    sim::LoaderModeDevice& loader = hardware->plugIn(tree());
    if (c.secondOpenRefused) {
        refusedCreateFile = 2;
        createFileRefusal = sim::kernel::fileStatus::sharingViolation;
    }
    shortenedReadFile = c.shortenedRead;
    addedToFileSize = c.addedToSize;
    {
        tStatus tableStatus = 0;
        DeviceTable table(tableStatus);
        ASSERT_EQ(tableStatus, 0);
        tStatus status = c.entry;
        table.updateFirmware(&loader, c.loaderProductId, status);
        EXPECT_EQ(status, c.expected);
    }
    EXPECT_EQ(hardware->trace.size(), c.requests);
    EXPECT_EQ(loader.openStreamCalls, c.requests > 0 ? 1 : 0);
    std::vector<std::string> log;
    for (const sim::LogEntry& entry : host().eventLog) log.push_back(entry.location + entry.message);
    EXPECT_EQ(log, c.log);
}

const ExitCase kExitCases[] = {
    {"NegativeStatusOnEntry", -7, -7, 0},
    // Without a "Driver" value the image lookup falls back to the default path, with a fresh status.
    {"PositiveStatusOnEntryStillUpdates", 7, 0, 3 + 2 + 9 + 9 + 2},
    {"NoFlashMap", 0, -50150, 0, 0x4A30},
    {"ImageOpensOnlyForItsHeader", 0, -50150, 3, 0x4A10, true,
     {"source\\DeviceTable:385 - Unable to open firmware image C:\\WINDOWS\\system32\\drivers\\QVUSB4B01.bin.  "
      "Leaving device 5C1D 4B01 0001E240 in loader mode."}},
    // The size was checked before the erase, so a read that brings less than
    // asked fails although the kernel reports success.
    {"ImageReadEndsEarlyWithSuccess", 0, -50207, 3 + 2, 0x4A10, false, {updateFailed(-50207)}, 2},
    // All 64 bits of the size count: 4 GiB and 1000 bytes are not 1000 bytes.
    {"ImageOver4GiB", 0, -50150, 3, 0x4A10, false, {updateFailed(-50150)}, 0, int64_t{1} << 32},
};

INSTANTIATE_TEST_SUITE_P(Exits, UpdateExits, ::testing::ValuesIn(kExitCases),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace
