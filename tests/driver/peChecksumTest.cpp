// The driver image's checksum. Expected values are worked out by hand from
// the few nonzero words of a minimal header, so a fault in the carry, the odd
// last byte or the skipped field shows as a wrong number.
#include <gtest/gtest.h>

#include <cctype>
#include <string>

#include "driver/peChecksum.h"

namespace {

// "MZ", the pointer at 0x3C, "PE\0\0" there; everything else zero.
std::vector<uint8_t> minimalImage(size_t size, uint32_t peHeader)
{
    std::vector<uint8_t> image(size, 0);
    image[0] = 'M';
    image[1] = 'Z';
    image[0x3C] = static_cast<uint8_t>(peHeader);
    image[peHeader] = 'P';
    image[peHeader + 1] = 'E';
    return image;
}

// Words 0x5A4D ("MZ") + 0x0040 (pointer) + 0x4550 ("PE") = 0x9FDD.
constexpr uint32_t kMinimalWordSum = 0x9FDD;

TEST(PeChecksum, FieldFollowsTheHeaderPointer)
{
    EXPECT_EQ(pe::checksumFieldOffset(minimalImage(0x100, 0x40)), size_t{0x40 + 4 + 20 + 64});
    EXPECT_EQ(pe::checksumFieldOffset(minimalImage(0x200, 0x80)), size_t{0x80 + 4 + 20 + 64});
}

TEST(PeChecksum, IsTheWordSumPlusTheLength)
{
    const std::vector<uint8_t> image = minimalImage(0x100, 0x40);
    EXPECT_EQ(pe::computeChecksum(image, 0x98), kMinimalWordSum + 0x100);
}

TEST(PeChecksum, CarryOutOfSixteenBitsIsAddedBackIn)
{
    std::vector<uint8_t> image = minimalImage(0x100, 0x40);
    // 0x9FDD + 0xFFFF = 0x19FDC, folded back to 0x9FDD.
    image[0xA0] = 0xFF;
    image[0xA1] = 0xFF;
    EXPECT_EQ(pe::computeChecksum(image, 0x98), kMinimalWordSum + 0x100);
}

TEST(PeChecksum, OddLastByteIsTheLowByteOfAWord)
{
    std::vector<uint8_t> image = minimalImage(0x101, 0x40);
    image[0x100] = 0x01;
    EXPECT_EQ(pe::computeChecksum(image, 0x98), kMinimalWordSum + 0x0001 + 0x101);
}

TEST(PeChecksum, StoredValueDoesNotCount)
{
    std::vector<uint8_t> image = minimalImage(0x100, 0x40);
    pe::storeChecksum(image, 0x98, 0xFFFFFFFF);
    EXPECT_EQ(pe::computeChecksum(image, 0x98), kMinimalWordSum + 0x100);
}

TEST(PeChecksum, FieldAtAnOddOffsetStillCountsAsZero)
{
    std::vector<uint8_t> image = minimalImage(0x100, 0x41);
    const std::optional<size_t> field = pe::checksumFieldOffset(image);
    ASSERT_EQ(field, size_t{0x99});
    pe::storeChecksum(image, *field, 0xFFFFFFFF);
    // 0x5A4D + 0x0041 + 0x5000 ("P" high in word 0x40) + 0x0045 ("E" low in word 0x42).
    EXPECT_EQ(pe::computeChecksum(image, *field), 0x5A4Du + 0x0041 + 0x5000 + 0x0045 + 0x100);
}

TEST(PeChecksum, StampedImageVerifies)
{
    std::vector<uint8_t> image = minimalImage(0x300, 0x80);
    image[0x1F3] = 0x5C;
    const size_t field = *pe::checksumFieldOffset(image);
    pe::storeChecksum(image, field, pe::computeChecksum(image, field));
    EXPECT_EQ(pe::storedChecksum(image, field), pe::computeChecksum(image, field));

    image[0x2FF] ^= 0x10;
    EXPECT_NE(pe::storedChecksum(image, field), pe::computeChecksum(image, field));
}

TEST(PeChecksum, StoresLittleEndian)
{
    std::vector<uint8_t> image = minimalImage(0x100, 0x40);
    pe::storeChecksum(image, 0x98, 0x0001A0DD);
    EXPECT_EQ(image[0x98], 0xDD);
    EXPECT_EQ(image[0x99], 0xA0);
    EXPECT_EQ(image[0x9A], 0x01);
    EXPECT_EQ(image[0x9B], 0x00);
}

struct NotAnImage {
    const char* what;
    std::vector<uint8_t> bytes;
};

class PeChecksumRefuses : public testing::TestWithParam<NotAnImage> {};

TEST_P(PeChecksumRefuses, BytesThatAreNotAPeImage)
{
    EXPECT_EQ(pe::checksumFieldOffset(GetParam().bytes), std::nullopt) << GetParam().what;
}

std::vector<NotAnImage> notImages()
{
    std::vector<NotAnImage> cases;
    cases.push_back({"empty", {}});
    cases.push_back({"shorter than the DOS header", std::vector<uint8_t>{'M', 'Z', 0, 0}});
    std::vector<uint8_t> noMz = minimalImage(0x100, 0x40);
    noMz[0] = 'X';
    cases.push_back({"no MZ", noMz});
    std::vector<uint8_t> noPe = minimalImage(0x100, 0x40);
    noPe[0x41] = 'X';
    cases.push_back({"no PE signature", noPe});
    cases.push_back({"checksum field past the end", minimalImage(0x9B, 0x40)});
    std::vector<uint8_t> farPointer = minimalImage(0x100, 0x40);
    farPointer[0x3D] = 0x10;  // header pointer 0x1040
    cases.push_back({"header pointer past the end", farPointer});
    return cases;
}

// "no PE signature" -> "NoPESignature"
std::string caseName(const testing::TestParamInfo<NotAnImage>& info)
{
    std::string name;
    bool wordStart = true;
    for (const char* c = info.param.what; *c != '\0'; ++c) {
        if (*c == ' ') {
            wordStart = true;
            continue;
        }
        name += wordStart ? static_cast<char>(std::toupper(static_cast<unsigned char>(*c))) : *c;
        wordStart = false;
    }
    return name;
}

INSTANTIATE_TEST_SUITE_P(All, PeChecksumRefuses, testing::ValuesIn(notImages()), caseName);

}  // namespace
