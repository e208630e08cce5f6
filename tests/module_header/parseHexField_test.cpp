// Parsing the header text's hexadecimal fields.
#include <gtest/gtest.h>

#include <string>

#include "source/firmwareHeader.h"

namespace {

struct FieldCase {
    const char* name;
    std::string text;
    uint64_t budget;
    uint32_t digits;
    uint32_t value;
    tStatus status;
    size_t consumed;  // where the cursor stops
};

void PrintTo(const FieldCase& c, std::ostream* out)
{
    *out << c.name;
}

class ParseHexField : public ::testing::TestWithParam<FieldCase> {};

TEST_P(ParseHexField, ReadsDigitsAndStopsWhereTheNextFieldBegins)
{
    const FieldCase& c = GetParam();
    const uint8_t* start = reinterpret_cast<const uint8_t*>(c.text.data());
    const uint8_t* cursor = start;
    tStatus status = 0;
    EXPECT_EQ(parseHexField(cursor, c.budget, c.digits, status), c.value);
    EXPECT_EQ(status, c.status);
    EXPECT_EQ(static_cast<size_t>(cursor - start), c.consumed);
}

const FieldCase kFieldCases[] = {
    {"EightDigits", "0143C0000000", 12, 8, 0x0143C000, 0, 8},
    {"AllThirtyTwoBits", "FFFFFFFF", 8, 8, 0xFFFFFFFF, 0, 8},
    {"LowerAndUpperCase", "aBcD", 4, 4, 0xABCD, 0, 4},
    {"TwoDigits", "0A99", 4, 2, 0x0A, 0, 2},
    {"WideCharacters", std::string("0\0001\0002\0003\0", 8), 8, 4, 0x0123, 0, 7},
    {"NulBytesAnywhere", std::string("\0\0\0007\0\0F", 7), 7, 2, 0x7F, 0, 7},
    {"BudgetEndsTheField", "1234", 2, 4, 0x12, 0, 2},
    {"ZeroBudget", "1234", 0, 4, 0, 0, 0},
    {"ZeroDigits", "1234", 4, 0, 0, 0, 0},
    {"SpaceIsRefused", "12 34", 5, 4, 0, -50150, 2},
    {"HyphenIsRefused", "-1", 2, 2, 0, -50150, 0},
    {"ByteAboveLowerFIsRefused", "1g", 2, 2, 0, -50150, 1},
    {"HighByteIsRefused", "1\xC1", 2, 2, 0, -50150, 1},
};

INSTANTIATE_TEST_SUITE_P(Fields, ParseHexField, ::testing::ValuesIn(kFieldCases),
                         [](const auto& info) { return std::string(info.param.name); });

TEST(ParseHexFieldStatus, DoesNothingAfterAnEarlierFailure)
{
    const uint8_t text[] = "1234";
    const uint8_t* cursor = text;
    tStatus status = -5;
    EXPECT_EQ(parseHexField(cursor, 4, 4, status), 0u);
    EXPECT_EQ(status, -5);
    EXPECT_EQ(cursor, text);
}

}  // namespace
