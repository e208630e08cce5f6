// Opening files by DOS name: how names map onto the drive's folder, and which
// names are refused.
#include "fileTestWorld.h"

namespace files_test {
namespace {

using OpenTest = FileWorldTest;

TEST_F(OpenTest, OpensAnExistingFileWhateverTheCaseOfItsName)
{
    fs::path image = drive() / "Windows" / "System32" / "drivers" / "QVUSB0000.bin";
    writeFile(image, patternBytes(600));

    CreateResult result = open(u"c:\\WINDOWS\\system32\\DRIVERS\\qvusb0000.BIN");

    ASSERT_EQ(result.status, 0);
    EXPECT_EQ(result.ioStatus.Status, 0);
    EXPECT_EQ(result.ioStatus.Information, status::fileOpened);
    EXPECT_EQ(sim::kernel::files().openFileCount(), 1u);
    ASSERT_EQ(sim::kernel::files().opens().size(), 1u);
    const sim::kernel::FileOpenRecord& record = sim::kernel::files().opens()[0];
    EXPECT_EQ(record.dosPath, "\\??\\c:\\WINDOWS\\system32\\DRIVERS\\qvusb0000.BIN");
    EXPECT_EQ(record.hostPath, fs::canonical(image));
    EXPECT_EQ(record.handle, result.handle);
    EXPECT_EQ(read(result.handle, 600).bytes, patternBytes(600));

    EXPECT_EQ(ZwClose(result.handle), 0);
    EXPECT_EQ(sim::kernel::files().openFileCount(), 0u);
    EXPECT_EQ(sim::kernel::files().filesOpened(), std::vector<fs::path>{fs::canonical(image)});
}

struct RefusedName {
    const char16_t* dosPath;
    NTSTATUS expected;
    const char* why;
};

class RefusedNameTest : public FileWorldTest, public ::testing::WithParamInterface<RefusedName> {};

TEST_P(RefusedNameTest, IsRefusedAndNothingIsOpened)
{
    writeFile(drive() / "drivers" / "image.bin", patternBytes(16));
    writeFile(drive() / "drivers" / "\xC3\x84rger.bin", patternBytes(16)); // "Ärger.bin"
    writeFile(outside() / "outside.bin", patternBytes(16));
    fs::create_directory_symlink(outside(), drive() / "escape");
    fs::create_symlink(outside() / "outside.bin", drive() / "link-out.bin");
    fs::create_symlink(drive() / "gone.bin", drive() / "dangling.bin");

    CreateResult result = open(GetParam().dosPath);

    EXPECT_EQ(result.status, GetParam().expected) << std::hex << result.status;
    EXPECT_EQ(result.ioStatus.Status, GetParam().expected);
    EXPECT_EQ(result.handle, nullptr);
    EXPECT_EQ(sim::kernel::files().openFileCount(), 0u);
    EXPECT_TRUE(sim::kernel::files().filesOpened().empty());
    ASSERT_EQ(sim::kernel::files().opens().size(), 1u);
    EXPECT_EQ(sim::kernel::files().opens()[0].status, GetParam().expected);
}

const RefusedName kRefusedNames[] = {
    {u"C:\\drivers\\missing.bin", status::objectNameNotFound, "missing file"},
    {u"C:\\nowhere\\image.bin", status::objectPathNotFound, "missing directory on the way"},
    {u"C:\\drivers\\image.bin\\more.bin", status::objectPathNotFound, "a file used as a directory"},
    {u"C:\\drivers", status::fileIsADirectory, "a directory"},
    {u"C:\\", status::fileIsADirectory, "the drive's root"},
    {u"C:\\drivers\\image.bin\\", status::objectNameInvalid, "a file named as a directory"},
    {u"C:\\drivers\\..\\drivers\\image.bin", status::objectNameInvalid, "dot-dot, even staying inside"},
    {u"C:\\..\\outside.bin", status::objectNameInvalid, "dot-dot leaving the drive"},
    {u"C:\\.\\drivers\\image.bin", status::objectNameInvalid, "a dot component"},
    {u"C:\\escape\\outside.bin", status::objectNameInvalid, "a directory link leaving the drive"},
    {u"C:\\link-out.bin", status::objectNameInvalid, "a file link leaving the drive"},
    {u"C:\\dangling.bin", status::objectNameNotFound, "a link to nothing"},
    {u"C:\\drivers/image.bin", status::objectNameInvalid, "a slash is no separator"},
    {u"C:\\drivers\\\\image.bin", status::objectNameInvalid, "an empty component"},
    {u"C:\\drivers\\image.bin:stream", status::objectNameInvalid, "a stream name"},
    {u"C:\\drivers\\ima\u0001e.bin", status::objectNameInvalid, "a control character"},
    {u"C:\\drivers\\\xD800image.bin", status::objectNameInvalid, "a lone surrogate"},
    {u"C:\\drivers\\\u00E4rger.bin", status::objectNameNotFound, "case folds for ASCII only"},
    {u"Q:\\drivers\\image.bin", status::objectPathNotFound, "an unmapped drive"},
    {u"C:drivers\\image.bin", status::objectPathNotFound, "no such DOS device"},
    {u"", status::objectNameInvalid, "nothing after the prefix"},
};

INSTANTIATE_TEST_SUITE_P(Names, RefusedNameTest, ::testing::ValuesIn(kRefusedNames));

TEST_F(OpenTest, NonAsciiNamesMatchExactly)
{
    writeFile(drive() / "drivers" / "\xC3\x84rger.bin", patternBytes(16)); // "Ärger.bin"

    HANDLE file = openOrFail(u"C:\\DRIVERS\\\u00C4RGER.BIN");

    EXPECT_EQ(sim::kernel::files().opens()[0].dosPath, "\\??\\C:\\DRIVERS\\\xC3\x84RGER.BIN");
    EXPECT_EQ(ZwClose(file), 0);
}

TEST_F(OpenTest, NamesWithoutTheDosDevicesPrefixAreInvalid)
{
    writeFile(drive() / "image.bin", patternBytes(16));
    for (const char16_t* name : {u"C:\\image.bin", u"\\Device\\HarddiskVolume1\\image.bin", u"\\??C:\\image.bin"}) {
        CreateRequest request;
        request.name = name;
        EXPECT_EQ(create(request).status, status::objectNameInvalid);
    }
    EXPECT_EQ(sim::kernel::files().openFileCount(), 0u);
}

TEST_F(OpenTest, LinksThatStayInsideTheDriveAreFollowed)
{
    fs::path image = drive() / "drivers" / "image.bin";
    writeFile(image, patternBytes(16));
    fs::create_directory_symlink(drive() / "drivers", drive() / "alias");
    fs::create_symlink(image, drive() / "shortcut.bin");

    for (const char16_t* name : {u"C:\\alias\\IMAGE.bin", u"C:\\Shortcut.bin"}) {
        HANDLE file = openOrFail(name);
        EXPECT_EQ(sim::kernel::files().opens().back().hostPath, fs::canonical(image));
        EXPECT_EQ(ZwClose(file), 0);
    }
}

TEST_F(OpenTest, AnExactMatchWinsOverOtherSpellings)
{
    writeFile(drive() / "Image.bin", patternBytes(8, 1));
    writeFile(drive() / "image.bin", patternBytes(8, 2));
    writeFile(drive() / "IMAGE.bin", patternBytes(8, 3));

    struct Case {
        const char16_t* name;
        uint8_t seed;
    };
    for (Case c : {Case{u"C:\\Image.bin", 1}, Case{u"C:\\image.bin", 2}, Case{u"C:\\IMAGE.bin", 3}}) {
        HANDLE file = openOrFail(c.name);
        EXPECT_EQ(read(file, 8).bytes, patternBytes(8, c.seed));
        EXPECT_EQ(ZwClose(file), 0);
    }
    // With no exact match, the choice is the same every time.
    HANDLE first = openOrFail(u"C:\\image.BIN");
    fs::path chosen = sim::kernel::files().opens().back().hostPath;
    EXPECT_EQ(ZwClose(first), 0);
    HANDLE second = openOrFail(u"C:\\image.BIN");
    EXPECT_EQ(sim::kernel::files().opens().back().hostPath, chosen);
    EXPECT_EQ(ZwClose(second), 0);
}

TEST_F(OpenTest, DrivesCanBeRemappedAndUnmapped)
{
    fs::path other = outside() / "drive-d";
    writeFile(other / "image.bin", patternBytes(16));

    EXPECT_EQ(open(u"D:\\image.bin").status, status::objectPathNotFound);
    sim::kernel::files().mapDrive('d', other);
    HANDLE file = openOrFail(u"d:\\image.bin");
    EXPECT_EQ(ZwClose(file), 0);
    sim::kernel::files().unmapDrive('D');
    EXPECT_EQ(open(u"D:\\image.bin").status, status::objectPathNotFound);

    // A drive whose folder is gone has no paths at all.
    sim::kernel::files().mapDrive('E', outside() / "not-there");
    EXPECT_EQ(open(u"E:\\image.bin").status, status::objectPathNotFound);
}

} // namespace
} // namespace files_test
