// The kernel stand-in's text conversion, which every name the module passes
// goes through.
#include <gtest/gtest.h>

#include <stdexcept>

#include "sim/kernel/kernelUtf16.h"

using sim::kernel::toUtf16;
using sim::kernel::toUtf8;

TEST(KernelUtf16, ConvertsEveryEncodedLengthBothWays)
{
    struct Case {
        std::string utf8;
        std::u16string utf16;
    };
    const Case cases[] = {
        {"", u""},
        {"Vid_5C1D", u"Vid_5C1D"},
        {"Gr\xC3\xBC\xC3\x9F" "e", u"Gr\u00FC\u00DFe"},
        {"\xE2\x82\xAC", u"\u20AC"},
        {"\xF0\x9F\x98\x80", u"\U0001F600"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.utf8);
        EXPECT_EQ(toUtf16(c.utf8), c.utf16);
        EXPECT_EQ(toUtf8(c.utf16), c.utf8);
    }
}

TEST(KernelUtf16, RefusesMalformedUtf8)
{
    const std::string cases[] = {
        "\x80",              // continuation without a lead
        "a\xC3",             // cut short
        "\xC3(",             // lead without its continuation
        "\xC0\xAF",          // overlong
        "\xED\xA0\x80",      // a surrogate, encoded
        "\xF4\x90\x80\x80",  // beyond U+10FFFF
        "\xFF",
    };
    for (const std::string& text : cases) EXPECT_THROW(toUtf16(text), std::invalid_argument) << text;
}

TEST(KernelUtf16, LoneSurrogatesBecomeReplacementCharacters)
{
    EXPECT_EQ(toUtf8(u"a\xD800" u"b"), "a\xEF\xBF\xBD" "b");
    EXPECT_EQ(toUtf8(u"\xDC00"), "\xEF\xBF\xBD");
}
