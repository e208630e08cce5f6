// Opens the module never asks for are refused and reported, and nothing is
// opened; the request the module does make is accepted as it is.
#include "fileTestWorld.h"

namespace files_test {
namespace {

struct Misuse {
    const char* what;
    void (*change)(CreateRequest&);
    NTSTATUS expected;
};

class CreateMisuseTest : public FileWorldTest, public ::testing::WithParamInterface<Misuse> {};

TEST_P(CreateMisuseTest, IsRefusedAndReported)
{
    writeFile(drive() / "image.bin", patternBytes(16));
    CreateRequest request;
    request.name = u"\\??\\C:\\image.bin";
    GetParam().change(request);

    CreateResult result = create(request);

    EXPECT_EQ(result.status, GetParam().expected) << GetParam().what;
    EXPECT_EQ(result.handle, nullptr);
    EXPECT_EQ(sim::kernel::files().openFileCount(), 0u);
    EXPECT_TRUE(sim::kernel::files().filesOpened().empty());
    expectMisuseReported(1, "ZwCreateFile");
}

const Misuse kMisuses[] = {
    {"create a file", [](CreateRequest& r) { r.disposition = 2; }, status::invalidParameter},
    {"write data", [](CreateRequest& r) { r.desiredAccess |= 0x2; }, status::accessDenied},
    {"generic write", [](CreateRequest& r) { r.desiredAccess = 0x40000000; }, status::accessDenied},
    {"no read access", [](CreateRequest& r) { r.desiredAccess = 0x20000; }, status::accessDenied},
    {"directories allowed", [](CreateRequest& r) { r.options &= ~kFileNonDirectoryFile; }, status::invalidParameter},
    {"asynchronous", [](CreateRequest& r) { r.options &= ~kFileSynchronousIoNonalert; }, status::invalidParameter},
    {"delete on close", [](CreateRequest& r) { r.options |= 0x1000; }, status::invalidParameter},
    {"share nonsense", [](CreateRequest& r) { r.shareAccess = 0x10; }, status::invalidParameter},
    {"short attributes", [](CreateRequest& r) { r.attributesLength = 40; }, status::invalidParameter},
    {"case-sensitive", [](CreateRequest& r) { r.attributeFlags = 0; }, status::invalidParameter},
    {"relative to a root", [](CreateRequest& r) { r.rootDirectory = reinterpret_cast<HANDLE>(-4); },
     status::invalidParameter},
    {"extended attributes", [](CreateRequest& r) { r.eaLength = 8; }, status::invalidParameter},
};

INSTANTIATE_TEST_SUITE_P(Requests, CreateMisuseTest, ::testing::ValuesIn(kMisuses));

using CreateRequestTest = FileWorldTest;

TEST_F(CreateRequestTest, AMalformedCountedNameIsInvalid)
{
    WCHAR text[] = u"\\??\\C:\\image.bin";
    UNICODE_STRING name{3, sizeof text, text}; // odd byte count
    OBJECT_ATTRIBUTES attributes{sizeof(OBJECT_ATTRIBUTES), nullptr, &name, kObjCaseInsensitive, nullptr, nullptr};
    IO_STATUS_BLOCK ioStatus{};
    HANDLE handle = nullptr;
    EXPECT_EQ(ZwCreateFile(&handle, kFileReadAccess, &attributes, &ioStatus, nullptr, kFileAttributeNormal, 0,
                           kFileOpen, kFileNonDirectoryFile | kFileSynchronousIoNonalert, nullptr, 0),
              status::objectNameInvalid);
    expectMisuseReported(1, "counted name");
}

TEST_F(CreateRequestTest, TheNameIsReadOnlyAsFarAsItsLength)
{
    writeFile(drive() / "image.bin", patternBytes(16));
    WCHAR text[] = u"\\??\\C:\\image.binXYZ";
    UNICODE_STRING name{static_cast<uint16_t>((sizeof text / sizeof(WCHAR) - 4) * sizeof(WCHAR)), sizeof text, text};
    OBJECT_ATTRIBUTES attributes{sizeof(OBJECT_ATTRIBUTES), nullptr, &name, kObjCaseInsensitive, nullptr, nullptr};
    IO_STATUS_BLOCK ioStatus{};
    HANDLE handle = nullptr;
    ASSERT_EQ(ZwCreateFile(&handle, kFileReadAccess, &attributes, &ioStatus, nullptr, kFileAttributeNormal, 0,
                           kFileOpen, kFileNonDirectoryFile | kFileSynchronousIoNonalert, nullptr, 0),
              0);
    EXPECT_EQ(ZwClose(handle), 0);
}

TEST_F(CreateRequestTest, ReasonableVariationsOfTheModulesOpenAreAccepted)
{
    writeFile(drive() / "image.bin", patternBytes(16));
    void (*variations[])(CreateRequest&) = {
        [](CreateRequest&) {},
        [](CreateRequest& r) { r.attributeFlags |= 0x200; },    // OBJ_KERNEL_HANDLE
        [](CreateRequest& r) { r.desiredAccess = 0x80100000; }, // GENERIC_READ | SYNCHRONIZE
        [](CreateRequest& r) { r.options &= ~kFileSequentialOnly; },
    };
    for (auto vary : variations) {
        CreateRequest request;
        request.name = u"\\??\\C:\\image.bin";
        vary(request);
        CreateResult result = create(request);
        ASSERT_EQ(result.status, 0);
        EXPECT_EQ(ZwClose(result.handle), 0);
    }
}

TEST_F(CreateRequestTest, ReadsWithAsynchronousNotificationAreRefused)
{
    writeFile(drive() / "image.bin", patternBytes(16));
    HANDLE file = openOrFail(u"C:\\image.bin");
    uint8_t buffer[4];
    IO_STATUS_BLOCK ioStatus{};
    uint32_t key = 0;
    LARGE_INTEGER before;
    before.QuadPart = -5;
    EXPECT_EQ(ZwReadFile(file, reinterpret_cast<HANDLE>(-8), nullptr, nullptr, &ioStatus, buffer, 4, nullptr, nullptr),
              status::invalidParameter);
    EXPECT_EQ(ZwReadFile(file, nullptr, nullptr, nullptr, &ioStatus, buffer, 4, nullptr, &key),
              status::invalidParameter);
    EXPECT_EQ(ZwReadFile(file, nullptr, nullptr, nullptr, &ioStatus, buffer, 4, &before, nullptr),
              status::invalidParameter);
    EXPECT_EQ(position(file), 0);
    EXPECT_EQ(ZwClose(file), 0);
    expectMisuseReported(3, "ZwReadFile");
}

} // namespace
} // namespace files_test
