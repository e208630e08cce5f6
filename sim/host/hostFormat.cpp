// printf-style formatting of host log and debug lines. The host's %S is a
// UTF-16 string, which the C library's formatter cannot take on Linux, so
// each conversion is formatted on its own. The arguments come from a
// va_list here, or already taken off another ABI's va_list by the
// Windows-side host.
#include <cstdio>

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

namespace {

// The arguments of this process's own variadic call.
class VaListArguments final : public FormatArguments {
public:
    explicit VaListArguments(va_list arguments) { va_copy(arguments_, arguments); }
    ~VaListArguments() { va_end(arguments_); }

    long long nextSigned(hostformat::Argument kind) override
    {
        if (kind == hostformat::Argument::signedLongLong) return va_arg(arguments_, long long);
        if (kind == hostformat::Argument::signedLong) return va_arg(arguments_, long);
        return va_arg(arguments_, int);
    }
    unsigned long long nextUnsigned(hostformat::Argument kind) override
    {
        if (kind == hostformat::Argument::unsignedLongLong) return va_arg(arguments_, unsigned long long);
        if (kind == hostformat::Argument::unsignedLong) return va_arg(arguments_, unsigned long);
        return va_arg(arguments_, unsigned);
    }
    const void* nextPointer() override { return va_arg(arguments_, void*); }
    std::string nextText() override
    {
        const char* text = va_arg(arguments_, const char*);
        return text == nullptr ? "(null)" : text;
    }
    std::string nextText16() override { return utf16ToUtf8(va_arg(arguments_, const char16_t*)); }

private:
    va_list arguments_;
};

}  // namespace

std::string formatHostMessage(const char* format, va_list arguments)
{
    VaListArguments source(arguments);
    return formatHostMessage(format, source);
}

std::string formatHostMessage(const char* format, FormatArguments& arguments)
{
    using hostformat::Argument;
    std::string out;
    char piece[512];
    for (const char* p = format; *p != 0;) {
        if (*p != '%') {
            out += *p++;
            continue;
        }
        const hostformat::Directive read = hostformat::readDirective(p);
        if (read.literalPercent) {
            out += '%';
            p = read.end;
            continue;
        }
        if (read.end == nullptr) break;
        const std::string directive(p, read.end);
        p = read.end;
        switch (read.argument) {
        case Argument::signedInt:
        case Argument::character:
            std::snprintf(piece, sizeof piece, directive.c_str(), static_cast<int>(arguments.nextSigned(read.argument)));
            out += piece;
            break;
        case Argument::signedLong:
            std::snprintf(piece, sizeof piece, directive.c_str(), static_cast<long>(arguments.nextSigned(read.argument)));
            out += piece;
            break;
        case Argument::signedLongLong:
            std::snprintf(piece, sizeof piece, directive.c_str(), arguments.nextSigned(read.argument));
            out += piece;
            break;
        case Argument::unsignedInt:
            std::snprintf(piece, sizeof piece, directive.c_str(),
                          static_cast<unsigned>(arguments.nextUnsigned(read.argument)));
            out += piece;
            break;
        case Argument::unsignedLong:
            std::snprintf(piece, sizeof piece, directive.c_str(),
                          static_cast<unsigned long>(arguments.nextUnsigned(read.argument)));
            out += piece;
            break;
        case Argument::unsignedLongLong:
            std::snprintf(piece, sizeof piece, directive.c_str(), arguments.nextUnsigned(read.argument));
            out += piece;
            break;
        case Argument::pointer:
            std::snprintf(piece, sizeof piece, directive.c_str(), arguments.nextPointer());
            out += piece;
            break;
        case Argument::text:
            out += arguments.nextText();
            break;
        case Argument::text16:
            out += arguments.nextText16();
            break;
        case Argument::none:
            out += directive;  // unknown conversion: shown as written
            break;
        }
    }
    return out;
}

}  // namespace sim
