// Reading through the file position, and the size and position queries.
#include <cstring>

#include "fileTestWorld.h"

namespace files_test {
namespace {

class ReadTest : public FileWorldTest {
  protected:
    void SetUp() override
    {
        FileWorldTest::SetUp();
        content_ = patternBytes(1000);
        writeFile(drive() / "image.bin", content_);
        file_ = openOrFail(u"C:\\image.bin");
    }
    void TearDown() override
    {
        EXPECT_EQ(ZwClose(file_), 0);
        FileWorldTest::TearDown();
    }
    std::vector<uint8_t> slice(size_t from, size_t count) const
    {
        return std::vector<uint8_t>(content_.begin() + from, content_.begin() + from + count);
    }

    std::vector<uint8_t> content_;
    HANDLE file_ = nullptr;
};

TEST_F(ReadTest, ReadsFollowOneAnotherThenStopShortThenMeetTheEnd)
{
    ReadResult first = read(file_, 512);
    EXPECT_EQ(first.status, 0);
    EXPECT_EQ(first.information, 512u);
    EXPECT_EQ(first.bytes, slice(0, 512));

    ReadResult second = read(file_, 512);
    EXPECT_EQ(second.status, 0);
    EXPECT_EQ(second.information, 488u);
    EXPECT_EQ(second.bytes, slice(512, 488));

    for (int i = 0; i < 2; ++i) {
        ReadResult end = read(file_, 512);
        EXPECT_EQ(end.status, kStatusEndOfFile);
        EXPECT_EQ(end.information, 0u);
    }
    EXPECT_EQ(position(file_), 1000);

    const auto& reads = sim::kernel::files().reads();
    ASSERT_EQ(reads.size(), 4u);
    EXPECT_EQ(reads[1].handle, file_);
    EXPECT_EQ(reads[1].length, 512u);
    EXPECT_EQ(reads[1].offset, 512);
    EXPECT_EQ(reads[1].bytesRead, 488u);
    EXPECT_EQ(reads[3].status, kStatusEndOfFile);
}

TEST_F(ReadTest, ASetPositionMovesTheNextRead)
{
    ASSERT_EQ(setPosition(file_, 514), 0);
    EXPECT_EQ(read(file_, 60).bytes, slice(514, 60));
    EXPECT_EQ(position(file_), 574);

    ASSERT_EQ(setPosition(file_, 0), 0);
    EXPECT_EQ(read(file_, 4).bytes, slice(0, 4));

    // Past the end is a valid position; reading there meets the end.
    ASSERT_EQ(setPosition(file_, 5000), 0);
    EXPECT_EQ(read(file_, 4).status, kStatusEndOfFile);
    EXPECT_EQ(setPosition(file_, -1), status::invalidParameter);
    EXPECT_EQ(position(file_), 5000);
}

TEST_F(ReadTest, AByteOffsetReadsThereAndMovesThePositionAfterIt)
{
    LARGE_INTEGER offset;
    offset.QuadPart = 100;
    EXPECT_EQ(read(file_, 10, &offset).bytes, slice(100, 10));
    EXPECT_EQ(read(file_, 10).bytes, slice(110, 10));

    // The documented "current position" offset.
    offset.u.HighPart = -1;
    offset.u.LowPart = 0xFFFFFFFEu;
    EXPECT_EQ(read(file_, 10, &offset).bytes, slice(120, 10));
    EXPECT_EQ(position(file_), 130);
}

TEST_F(ReadTest, AnEmptyReadSucceedsEvenAtTheEnd)
{
    ASSERT_EQ(setPosition(file_, 1000), 0);
    ReadResult empty = read(file_, 0);
    EXPECT_EQ(empty.status, 0);
    EXPECT_EQ(empty.information, 0u);
}

TEST_F(ReadTest, TheFileIsReadAsItWasWhenOpened)
{
    writeFile(drive() / "image.bin", patternBytes(10, 9));
    EXPECT_EQ(read(file_, 1000).bytes, content_);
    fs::remove(drive() / "image.bin");
    ASSERT_EQ(setPosition(file_, 0), 0);
    EXPECT_EQ(read(file_, 1000).bytes, content_);
}

TEST_F(ReadTest, WrongInformationClassesAndShortBuffersAreRefused)
{
    struct Case {
        bool set;
        int informationClass;
        uint32_t length;
        NTSTATUS expected;
    };
    const Case cases[] = {
        {false, 4, 40, status::invalidInfoClass}, // FileBasicInformation
        {false, 9, 300, status::invalidInfoClass},
        {false, kFileStandardInformation, 23, status::infoLengthMismatch},
        {false, kFilePositionInformation, 7, status::infoLengthMismatch},
        {false, kFileStandardInformation, 32, 0}, // a longer buffer is fine
        {true, kFileStandardInformation, 24, status::invalidInfoClass},
        {true, 20, 8, status::invalidInfoClass}, // FileEndOfFileInformation: no writing
        {true, kFilePositionInformation, 4, status::infoLengthMismatch},
    };
    for (const Case& c : cases) {
        uint8_t buffer[300] = {};
        IO_STATUS_BLOCK ioStatus{};
        NTSTATUS result = c.set ? ZwSetInformationFile(file_, &ioStatus, buffer, c.length, c.informationClass)
                                : ZwQueryInformationFile(file_, &ioStatus, buffer, c.length, c.informationClass);
        EXPECT_EQ(result, c.expected) << (c.set ? "set " : "query ") << c.informationClass << " " << c.length;
        EXPECT_EQ(ioStatus.Status, c.expected);
        EXPECT_EQ(sim::kernel::files().informationCalls().back().status, c.expected);
    }
    EXPECT_EQ(position(file_), 0);
}

class SizeQueryTest : public FileWorldTest, public ::testing::WithParamInterface<size_t> {};

TEST_P(SizeQueryTest, ReportsTheSizeAndWholeAllocationUnits)
{
    size_t size = GetParam();
    writeFile(drive() / "image.bin", patternBytes(size));
    HANDLE file = openOrFail(u"C:\\image.bin");

    FILE_STANDARD_INFORMATION information;
    std::memset(&information, 0xCC, sizeof information);
    IO_STATUS_BLOCK ioStatus{};
    ASSERT_EQ(ZwQueryInformationFile(file, &ioStatus, &information, sizeof information, kFileStandardInformation), 0);

    EXPECT_EQ(ioStatus.Information, sizeof(FILE_STANDARD_INFORMATION));
    EXPECT_EQ(information.EndOfFile.QuadPart, static_cast<int64_t>(size));
    EXPECT_EQ(information.AllocationSize.QuadPart, static_cast<int64_t>((size + 4095) / 4096 * 4096));
    EXPECT_EQ(information.NumberOfLinks, 1u);
    EXPECT_EQ(information.DeletePending, 0);
    EXPECT_EQ(information.Directory, 0);
    const auto& calls = sim::kernel::files().informationCalls();
    ASSERT_EQ(calls.size(), 1u);
    EXPECT_EQ(calls[0].handle, file);
    EXPECT_FALSE(calls[0].set);
    EXPECT_EQ(calls[0].informationClass, kFileStandardInformation);
    EXPECT_EQ(ZwClose(file), 0);
}

INSTANTIATE_TEST_SUITE_P(Sizes, SizeQueryTest, ::testing::Values(0, 1, 574, 4096, 4097, 70000));

TEST_F(FileWorldTest, AnEmptyFileIsAtItsEndAtOnce)
{
    writeFile(drive() / "empty.bin", {});
    HANDLE file = openOrFail(u"C:\\empty.bin");
    EXPECT_EQ(read(file, 60).status, kStatusEndOfFile);
    EXPECT_EQ(ZwClose(file), 0);
}

} // namespace
} // namespace files_test
