// The default image files under the system root, and the limit on the system
// root that keeps the longest path within the path buffer.
#include "locationWorld.h"
#include "source/imageLocation.h"
#include "source/statusCodes.h"

using namespace location_test;
using sim::kernel::Registry;

namespace {

using Builder = void (*)(uint16_t, WCHAR*, tStatus&);

struct Flavour {
    const char* name;
    Builder build;
    const char* fileName;  // after the system root, for product 0x4B01
    size_t longestRoot;    // characters, NUL not counted
};

const Flavour kFlavours[] = {
    {"Image", buildDefaultImagePath, "\\system32\\drivers\\QVUSB4B01.bin", 227},
    {"Image0200", buildDefaultImagePath0200, "\\system32\\drivers\\QVUSB4B010200.bin", 223},
};

std::string root(size_t characters) { return "C:\\" + repeat('w', characters - 3); }

std::string build(const Flavour& flavour, uint16_t productId, tStatus& status)
{
    std::vector<WCHAR> path = untouchedBuffer(kPathCharacters);
    flavour.build(productId, path.data(), status);
    return textOf(path);
}

}  // namespace

// C:\WINDOWS\system32\drivers\QVUSB4B01.bin and ...QVUSB4B010200.bin, with the product's digits.
TEST_F(LocationWorld, DefaultPathIsTheSystemRootAndTheProductsFileNameInUpperCaseHex)
{
    struct Case {
        uint16_t productId;
        const char* digits;
    };
    for (const Flavour& flavour : kFlavours) {
        for (const Case& c : {Case{0x4B01, "4B01"}, Case{0x4b0a, "4B0A"}, Case{0x0000, "0000"},
                              Case{0xFFFF, "FFFF"}, Case{0x0E0F, "0E0F"}}) {
            SCOPED_TRACE(testing::Message() << flavour.name << " " << c.digits);
            tStatus status = 0;
            std::string expected = std::string("C:\\WINDOWS") + flavour.fileName;
            expected.replace(expected.find("4B01"), 4, c.digits);
            EXPECT_EQ(build(flavour, c.productId, status), expected);
            EXPECT_EQ(status, 0);
        }
    }
}

TEST_F(LocationWorld, LongestSystemRootGivesA258CharacterPath)
{
    struct Case {
        size_t extra;  // characters beyond the longest accepted root
        bool withTerminator;
        bool accepted;
    };
    const Case cases[] = {{0, true, true}, {0, false, true}, {1, true, false}, {1, false, false}};
    for (const Flavour& flavour : kFlavours) {
        for (const Case& c : cases) {
            SCOPED_TRACE(testing::Message() << flavour.name << " root of " << flavour.longestRoot + c.extra
                                            << (c.withTerminator ? "" : " without NUL"));
            std::string systemRoot = root(flavour.longestRoot + c.extra);
            sim::kernel::registry().setString(kSystemVersionKey, "SystemRoot", systemRoot, c.withTerminator);
            tStatus status = 0;
            std::string path = build(flavour, 0x4B01, status);
            EXPECT_EQ(status, c.accepted ? 0 : kStatusMissingOrMalformed);
            EXPECT_EQ(path, c.accepted ? systemRoot + flavour.fileName : "");
            if (c.accepted) {
                EXPECT_EQ(path.size(), 258u);
            }
        }
    }
}

TEST_F(LocationWorld, UnreadableSystemRootLeavesThePathEmpty)
{
    struct Case {
        const char* name;
        Prepare prepare;
        tStatus status;
    };
    const Case cases[] = {
        {"Missing", [](Registry& r) { r.deleteValue(kSystemVersionKey, "SystemRoot"); }, kStatusMissingOrMalformed},
        {"Expandable",
         [](Registry& r) {
             r.setValue(kSystemVersionKey, "SystemRoot", 2, sim::kernel::utf16leBytes("%SystemDrive%\\WINDOWS"));
         },
         kStatusMissingOrMalformed},
        {"KeyParentMissing", [](Registry& r) { r.deleteKey("\\Registry\\Machine\\Software\\Microsoft\\Windows NT"); },
         kStatusRegistryKeyNotFound},
    };
    for (const Flavour& flavour : kFlavours) {
        for (const Case& c : cases) {
            SCOPED_TRACE(testing::Message() << flavour.name << " " << c.name);
            sim::kernel::registry().reset();
            sim::kernel::registry().setString(kSystemVersionKey, "SystemRoot", "C:\\WINDOWS");
            c.prepare(sim::kernel::registry());
            tStatus status = 0;
            EXPECT_EQ(build(flavour, 0x4B01, status), "");
            EXPECT_EQ(status, c.status);
            EXPECT_EQ(sim::kernel::openHandleCount(), 0u);
        }
    }
}

TEST_F(LocationWorld, NegativeStatusOnEntryLeavesThePathEmpty)
{
    sim::kernel::registry().setString(instanceKey(0x5C1D, 0x4B01, 1), "Driver", "x");
    for (const Flavour& flavour : kFlavours) {
        SCOPED_TRACE(flavour.name);
        tStatus status = -7;
        EXPECT_EQ(build(flavour, 0x4B01, status), "");
        EXPECT_EQ(status, -7);
    }
    std::vector<WCHAR> path = untouchedBuffer(kPathCharacters);
    tStatus status = -7;
    locateFirmwareImage(0x5C1D, 0x4B01, 1, path.data(), status);
    EXPECT_EQ(textOf(path), "");
    EXPECT_EQ(status, -7);
    EXPECT_EQ(sim::kernel::registry().calls().size(), 0u);
}
