// Opens without sharing: one open of a file at a time, whoever holds it.
#include "fileTestWorld.h"

namespace files_test {
namespace {

class SharingTest : public FileWorldTest {
  protected:
    void SetUp() override
    {
        FileWorldTest::SetUp();
        image_ = drive() / "drivers" / "image.bin";
        writeFile(image_, patternBytes(64));
        writeFile(drive() / "drivers" / "other.bin", patternBytes(64));
    }
    fs::path image_;
};

TEST_F(SharingTest, ASecondOpenFailsUntilTheFirstIsClosed)
{
    HANDLE first = openOrFail(u"C:\\drivers\\image.bin");

    // Another spelling of the same file is the same file.
    CreateResult second = open(u"C:\\DRIVERS\\Image.BIN");
    EXPECT_EQ(second.status, status::sharingViolation);
    EXPECT_EQ(second.ioStatus.Status, status::sharingViolation);
    EXPECT_EQ(sim::kernel::files().opens().back().hostPath, fs::canonical(image_));
    // Other files are not affected.
    HANDLE other = openOrFail(u"C:\\drivers\\other.bin");

    EXPECT_EQ(ZwClose(first), 0);
    HANDLE again = openOrFail(u"C:\\drivers\\image.bin");
    EXPECT_EQ(sim::kernel::files().openFileCount(), 2u);
    EXPECT_EQ(ZwClose(again), 0);
    EXPECT_EQ(ZwClose(other), 0);
}

TEST_F(SharingTest, AFileHeldElsewhereCannotBeOpenedUntilReleased)
{
    sim::kernel::FileHoldToken hold = sim::kernel::files().holdOpenElsewhere(image_);

    EXPECT_EQ(open(u"C:\\drivers\\image.bin").status, status::sharingViolation);
    HANDLE other = openOrFail(u"C:\\drivers\\other.bin");
    EXPECT_EQ(ZwClose(other), 0);

    sim::kernel::files().releaseHold(hold);
    HANDLE file = openOrFail(u"C:\\drivers\\image.bin");
    EXPECT_EQ(ZwClose(file), 0);
}

TEST_F(SharingTest, OpensThatAllShareReadingCoexist)
{
    struct Case {
        uint32_t firstShare;
        uint32_t secondShare;
        NTSTATUS expected;
    };
    const uint32_t kShareRead = 1;
    for (Case c :
         {Case{kShareRead, kShareRead, 0}, Case{kShareRead, 0, status::sharingViolation},
          Case{0, kShareRead, status::sharingViolation}, Case{7, 7, 0}, Case{6, 7, status::sharingViolation}}) {
        CreateRequest request;
        request.name = u"\\??\\C:\\drivers\\image.bin";
        request.shareAccess = c.firstShare;
        CreateResult first = create(request);
        ASSERT_EQ(first.status, 0);
        request.shareAccess = c.secondShare;
        CreateResult second = create(request);
        EXPECT_EQ(second.status, c.expected) << c.firstShare << " then " << c.secondShare;
        EXPECT_EQ(ZwClose(first.handle), 0);
        if (second.status == 0) {
            EXPECT_EQ(ZwClose(second.handle), 0);
        }
    }
}

} // namespace
} // namespace files_test
