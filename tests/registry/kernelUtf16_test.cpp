// The kernel stand-in's text conversion, which every name the module passes
// goes through.
#include <gtest/gtest.h>

#include <stdexcept>

#include "sim/kernel/kernelUtf16.h"

using sim::kernel::toUtf16;
using sim::kernel::toUtf8;

TEST(KernelUtf16, ConvertsEveryEncodedLengthBothWaysAndRefusesMalformedUtf8)
{
    const std::string utf8 = "Vid_5C1D Gr\xC3\xBC\xC3\x9F"
                             "e \xE2\x82\xAC \xF0\x9F\x98\x80";
    const std::u16string utf16 = u"Vid_5C1D Gr\u00FC\u00DFe \u20AC \U0001F600";
    EXPECT_EQ(toUtf16(utf8), utf16);
    EXPECT_EQ(toUtf8(utf16), utf8);
    EXPECT_EQ(toUtf16(""), u"");
    // Lone surrogates, which the kernel accepts in names, become replacement characters.
    EXPECT_EQ(toUtf8(u"a\xD800"
                     u"b\xDC00"),
              "a\xEF\xBF\xBD"
              "b\xEF\xBF\xBD");

    // A continuation without a lead, cut short, a lead without its continuation,
    // overlong, an encoded surrogate, beyond U+10FFFF, a byte never used.
    for (const char* text : {"\x80", "a\xC3", "\xC3(", "\xC0\xAF", "\xED\xA0\x80", "\xF4\x90\x80\x80", "\xFF"})
        EXPECT_THROW(toUtf16(text), std::invalid_argument) << text;
}
