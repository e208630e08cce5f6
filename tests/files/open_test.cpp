// Opening files by DOS name: how names map onto the drive's folder, which
// names and requests are refused and reported, and who may open a file while
// another has it open.
#include "fileTestWorld.h"

namespace files_test {
namespace {

using OpenTest = FileWorldTest;

TEST_F(OpenTest, OpensAnExistingFileWhateverTheAsciiCaseOfItsName)
{
    fs::path image = drive() / "Windows" / "System32" / "drivers" / "QVUSB0000.bin";
    writeFile(image, patternBytes(600));

    HANDLE file = openOrFail(u"c:\\WINDOWS\\system32\\DRIVERS\\qvusb0000.BIN");

    EXPECT_EQ(files().opens().at(0).dosPath, "\\??\\c:\\WINDOWS\\system32\\DRIVERS\\qvusb0000.BIN");
    // Kernel handles are negative: the module narrows them to 32 bits and back.
    intptr_t value = reinterpret_cast<intptr_t>(file);
    EXPECT_LT(value, 0);
    EXPECT_EQ(static_cast<intptr_t>(static_cast<int32_t>(value)), value);
    EXPECT_EQ(read(file, 600).bytes, patternBytes(600));
    EXPECT_EQ(ZwClose(file), 0);
    EXPECT_EQ(files().openFileCount(), 0u);
    EXPECT_EQ(files().filesOpened(), std::vector<fs::path>{fs::canonical(image)});
}

TEST_F(OpenTest, AnExactMatchWinsNonAsciiMatchesAsItIsAndLinksInsideAreFollowed)
{
    for (const char* name : {"Image.bin", "image.bin", "IMAGE.bin", "drivers/\xC3\x84rger.bin"})  // "Ärger.bin"
        writeFile(drive() / name, {});
    fs::create_directory_symlink(drive() / "drivers", drive() / "alias");
    fs::create_symlink(drive() / "drivers" / "\xC3\x84rger.bin", drive() / "shortcut.bin");

    const std::pair<const char16_t*, fs::path> cases[] = {
        {u"C:\\Image.bin", "Image.bin"},
        {u"C:\\image.bin", "image.bin"},
        {u"C:\\IMAGE.bin", "IMAGE.bin"},
        {u"C:\\DRIVERS\\\u00C4RGER.BIN", "drivers/\xC3\x84rger.bin"},
        {u"C:\\alias\\\u00C4rger.BIN", "drivers/\xC3\x84rger.bin"},
        {u"C:\\Shortcut.bin", "drivers/\xC3\x84rger.bin"},
    };
    for (const auto& [name, file] : cases) {
        SCOPED_TRACE(sim::kernel::toUtf8(name));
        EXPECT_EQ(ZwClose(openOrFail(name)), 0);
        EXPECT_EQ(files().opens().back().hostPath, fs::canonical(drive() / file));
    }
    // With no exact match, the choice is the same every time.
    for (int i = 0; i < 2; ++i) EXPECT_EQ(ZwClose(openOrFail(u"C:\\image.BIN")), 0);
    EXPECT_EQ(files().opens().back().hostPath, files().opens()[files().opens().size() - 2].hostPath);
}

TEST_F(OpenTest, RefusedNamesOpenNothing)
{
    writeFile(drive() / "drivers" / "image.bin", {});
    writeFile(outside() / "outside.bin", {});
    fs::create_directory_symlink(outside(), drive() / "escape");
    fs::create_symlink(outside() / "outside.bin", drive() / "link-out.bin");
    fs::create_symlink(drive() / "gone.bin", drive() / "dangling.bin");
    files().mapDrive('q', drive());
    files().unmapDrive('Q');

    const std::tuple<const char16_t*, NTSTATUS, const char*> cases[] = {
        {u"\\??\\C:\\drivers\\missing.bin", status::objectNameNotFound, "a missing file"},
        {u"\\??\\C:\\nowhere\\image.bin", status::objectPathNotFound, "a missing directory on the way"},
        {u"\\??\\C:\\drivers", status::fileIsADirectory, "a directory"},
        {u"\\??\\C:\\drivers\\image.bin\\", status::objectNameInvalid, "a file named as a directory"},
        {u"\\??\\C:\\..\\outside.bin", status::objectNameInvalid, "dot-dot leaving the drive"},
        {u"\\??\\C:\\escape\\outside.bin", status::objectNameInvalid, "a directory link leaving the drive"},
        {u"\\??\\C:\\link-out.bin", status::objectNameInvalid, "a file link leaving the drive"},
        {u"\\??\\C:\\dangling.bin", status::objectNameNotFound, "a link to nothing"},
        {u"\\??\\C:\\drivers/image.bin", status::objectNameInvalid, "a slash is no separator"},
        {u"\\??\\C:\\drivers\\\xD800image.bin", status::objectNameInvalid, "a lone surrogate"},
        {u"\\??\\Q:\\drivers\\image.bin", status::objectPathNotFound, "an unmapped drive"},
        {u"\\??\\", status::objectNameInvalid, "nothing after the prefix"},
        {u"C:\\drivers\\image.bin", status::objectNameInvalid, "no DOS devices prefix"},
    };
    for (const auto& [name, expected, why] : cases) {
        SCOPED_TRACE(why);
        CreateResult result = create({name});
        EXPECT_EQ(result.status, expected) << std::hex << result.status;
        EXPECT_EQ(result.ioStatus.Status, expected);
        EXPECT_EQ(result.handle, nullptr);
        EXPECT_EQ(files().opens().back().status, expected);
    }
    EXPECT_TRUE(files().filesOpened().empty());
}

TEST_F(OpenTest, OpensTheModuleNeverAsksForAreRefusedAndReported)
{
    writeFile(drive() / "image.bin", {});
    using Change = void (*)(CreateRequest&);
    const std::tuple<const char*, Change, NTSTATUS> cases[] = {
        {"create a file", [](CreateRequest& r) { r.disposition = 2; }, status::invalidParameter},
        {"write data", [](CreateRequest& r) { r.desiredAccess |= 0x2; }, status::accessDenied},
        {"no read access", [](CreateRequest& r) { r.desiredAccess = 0x20000; }, status::accessDenied},
        {"directories allowed", [](CreateRequest& r) { r.options &= ~kFileNonDirectoryFile; },
         status::invalidParameter},
        {"asynchronous", [](CreateRequest& r) { r.options &= ~kFileSynchronousIoNonalert; }, status::invalidParameter},
        {"share nonsense", [](CreateRequest& r) { r.shareAccess = 0x10; }, status::invalidParameter},
        {"short attributes", [](CreateRequest& r) { r.attributesLength = 40; }, status::invalidParameter},
        {"case-sensitive", [](CreateRequest& r) { r.attributeFlags = kObjKernelHandle; }, status::invalidParameter},
        {"a handle user mode can reach", [](CreateRequest& r) { r.attributeFlags = kObjCaseInsensitive; },
         status::invalidParameter},
        {"relative to a root", [](CreateRequest& r) { r.rootDirectory = reinterpret_cast<HANDLE>(-4); },
         status::invalidParameter},
        {"extended attributes", [](CreateRequest& r) { r.eaLength = 8; }, status::invalidParameter},
        {"odd counted name", [](CreateRequest& r) { r.nameBytes = 3; }, status::objectNameInvalid},
    };
    for (const auto& [what, change, expected] : cases) {
        SCOPED_TRACE(what);
        CreateRequest request;
        change(request);
        CreateResult result = create(request);
        EXPECT_EQ(result.status, expected);
        EXPECT_EQ(result.handle, nullptr);
        expectMisuseReported(1, "ZwCreateFile");
    }
    EXPECT_TRUE(files().filesOpened().empty());

    // The name is read only as far as its counted length.
    CreateRequest request;
    request.nameBytes = static_cast<int>(request.name.size() * sizeof(WCHAR));
    request.name += u"XYZ";
    EXPECT_EQ(ZwClose(create(request).handle), 0);
}

// Readers that all share reading open one file together; an open that does
// not share excludes every other, and a file held elsewhere stays shut.
TEST_F(OpenTest, SharingDecidesWhoOpensAFileTogether)
{
    for (const char* name : {"image.bin", "other.bin", "third.bin"}) writeFile(drive() / name, {});
    CreateRequest exclusive;
    exclusive.shareAccess = 0;
    HANDLE first = create(exclusive).handle;
    ASSERT_NE(first, nullptr);
    sim::kernel::FileHoldToken hold = files().holdOpenElsewhere(drive() / "other.bin");

    EXPECT_EQ(create({u"\\??\\C:\\IMAGE.bin"}).status, status::sharingViolation);  // another spelling, the same file
    EXPECT_EQ(create({u"\\??\\C:\\other.bin"}).ioStatus.Status, status::sharingViolation);
    EXPECT_EQ(ZwClose(openOrFail(u"C:\\third.bin")), 0);
    EXPECT_EQ(ZwClose(first), 0);

    HANDLE reader = openOrFail(u"C:\\image.bin");
    HANDLE secondReader = openOrFail(u"C:\\IMAGE.BIN");
    EXPECT_EQ(create(exclusive).status, status::sharingViolation);
    EXPECT_EQ(ZwClose(reader), 0);
    EXPECT_EQ(ZwClose(secondReader), 0);

    files().releaseHold(hold);
    EXPECT_EQ(ZwClose(openOrFail(u"C:\\other.bin")), 0);
}

// The Nth open of one file, or of any file, fails as told; other opens and
// later ones are untouched, and a failed open leaves no handle.
TEST_F(OpenTest, InjectedOpenFailuresHitTheNthOpenOfTheirFileOrOfAnyFile)
{
    for (const char* name : {"image.bin", "other.bin"}) writeFile(drive() / name, {});
    auto opens = [](std::initializer_list<const char16_t*> names) {
        std::vector<NTSTATUS> statuses;
        for (const char16_t* name : names) {
            CreateResult result = create({std::u16string(u"\\??\\C:\\") + name});
            statuses.push_back(result.status);
            EXPECT_EQ(result.handle == nullptr, result.status < 0);
            if (result.status >= 0) {
                EXPECT_EQ(ZwClose(result.handle), 0);
            }
        }
        return statuses;
    };
    const NTSTATUS denied = status::accessDenied;
    const NTSTATUS missing = status::objectNameNotFound;

    // The second open of image.bin, spelt in any case, counted from now.
    files().failOpenNumber(2, denied, drive() / "image.bin");
    EXPECT_EQ(opens({u"image.bin", u"other.bin", u"IMAGE.BIN", u"image.bin"}), (std::vector<NTSTATUS>{0, 0, denied, 0}));
    // The third open of any file, even one that is not there.
    files().failOpenNumber(3, denied);
    EXPECT_EQ(opens({u"other.bin", u"nowhere.bin", u"nowhere.bin", u"image.bin"}),
              (std::vector<NTSTATUS>{0, missing, denied, 0}));
    // Every open of one file.
    files().failOpenNumber(0, denied, drive() / "other.bin");
    EXPECT_EQ(opens({u"other.bin", u"image.bin", u"other.bin"}), (std::vector<NTSTATUS>{denied, 0, denied}));
    files().clearFaults();
    EXPECT_EQ(opens({u"other.bin"}), (std::vector<NTSTATUS>{0}));
}

}  // namespace
}  // namespace files_test
