// printf-style formatting of host log and debug lines. The host's %S is a
// UTF-16 string, which the C library's formatter cannot take on Linux, so
// each conversion is formatted on its own.
#include <cstdio>
#include <cstring>

#include "../kernel/kernelUtf16.h"
#include "simHost.h"

namespace sim {

// One converter for both stand-ins: the kernel's, which this library links.
std::string utf16ToUtf8(const char16_t* text, size_t length)
{
    return kernel::toUtf8(text, length);
}

std::string utf16ToUtf8(const char16_t* text)
{
    if (text == nullptr) return "(null)";
    size_t length = 0;
    while (text[length] != 0) ++length;
    return kernel::toUtf8(text, length);
}

std::u16string utf8ToUtf16(const std::string& text)
{
    return kernel::toUtf16(text);
}

std::string formatHostMessage(const char* format, va_list arguments)
{
    std::string out;
    char piece[512];
    for (const char* p = format; *p != 0;) {
        if (*p != '%') {
            out += *p++;
            continue;
        }
        const char* start = p++;
        if (*p == '%') {
            out += '%';
            ++p;
            continue;
        }
        while (*p != 0 && std::strchr("-+ #0", *p)) ++p;
        while ((*p >= '0' && *p <= '9') || *p == '.') ++p;
        int longs = 0;
        bool half = false;
        bool size = false;
        while (*p == 'l' || *p == 'h' || *p == 'z' || *p == 'I') {
            if (*p == 'l') ++longs;
            if (*p == 'h') half = true;
            if (*p == 'z') size = true;
            ++p;
        }
        char conversion = *p;
        if (conversion == 0) break;
        ++p;
        std::string directive(start, p);
        switch (conversion) {
        case 'd':
        case 'i':
            if (longs >= 2 || size) {
                std::snprintf(piece, sizeof piece, directive.c_str(), va_arg(arguments, long long));
            } else if (longs == 1) {
                std::snprintf(piece, sizeof piece, directive.c_str(), va_arg(arguments, long));
            } else {
                std::snprintf(piece, sizeof piece, directive.c_str(), va_arg(arguments, int));
            }
            out += piece;
            break;
        case 'u':
        case 'x':
        case 'X':
        case 'o':
            if (longs >= 2 || size) {
                std::snprintf(piece, sizeof piece, directive.c_str(), va_arg(arguments, unsigned long long));
            } else if (longs == 1) {
                std::snprintf(piece, sizeof piece, directive.c_str(), va_arg(arguments, unsigned long));
            } else {
                std::snprintf(piece, sizeof piece, directive.c_str(), va_arg(arguments, unsigned));
            }
            out += piece;
            break;
        case 'c':
            std::snprintf(piece, sizeof piece, directive.c_str(), va_arg(arguments, int));
            out += piece;
            break;
        case 'p':
            std::snprintf(piece, sizeof piece, directive.c_str(), va_arg(arguments, void*));
            out += piece;
            break;
        case 's': {
            const char* text = va_arg(arguments, const char*);
            if (longs == 1) {
                out += utf16ToUtf8(reinterpret_cast<const char16_t*>(text));
            } else {
                out += text == nullptr ? "(null)" : text;
            }
            break;
        }
        case 'S':
            out += utf16ToUtf8(va_arg(arguments, const char16_t*));
            break;
        default:
            out += directive;  // unknown conversion: shown as written
            (void)half;
        }
    }
    return out;
}

}  // namespace sim
