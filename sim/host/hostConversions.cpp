// The host's text conversions: hexadecimal text to a number, a packed version
// to text. Shared by the host stand-in and the USB host.
#include <cstdint>
#include <cstdio>

#include "../../host/karvelk.h"

uint32_t kvlASCIIToU32Base16(const char* text)
{
    uint32_t value = 0;
    for (const char* p = text; p != nullptr && *p != 0; ++p) {
        char c = *p;
        uint32_t digit;
        if (c >= '0' && c <= '9')
            digit = c - '0';
        else if (c >= 'a' && c <= 'f')
            digit = c - 'a' + 10;
        else if (c >= 'A' && c <= 'F')
            digit = c - 'A' + 10;
        else
            break;
        value = (value << 4) | digit;
    }
    return value;
}

char* tSSVersion::toString(char* text) const
{
    static const char kPhases[] = {'d', 'a', 'b', 'f'};
    uint32_t v = packed_;
    std::snprintf(text, 16, "%u.%u.%u%c%u", v >> 24, (v >> 20) & 0xF, (v >> 16) & 0xF, kPhases[(v >> 14) & 3],
                  v & 0x3FFF);
    return text;
}
