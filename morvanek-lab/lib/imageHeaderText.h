// The header text of an image file as the loader reads it: 30 hexadecimal
// digits from offset 514, NUL bytes passed over, six fields.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace lab {

struct DecodedHeader {
    bool readable = true;  // false: a byte other than a digit or NUL came first; the loader then sees revision 0x0100
    std::string problem;
    uint32_t imageVersion = 0;
    uint32_t field2 = 0;
    uint32_t field3 = 0;
    uint32_t field4 = 0;
    uint32_t headerRevision = 0;
    uint32_t imageType = 0;
    size_t digitsFound = 0;
    std::string text;  // the bytes the loader looks at, printable: NUL as '.', others as '?'
};

DecodedHeader decodeImageHeader(const std::vector<uint8_t>& image);

}  // namespace lab
