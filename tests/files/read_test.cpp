// Reading through the file position, the size and position calls, and the
// failures injected into them.
#include "fileTestWorld.h"

namespace files_test {
namespace {

class ReadTest : public FileWorldTest {
  protected:
    void SetUp() override
    {
        FileWorldTest::SetUp();
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

    const std::vector<uint8_t> content_ = patternBytes(1000);
    HANDLE file_ = nullptr;
};

TEST_F(ReadTest, ReadsFollowThePositionStopShortAtTheEndThenMeetIt)
{
    EXPECT_EQ(read(file_, 512).bytes, slice(0, 512));
    ReadResult shortRead = read(file_, 512);
    EXPECT_EQ(shortRead.status, 0);
    EXPECT_EQ(shortRead.bytes, slice(512, 488));
    for (int i = 0; i < 2; ++i) EXPECT_EQ(read(file_, 512).status, kStatusEndOfFile);
    EXPECT_EQ(read(file_, 0).status, 0);  // an empty read succeeds even at the end
    EXPECT_EQ(files().reads().at(1).bytesRead, 488u);

    ASSERT_EQ(setPosition(file_, 514), 0);
    EXPECT_EQ(read(file_, 60).bytes, slice(514, 60));
    EXPECT_EQ(read(file_, 10).bytes, slice(574, 10));
    // Past the end is a valid position, where reads meet the end; before the start is not.
    ASSERT_EQ(setPosition(file_, 5000), 0);
    EXPECT_EQ(read(file_, 4).status, kStatusEndOfFile);
    EXPECT_EQ(setPosition(file_, -1), status::invalidParameter);
}

TEST_F(ReadTest, TheFileIsReadAsItWasWhenOpened)
{
    writeFile(drive() / "image.bin", patternBytes(10, 9));
    EXPECT_EQ(read(file_, 1000).bytes, content_);
    fs::remove(drive() / "image.bin");
    ASSERT_EQ(setPosition(file_, 0), 0);
    EXPECT_EQ(read(file_, 1000).bytes, content_);
}

TEST_F(ReadTest, TheSizeIsReportedOtherInformationIsRefusedAndInjectedFailuresChangeNothing)
{
    FILE_STANDARD_INFORMATION information{};
    IO_STATUS_BLOCK ioStatus{};
    ASSERT_EQ(querySize(file_, information, ioStatus), 0);
    EXPECT_EQ(information.EndOfFile.QuadPart, 1000);

    const std::tuple<bool, int, uint32_t, NTSTATUS> cases[] = {
        {false, 4, 40, status::invalidInfoClass},  // FileBasicInformation
        {false, kFileStandardInformation, 23, status::infoLengthMismatch},
        {true, 20, 8, status::invalidInfoClass},  // FileEndOfFileInformation: no writing
        {true, kFilePositionInformation, 4, status::infoLengthMismatch},
    };
    for (const auto& [set, informationClass, length, expected] : cases) {
        uint8_t buffer[64] = {};
        NTSTATUS result = set ? ZwSetInformationFile(file_, &ioStatus, buffer, length, informationClass)
                              : ZwQueryInformationFile(file_, &ioStatus, buffer, length, informationClass);
        EXPECT_EQ(result, expected) << (set ? "set " : "query ") << informationClass << " " << length;
    }

    EXPECT_EQ(read(file_, 4).bytes, slice(0, 4));
    files().failSizeQuery(status::deviceDataError);
    files().failSetPosition(status::accessDenied);
    EXPECT_EQ(querySize(file_, information, ioStatus), status::deviceDataError);
    EXPECT_EQ(setPosition(file_, 50), status::accessDenied);
    EXPECT_EQ(read(file_, 4).bytes, slice(4, 4));
    files().clearFaults();
    ASSERT_EQ(setPosition(file_, 50), 0);
    EXPECT_EQ(read(file_, 4).bytes, slice(50, 4));
}

TEST_F(ReadTest, InjectedSizeQueryFailuresHitTheNthQueryOfTheirFileOrOfAnyFile)
{
    writeFile(drive() / "other.bin", patternBytes(10));
    HANDLE other = openOrFail(u"C:\\other.bin");
    auto sizes = [](std::initializer_list<HANDLE> handles) {
        std::vector<NTSTATUS> statuses;
        for (HANDLE handle : handles) {
            FILE_STANDARD_INFORMATION information{};
            IO_STATUS_BLOCK ioStatus{};
            statuses.push_back(querySize(handle, information, ioStatus));
        }
        return statuses;
    };
    const NTSTATUS failed = status::deviceDataError;
    files().failSizeQueryNumber(2, failed, drive() / "image.bin");
    EXPECT_EQ(sizes({file_, other, file_, file_}), (std::vector<NTSTATUS>{0, 0, failed, 0}));
    files().failSizeQueryNumber(2, failed);
    EXPECT_EQ(sizes({file_, other, file_}), (std::vector<NTSTATUS>{0, failed, 0}));
    // One named file fails every time while the others answer.
    files().failSizeQueryNumber(0, failed, drive() / "other.bin");
    EXPECT_EQ(sizes({other, file_, other}), (std::vector<NTSTATUS>{failed, 0, failed}));
    EXPECT_EQ(ZwClose(other), 0);
}

TEST_F(ReadTest, InjectedReadFailuresReadNothingAndKeepThePosition)
{
    ASSERT_EQ(read(file_, 10).status, 0);  // read numbers count from after this one
    files().failReadNumber(2, status::deviceDataError);
    files().failReadNumber(4, kStatusEndOfFile);
    EXPECT_EQ(read(file_, 10).bytes, slice(10, 10));
    EXPECT_EQ(read(file_, 10).status, status::deviceDataError);
    EXPECT_EQ(read(file_, 10).bytes, slice(20, 10));
    EXPECT_EQ(read(file_, 10).status, kStatusEndOfFile);
    EXPECT_EQ(read(file_, 10).bytes, slice(30, 10));

    files().failReads(status::deviceDataError);
    for (int i = 0; i < 2; ++i) EXPECT_EQ(read(file_, 10).status, status::deviceDataError);
    files().failReads(0);
    EXPECT_EQ(read(file_, 10).bytes, slice(40, 10));
}

TEST_F(ReadTest, CallsOnAnythingButAnOpenFileAndAsynchronousReadsAreRefusedAndReported)
{
    writeFile(drive() / "other.bin", {});
    HANDLE closed = openOrFail(u"C:\\other.bin");
    ASSERT_EQ(ZwClose(closed), 0);
    HANDLE key = sim::kernel::openHandle(sim::kernel::HandleKind::registryKey, nullptr, "a registry key");
    uint8_t buffer[4];
    IO_STATUS_BLOCK ioStatus{};
    for (HANDLE handle : {closed, key}) {
        FILE_STANDARD_INFORMATION information{};
        EXPECT_EQ(ZwReadFile(handle, nullptr, nullptr, nullptr, &ioStatus, buffer, 4, nullptr, nullptr),
                  status::invalidHandle);
        EXPECT_EQ(querySize(handle, information, ioStatus), status::invalidHandle);
        EXPECT_EQ(setPosition(handle, 0), status::invalidHandle);
    }
    EXPECT_EQ(ZwClose(closed), status::invalidHandle);
    EXPECT_EQ(ZwClose(key), 0);
    expectMisuseReported(7, "which is not");

    LARGE_INTEGER before;
    before.QuadPart = -5;
    EXPECT_EQ(ZwReadFile(file_, reinterpret_cast<HANDLE>(-8), nullptr, nullptr, &ioStatus, buffer, 4, nullptr, nullptr),
              status::invalidParameter);
    EXPECT_EQ(ZwReadFile(file_, nullptr, nullptr, nullptr, &ioStatus, buffer, 4, &before, nullptr),
              status::invalidParameter);
    EXPECT_EQ(read(file_, 4).bytes, slice(0, 4));  // nothing was read
    EXPECT_EQ(files().reads().size(), 1u);
    expectMisuseReported(2, "ZwReadFile");
}

}  // namespace
}  // namespace files_test
