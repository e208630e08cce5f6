// Handles: they survive the module's narrowing to 32 bits, and calls on
// anything but an open file are refused and reported.
#include "fileTestWorld.h"

namespace files_test {
namespace {

using HandleTest = FileWorldTest;

TEST_F(HandleTest, AHandleNarrowedToInt32AndWidenedBackStillWorks)
{
    writeFile(drive() / "image.bin", patternBytes(100));
    HANDLE file = openOrFail(u"C:\\image.bin");

    int32_t narrowed = static_cast<int32_t>(reinterpret_cast<intptr_t>(file));
    EXPECT_LT(narrowed, 0) << "kernel handles are negative once sign-extended";
    HANDLE widened = reinterpret_cast<HANDLE>(static_cast<intptr_t>(narrowed));
    ASSERT_EQ(widened, file);

    EXPECT_EQ(read(widened, 100).bytes, patternBytes(100));
    EXPECT_EQ(ZwClose(widened), 0);
    EXPECT_EQ(sim::kernel::files().openFileCount(), 0u);
}

TEST_F(HandleTest, CallsOnAClosedHandleAreRefusedAndReported)
{
    writeFile(drive() / "image.bin", patternBytes(100));
    HANDLE file = openOrFail(u"C:\\image.bin");
    ASSERT_EQ(ZwClose(file), 0);

    uint8_t buffer[8];
    IO_STATUS_BLOCK ioStatus{};
    FILE_STANDARD_INFORMATION information{};
    EXPECT_EQ(ZwReadFile(file, nullptr, nullptr, nullptr, &ioStatus, buffer, 8, nullptr, nullptr),
              status::invalidHandle);
    EXPECT_EQ(ZwQueryInformationFile(file, &ioStatus, &information, sizeof information, kFileStandardInformation),
              status::invalidHandle);
    EXPECT_EQ(setPosition(file, 0), status::invalidHandle);
    EXPECT_EQ(ZwClose(file), status::invalidHandle);
    EXPECT_TRUE(sim::kernel::files().reads().empty());

    expectMisuseReported(4, "which is not");
}

TEST_F(HandleTest, HandlesOfOtherKindsAreNotFiles)
{
    HANDLE key = sim::kernel::openHandle(sim::kernel::HandleKind::registryKey, nullptr, "a registry key");
    uint8_t buffer[8];
    IO_STATUS_BLOCK ioStatus{};
    EXPECT_EQ(ZwReadFile(key, nullptr, nullptr, nullptr, &ioStatus, buffer, 8, nullptr, nullptr),
              status::invalidHandle);
    EXPECT_EQ(setPosition(key, 0), status::invalidHandle);
    EXPECT_EQ(ZwClose(key), 0);
    expectMisuseReported(2, "not an open file");
}

} // namespace
} // namespace files_test
