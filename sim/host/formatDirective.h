// How the host's printf-style formats are read: which argument each
// directive takes. Freestanding, so that the Linux stand-in's formatter and
// the Windows-side host, which must take the same arguments off its own
// va_list before the lab formats them, read a format the same way.
#pragma once

namespace hostformat {

enum class Argument {
    none,          // "%%", or a directive the host shows as written
    signedInt,     // d i
    signedLong,    // ld li: 32 bits on Windows, 64 on Linux
    signedLongLong,  // lld zd
    unsignedInt,   // u x X o
    unsignedLong,
    unsignedLongLong,
    character,     // c
    pointer,       // p
    text,          // s: 8-bit
    text16,        // S, ls: UTF-16
};

struct Directive {
    const char* end;  // just past the conversion; null when the format ends inside the directive
    Argument argument;
    bool literalPercent;
};

// `at` points at the '%' that starts a directive.
inline Directive readDirective(const char* at)
{
    const char* p = at + 1;
    if (*p == '%') return {p + 1, Argument::none, true};
    auto among = [](char c, const char* set) {
        for (; *set != 0; ++set)
            if (*set == c) return true;
        return false;
    };
    while (*p != 0 && among(*p, "-+ #0")) ++p;
    while ((*p >= '0' && *p <= '9') || *p == '.') ++p;
    int longs = 0;
    bool size = false;
    while (*p == 'l' || *p == 'h' || *p == 'z' || *p == 'I') {
        if (*p == 'l') ++longs;
        if (*p == 'z') size = true;
        ++p;
    }
    const char conversion = *p;
    if (conversion == 0) return {nullptr, Argument::none, false};
    const bool wide = longs >= 2 || size;
    Argument argument = Argument::none;
    switch (conversion) {
    case 'd':
    case 'i':
        argument = wide ? Argument::signedLongLong : longs == 1 ? Argument::signedLong : Argument::signedInt;
        break;
    case 'u':
    case 'x':
    case 'X':
    case 'o':
        argument = wide ? Argument::unsignedLongLong : longs == 1 ? Argument::unsignedLong : Argument::unsignedInt;
        break;
    case 'c':
        argument = Argument::character;
        break;
    case 'p':
        argument = Argument::pointer;
        break;
    case 's':
        argument = longs == 1 ? Argument::text16 : Argument::text;
        break;
    case 'S':
        argument = Argument::text16;
        break;
    default:
        break;
    }
    return {p + 1, argument, false};
}

}  // namespace hostformat
