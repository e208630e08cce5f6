// Opening image files: the exact request the kernel gets, the paths and modes
// refused before any open, and the opens the kernel refuses.
#include <functional>

#include "ImageWorld.h"

namespace {

using create_file_spy::calls;

class OpenImageFile : public ImageWorld {};

// "C:\" and a folder of 200 characters, then a file name that brings the whole path to `length`.
std::string pathOfLength(size_t length)
{
    std::string path = "C:\\" + std::string(200, 'd') + "\\";
    return path + std::string(length - path.size() - 4, 'f') + ".bin";
}

TEST_F(OpenImageFile, OpensAnExistingFileForReadingOnlyWithoutSharing)
{
    writeFile("C:\\images\\a.bin", {1, 2, 3});
    const int32_t file = openImageFile(wide("C:\\images\\a.bin").c_str(), 0x8000);
    ASSERT_NE(file, -1);
    ASSERT_EQ(calls().size(), 1u);
    const create_file_spy::CreateFileCall& call = calls()[0];
    EXPECT_EQ(call.name, "\\??\\C:\\images\\a.bin");
    EXPECT_EQ(call.desiredAccess, 0x20001u);
    EXPECT_EQ(call.objectAttributesLength, 48u);
    EXPECT_FALSE(call.rootDirectory);
    EXPECT_EQ(call.objectAttributes, 0x40u);
    EXPECT_FALSE(call.securityGiven);
    EXPECT_FALSE(call.allocationSizeGiven);
    EXPECT_EQ(call.fileAttributes, 0x80u);
    EXPECT_EQ(call.shareAccess, 0u);
    EXPECT_EQ(call.createDisposition, 1u);
    EXPECT_EQ(call.createOptions, 0x64u);
    EXPECT_FALSE(call.extendedAttributesGiven);
    // The narrowed handle widens back to the kernel's own, which the caller closes.
    EXPECT_EQ(imageFileHandle(file), sim::kernel::files().opens().back().handle);
    EXPECT_EQ(ZwClose(imageFileHandle(file)), 0);
}

TEST_F(OpenImageFile, TakesPathsOfUpTo259Characters)
{
    const std::string longest = pathOfLength(259);
    writeFile(longest, {1});
    const int32_t file = openImageFile(wide(longest).c_str(), 0x8000);
    ASSERT_NE(file, -1);
    ASSERT_EQ(sim::kernel::files().opens().size(), 1u);
    EXPECT_EQ(sim::kernel::files().opens()[0].dosPath, "\\??\\" + longest);
    EXPECT_EQ(ZwClose(imageFileHandle(file)), 0);
}

TEST_F(OpenImageFile, RefusesWithoutAnOpenOrWhenTheKernelRefuses)
{
    writeFile("C:\\images\\a.bin", {1});
    const std::u16string image = wide("C:\\images\\a.bin");
    struct Case {
        const char* name;
        std::u16string path;
        int32_t mode;
        size_t opens;
        std::function<void()> arrange;
    };
    const Case cases[] = {
        {"PathOf260Characters", wide(pathOfLength(260)), 0x8000, 0, {}},
        {"ModeZero", image, 0, 0, {}},
        {"ReadOnlyModeWithAnotherBit", image, 0x8001, 0, {}},
        {"AnotherMode", image, 0x4000, 0, {}},
        {"MissingFile", wide("C:\\images\\b.bin"), 0x8000, 1, {}},
        {"Folder", wide("C:\\images"), 0x8000, 1, {}},
        {"HeldOpenElsewhere", image, 0x8000, 1,
         [this] { sim::kernel::files().holdOpenElsewhere(hostPath("C:\\images\\a.bin")); }},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        sim::kernel::files().reset();
        sim::kernel::files().mapDrive('C', driveC);
        if (c.arrange) c.arrange();
        EXPECT_EQ(openImageFile(c.path.c_str(), c.mode), -1);
        EXPECT_EQ(sim::kernel::files().opens().size(), c.opens);
    }
    EXPECT_EQ(openImageFile(nullptr, 0x8000), -1);
    EXPECT_EQ(sim::kernel::files().openFileCount(), 0u);
}

}  // namespace
