// Image files the lab makes, and its reading of their header text.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "morvanek-lab/lib/GeneratedImage.h"
#include "morvanek-lab/lib/ImageHeaderText.h"

namespace {

std::vector<uint8_t> imageWithHeader(const std::string& text, bool utf16 = false)
{
    lab::GeneratedImagePlan plan;
    plan.size = 1024;
    plan.fillByte = 0;  // NUL after the text: the loader passes over it
    plan.header = text;
    plan.headerAsUtf16 = utf16;
    return lab::generateImage(plan);
}

TEST(GeneratedImage, LeavesRoomForTheMarkerAndPutsTheHeaderAt514)
{
    lab::GeneratedImagePlan plan;
    plan.size = 600;
    std::vector<uint8_t> image = lab::generateImage(plan);
    ASSERT_EQ(image.size(), 600u);
    EXPECT_EQ(image[6], 0xFF);
    EXPECT_EQ(image[7], 0xFF);
    EXPECT_EQ(std::string(image.begin() + 514, image.begin() + 544), lab::kDefaultHeaderText);
    EXPECT_NE(image[0], image[512]) << "blocks must differ, so that a misplaced block shows";

    plan.markerRoom = false;
    plan.size = 520;  // shorter than the header: cut, not overrun
    image = lab::generateImage(plan);
    EXPECT_NE(image[6], 0xFF);
    EXPECT_EQ(image.size(), 520u);
}

struct HeaderCase {
    const char* name;
    std::vector<uint8_t> image;
    bool readable;
    uint32_t version;
    uint32_t revision;
    uint32_t type;
};

const HeaderCase kHeaders[] = {
    {"bytes", imageWithHeader("0143C000000000010002000302000A"), true, 0x0143C000, 0x0200, 0x0A},
    {"utf16", imageWithHeader("0143C000000000010002000302000A", true), true, 0x0143C000, 0x0200, 0x0A},
    {"lowerCase", imageWithHeader("0143c000000000010002000302000a"), true, 0x0143C000, 0x0200, 0x0A},
    {"allOnes", imageWithHeader("FFFFFFFF000000010002000302FFF0"), true, 0xFFFFFFFF, 0x02FF, 0xF0},
    {"spaceBetweenFields", imageWithHeader("0143C000 000000010002000302000A"), false, 0, 0x0100, 0},
    {"shortText", imageWithHeader("0143C00000000001"), true, 0x0143C000, 0, 0},
    {"fileTooShort", std::vector<uint8_t>(100, 0xFF), true, 0, 0, 0},
};

class HeaderText : public ::testing::TestWithParam<HeaderCase> {};

TEST_P(HeaderText, IsReadAsTheLoaderReadsIt)
{
    lab::DecodedHeader header = lab::decodeImageHeader(GetParam().image);
    EXPECT_EQ(header.readable, GetParam().readable) << header.problem;
    EXPECT_EQ(header.imageVersion, GetParam().version);
    EXPECT_EQ(header.headerRevision, GetParam().revision);
    EXPECT_EQ(header.imageType, GetParam().type);
}

INSTANTIATE_TEST_SUITE_P(Lab, HeaderText, ::testing::ValuesIn(kHeaders),
                         [](const ::testing::TestParamInfo<HeaderCase>& info) { return std::string(info.param.name); });

}  // namespace
