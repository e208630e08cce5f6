// Failures injected into reads, size queries and position changes.
#include "fileTestWorld.h"

namespace files_test {
namespace {

class FaultTest : public FileWorldTest {
  protected:
    void SetUp() override
    {
        FileWorldTest::SetUp();
        content_ = patternBytes(100);
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

TEST_F(FaultTest, FailingReadsReadNothingAndKeepThePosition)
{
    ASSERT_EQ(read(file_, 10).status, 0);
    sim::kernel::files().failReads(status::deviceDataError);

    for (int i = 0; i < 3; ++i) {
        ReadResult failed = read(file_, 10);
        EXPECT_EQ(failed.status, status::deviceDataError);
        EXPECT_EQ(failed.information, 0u);
    }
    EXPECT_EQ(position(file_), 10);

    sim::kernel::files().failReads(0);
    EXPECT_EQ(read(file_, 10).bytes, slice(10, 10));
    EXPECT_EQ(sim::kernel::files().reads()[2].status, status::deviceDataError);
}

TEST_F(FaultTest, TheNthReadFromNowFailsOnce)
{
    ASSERT_EQ(read(file_, 10).status, 0); // counting starts after this one
    sim::kernel::files().failReadNumber(2, status::deviceDataError);
    sim::kernel::files().failReadNumber(4, kStatusEndOfFile);

    struct Expected {
        NTSTATUS status;
        size_t from; // where the bytes come from when the read succeeds
    };
    const Expected expected[] = {{0, 10}, {status::deviceDataError, 0}, {0, 20}, {kStatusEndOfFile, 0}, {0, 30}};
    for (const Expected& e : expected) {
        ReadResult result = read(file_, 10);
        EXPECT_EQ(result.status, e.status);
        if (e.status == 0) {
            EXPECT_EQ(result.bytes, slice(e.from, 10));
        } else {
            EXPECT_EQ(result.information, 0u);
        }
    }
}

TEST_F(FaultTest, SizeQueriesFailOnRequestButPositionQueriesDoNot)
{
    sim::kernel::files().failSizeQuery(status::deviceDataError);
    FILE_STANDARD_INFORMATION information{};
    IO_STATUS_BLOCK ioStatus{};
    EXPECT_EQ(ZwQueryInformationFile(file_, &ioStatus, &information, sizeof information, kFileStandardInformation),
              status::deviceDataError);
    EXPECT_EQ(ioStatus.Status, status::deviceDataError);
    EXPECT_EQ(position(file_), 0);

    sim::kernel::files().clearFaults();
    EXPECT_EQ(ZwQueryInformationFile(file_, &ioStatus, &information, sizeof information, kFileStandardInformation), 0);
    EXPECT_EQ(information.EndOfFile.QuadPart, 100);
}

TEST_F(FaultTest, FailedPositionChangesLeaveThePosition)
{
    ASSERT_EQ(read(file_, 5).status, 0);
    sim::kernel::files().failSetPosition(status::accessDenied);
    EXPECT_EQ(setPosition(file_, 50), status::accessDenied);
    EXPECT_EQ(read(file_, 5).bytes, slice(5, 5));
    EXPECT_EQ(sim::kernel::files().informationCalls().front().status, status::accessDenied);
    EXPECT_TRUE(sim::kernel::files().informationCalls().front().set);
}

} // namespace
} // namespace files_test
