#include "ImageHeaderText.h"

#include <fmt/format.h>

#include "GeneratedImage.h"

namespace lab {

namespace {
constexpr size_t kHeaderBytes = 60;
constexpr int kFieldDigits[6] = {8, 8, 4, 4, 4, 2};
}  // namespace

DecodedHeader decodeImageHeader(const std::vector<uint8_t>& image)
{
    DecodedHeader header;
    // Bytes past the end of a short file count as NUL: nothing is there to read.
    std::vector<uint8_t> text(kHeaderBytes, 0);
    for (size_t i = 0; i < kHeaderBytes && kImageHeaderOffset + i < image.size(); ++i) text[i] = image[kImageHeaderOffset + i];
    auto shown = [](uint8_t byte) { return byte >= 0x20 && byte < 0x7F ? static_cast<char>(byte) : byte == 0 ? '.' : '?'; };

    uint32_t values[6] = {0, 0, 0, 0, 0, 0};
    size_t field = 0;
    int digitsInField = 0;
    for (size_t i = 0; i < kHeaderBytes && field < 6; ++i) {
        uint8_t byte = text[i];
        header.text += shown(byte);
        if (byte == 0) continue;
        int digit = byte >= '0' && byte <= '9'   ? byte - '0'
                    : byte >= 'A' && byte <= 'F' ? byte - 'A' + 10
                    : byte >= 'a' && byte <= 'f' ? byte - 'a' + 10
                                                 : -1;
        if (digit < 0) {
            header.readable = false;
            header.problem = fmt::format("byte 0x{:02X} at offset {} is neither a hexadecimal digit nor NUL", byte,
                                         kImageHeaderOffset + i);
            header.headerRevision = 0x0100;
            return header;
        }
        values[field] = (values[field] << 4) | static_cast<uint32_t>(digit);
        ++header.digitsFound;
        if (++digitsInField == kFieldDigits[field]) {
            ++field;
            digitsInField = 0;
        }
    }
    if (header.digitsFound < 30)
        header.problem = fmt::format("only {} of 30 digits before the text ends", header.digitsFound);
    header.imageVersion = values[0];
    header.field2 = values[1];
    header.field3 = values[2];
    header.field4 = values[3];
    header.headerRevision = values[4];
    header.imageType = values[5];
    return header;
}

}  // namespace lab
