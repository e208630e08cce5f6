// A file as a real system can hand it over: a read that brings fewer bytes
// than asked before the end, and a file replaced between two opens.
#include "fileTestWorld.h"

namespace files_test {
namespace {

using ChangingFileTest = FileWorldTest;

TEST_F(ChangingFileTest, AShortenedReadBringsFewerBytesReportsSuccessAndTheNextGoesOnFromThere)
{
    const std::vector<uint8_t> content = patternBytes(1000);
    writeFile(drive() / "image.bin", content);
    HANDLE file = openOrFail(u"C:\\image.bin");
    files().shortenRead(2, 100);

    EXPECT_EQ(read(file, 512).bytes.size(), 512u);
    ReadResult shortened = read(file, 512);
    EXPECT_EQ(shortened.status, 0);
    EXPECT_EQ(shortened.bytes, std::vector<uint8_t>(content.begin() + 512, content.begin() + 612));
    EXPECT_EQ(read(file, 512).bytes, std::vector<uint8_t>(content.begin() + 612, content.end()));
    EXPECT_EQ(files().reads().at(1).bytesRead, 100u);
    EXPECT_EQ(ZwClose(file), 0);
}

TEST_F(ChangingFileTest, AFileChangedAfterItsFirstOpenShowsTheNewBytesFromTheNextOpenOnAndEachOpenRecordsWhatItSaw)
{
    const std::vector<uint8_t> before = patternBytes(700);
    const std::vector<uint8_t> after = patternBytes(300, 5);
    writeFile(drive() / "image.bin", before);
    files().changeContentAfterOpens(drive() / "image.bin", 1, after);

    for (const std::vector<uint8_t>* expected : {&before, &after, &after}) {
        HANDLE file = openOrFail(u"C:\\IMAGE.BIN");
        EXPECT_EQ(read(file, 1000).bytes, *expected);
        EXPECT_EQ(ZwClose(file), 0);
    }
    ASSERT_EQ(files().opens().size(), 3u);
    EXPECT_EQ(files().opens()[0].bytes, before);
    EXPECT_EQ(files().opens()[1].bytes, after);
    // The disk itself is never written.
    std::ifstream disk(drive() / "image.bin", std::ios::binary | std::ios::ate);
    EXPECT_EQ(static_cast<size_t>(disk.tellg()), before.size());
}

}  // namespace
}  // namespace files_test
