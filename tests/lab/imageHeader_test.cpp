// Image files the lab makes, and its reading of their header text, which must
// be the loader's.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "morvanek-lab/lib/generatedImage.h"
#include "morvanek-lab/lib/imageHeaderText.h"

namespace {

TEST(GeneratedImage, LeavesRoomForTheMarkerAndPutsTheHeaderAt514)
{
    lab::GeneratedImagePlan plan;
    plan.size = 600;
    std::vector<uint8_t> image = lab::generateImage(plan);
    ASSERT_EQ(image.size(), 600u);
    EXPECT_TRUE(image[6] == 0xFF && image[7] == 0xFF);
    EXPECT_EQ(std::string(image.begin() + 514, image.begin() + 544), lab::kDefaultHeaderText);
    EXPECT_NE(image[0], image[512]) << "blocks must differ, so that a misplaced block shows";

    plan.markerRoom = false;
    plan.size = 520;  // shorter than the header: cut, not overrun
    image = lab::generateImage(plan);
    EXPECT_NE(image[6], 0xFF);
    EXPECT_EQ(image.size(), 520u);
}

TEST(HeaderText, IsReadAsTheLoaderReadsIt)
{
    struct Case {
        const char* text;  // at 514 of an image of 1024 bytes, NUL after it; nullptr: an image of 100 bytes
        bool utf16;
        bool readable;
        uint32_t version, revision, type;
    };
    const Case cases[] = {
        {"0143C000000000010002000302000A", false, true, 0x0143C000, 0x0200, 0x0A},
        {"0143C000000000010002000302000A", true, true, 0x0143C000, 0x0200, 0x0A},
        {"0143C000 000000010002000302000A", false, false, 0, 0x0100, 0},
        {"0143C00000000001", false, true, 0x0143C000, 0, 0},
        {nullptr, false, true, 0, 0, 0},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(std::string(c.text ? c.text : "short file") + (c.utf16 ? " in 16-bit characters" : ""));
        lab::GeneratedImagePlan plan;
        plan.size = c.text ? 1024 : 100;
        plan.fillByte = 0;
        plan.header = c.text ? c.text : "";
        plan.headerAsUtf16 = c.utf16;
        lab::DecodedHeader header = lab::decodeImageHeader(lab::generateImage(plan));
        EXPECT_EQ(header.readable, c.readable) << header.problem;
        EXPECT_EQ(header.imageVersion, c.version);
        EXPECT_EQ(header.headerRevision, c.revision);
        EXPECT_EQ(header.imageType, c.type);
    }
}

}  // namespace
