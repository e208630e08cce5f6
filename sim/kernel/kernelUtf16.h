// UTF-8 and UTF-16 conversion for the kernel stand-in: the kernel speaks
// UTF-16, while tests, the lab and registry export files speak UTF-8.
#pragma once

#include <cstddef>
#include <string>

namespace sim::kernel {

// Throws std::invalid_argument on malformed UTF-8, so that a typo in a test's
// text never turns into a value the module could not tell apart from data.
std::u16string toUtf16(const std::string& text);

// Lone surrogates (which the kernel accepts in names) become U+FFFD.
std::string toUtf8(const char16_t* text, size_t length);
std::string toUtf8(const std::u16string& text);

}  // namespace sim::kernel
