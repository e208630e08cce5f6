// Reading the header text at offset 514 of image files: digit forms, texts
// that cannot be read, texts that run out, short images and failed reads, and
// how the caller's status decides and is changed.
#include <array>
#include <functional>

#include "ImageWorld.h"
#include "sim/kernel/fileStatus.h"

namespace {

using Fields = std::array<uint32_t, 6>;

constexpr Fields kFields = {0x0143C000, 1, 2, 3, 0x0201, 0x0A};
constexpr Fields kUnreadable = {0, 0, 0, 0, 0x0100, 0};
constexpr Fields kNothing = {0, 0, 0, 0, 0, 0};
constexpr Fields kSentinel = {0xDEAD0001, 0xDEAD0002, 0xDEAD0003, 0xDEAD0004, 0xDEAD0005, 0xDEAD0006};
const std::string kDigits = "0143C000" "00000001" "0002" "0003" "0201" "0A";

Fields fieldsOf(const FirmwareHeader& header)
{
    return {header.imageVersion, header.field2,         header.field3,
            header.field4,       header.headerRevision, header.imageType};
}

void setFields(FirmwareHeader& header, const Fields& fields)
{
    header.imageVersion = fields[0];
    header.field2 = fields[1];
    header.field3 = fields[2];
    header.field4 = fields[3];
    header.headerRevision = fields[4];
    header.imageType = fields[5];
}

// Each character followed by a NUL byte, as 16-bit little-endian characters are stored.
std::string sixteenBit(const std::string& text)
{
    std::string wideText;
    for (char c : text) wideText += std::string{c, '\0'};
    return wideText;
}

struct HeaderCase {
    const char* name;
    std::string text;
    Fields fields;
    size_t imageSize = 0;  // 0: the whole image, the text followed by 60 more bytes
    NTSTATUS readFailure = 0;
};

void PrintTo(const HeaderCase& c, std::ostream* out)
{
    *out << c.name;
}

class ReadFirmwareHeader : public ImageWorld {
protected:
    // An image whose header text is `text`; the bytes around it are no digits, so a text read from the wrong
    // place, or further than its 30th digit, shows.
    std::u16string writeImage(const std::string& text, size_t imageSize = 0)
    {
        std::string bytes = std::string(514, 'Z') + text + std::string(60, 'Z');
        if (imageSize != 0) bytes.resize(imageSize);
        writeFile("C:\\images\\image.bin", std::vector<uint8_t>(bytes.begin(), bytes.end()));
        return wide("C:\\images\\image.bin");
    }
};

class HeaderTexts : public ReadFirmwareHeader, public ::testing::WithParamInterface<HeaderCase> {};

TEST_P(HeaderTexts, GiveTheirFieldsAndLeaveTheStatusAlone)
{
    const HeaderCase& c = GetParam();
    const std::u16string path = writeImage(c.text, c.imageSize);
    sim::kernel::files().failReads(c.readFailure);
    FirmwareHeader header;
    tStatus status = 0;
    readFirmwareHeader(header, path.c_str(), status);
    EXPECT_EQ(status, 0);
    EXPECT_EQ(fieldsOf(header), c.fields);
}

const HeaderCase kHeaderCases[] = {
    {"SingleByteDigits", kDigits, kFields},
    {"SixteenBitDigits", sixteenBit(kDigits), kFields},
    {"MixedCase", "abcdef01" "ABCDEF01" "aBcD" "EfAb" "0a0B" "fF",
     {0xABCDEF01, 0xABCDEF01, 0xABCD, 0xEFAB, 0x0A0B, 0xFF}},
    {"AllBitsSet", std::string(30, 'F'), {0xFFFFFFFF, 0xFFFFFFFF, 0xFFFF, 0xFFFF, 0xFFFF, 0xFF}},
    {"AnythingAfterTheLastDigit", kDigits + " -.\r\n", kFields},
    {"SpaceBetweenFields", "0143C000 00000001" "0002" "0003" "0201" "0A", kUnreadable},
    {"HyphenBetweenFields", "0143C000" "00000001" "0002-0003" "0201" "0A", kUnreadable},
    {"DotBetweenFields", "0143C000" "00000001" "0002" "0003" "0201.0A", kUnreadable},
    {"LineBreakBetweenFields", "0143C000\r\n00000001" "0002" "0003" "0201" "0A", kUnreadable},
    {"NoDigitInTheLastField", kDigits.substr(0, 29) + "G", kUnreadable},
    {"TextUsedUpBetweenFields", "0143C000" + std::string(50, '\0') + "12", {0x0143C000, 0x12, 0, 0, 0, 0}},
    {"TextUsedUpInsideTheLastField", std::string(2, '\0') + sixteenBit("0143C000" "00000001" "0002" "0003" "0201" "A5"),
     {0x0143C000, 1, 2, 3, 0x0201, 0xA}},
    {"ImageEndsInsideTheText", kDigits, {0x0143C000, 1, 2, 0, 0, 0}, 514 + 20},
    {"ImageEndsBeforeTheText", kDigits, kNothing, 300},
    {"ReadFails", kDigits, kNothing, 0, sim::kernel::fileStatus::deviceDataError},
};

INSTANTIATE_TEST_SUITE_P(Texts, HeaderTexts, ::testing::ValuesIn(kHeaderCases),
                         [](const auto& info) { return std::string(info.param.name); });

TEST_F(ReadFirmwareHeader, TheStatusDecidesAndOnlyAMissingImageChangesIt)
{
    const std::u16string image = writeImage(kDigits);
    struct Case {
        const char* name;
        std::u16string path;
        tStatus entry;
        tStatus expected;
        Fields fields;
        size_t opens;
        std::function<void()> arrange;
    };
    const Case cases[] = {
        {"Readable", image, 0, 0, kFields, 1, {}},
        {"PositiveStatusKept", image, 7, 7, kFields, 1, {}},
        {"NegativeStatusOnEntry", image, -3, -3, kSentinel, 0, {}},
        {"MissingImage", wide("C:\\images\\other.bin"), 0, -50150, kSentinel, 1, {}},
        {"HeldOpenElsewhere", image, 0, -50150, kSentinel, 1,
         [this] { sim::kernel::files().holdOpenElsewhere(hostPath("C:\\images\\image.bin")); }},
        {"PathTooLong", wide("C:\\" + std::string(257, 'a')), 0, -50150, kSentinel, 0, {}},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        sim::kernel::files().reset();
        sim::kernel::files().mapDrive('C', driveC);
        if (c.arrange) c.arrange();
        FirmwareHeader header;
        setFields(header, kSentinel);
        tStatus status = c.entry;
        readFirmwareHeader(header, c.path.c_str(), status);
        EXPECT_EQ(status, c.expected);
        EXPECT_EQ(fieldsOf(header), c.fields);
        EXPECT_EQ(sim::kernel::files().opens().size(), c.opens);
        EXPECT_EQ(sim::kernel::files().openFileCount(), 0u);
    }
}

}  // namespace
