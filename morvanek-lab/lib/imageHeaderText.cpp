#include "imageHeaderText.h"

#include <fmt/format.h>

#include "generatedImage.h"
#include "source/firmwareHeader.h"

namespace lab {

namespace {
constexpr size_t kHeaderBytes = 60;
constexpr uint32_t kFieldDigits[6] = {8, 8, 4, 4, 4, 2};

bool isHexDigit(uint8_t byte)
{
    return (byte >= '0' && byte <= '9') || (byte >= 'A' && byte <= 'F') || (byte >= 'a' && byte <= 'f');
}
}  // namespace

DecodedHeader decodeImageHeader(const std::vector<uint8_t>& image)
{
    DecodedHeader header;
    // Bytes past the end of a short file count as NUL, as the loader fills its text with NUL before reading.
    std::vector<uint8_t> text(kHeaderBytes, 0);
    for (size_t i = 0; i < kHeaderBytes && kImageHeaderOffset + i < image.size(); ++i) text[i] = image[kImageHeaderOffset + i];

    // The values come from the loader's own field parser, with the budgets it gives each field.
    tStatus status = 0;
    uint32_t values[6];
    const uint8_t* cursor = text.data();
    const uint8_t* const end = text.data() + text.size();
    for (size_t i = 0; i < 6; ++i) {
        uint64_t budget = i == 0 ? kHeaderBytes : static_cast<uint64_t>(end - cursor);
        values[i] = parseHexField(cursor, budget, kFieldDigits[i], status);
    }

    const size_t examined = static_cast<size_t>(cursor - text.data());
    for (size_t i = 0; i < examined; ++i) {
        uint8_t byte = text[i];
        header.text += byte >= 0x20 && byte < 0x7F ? static_cast<char>(byte) : byte == 0 ? '.' : '?';
        header.digitsFound += isHexDigit(byte);
    }
    if (status < 0) {
        // The parser stops on the byte it refused; the loader then reads revision 0x0100 and nothing else.
        header.readable = false;
        header.problem = fmt::format("byte 0x{:02X} at offset {} is neither a hexadecimal digit nor NUL", *cursor,
                                     kImageHeaderOffset + examined);
        header.text += '?';
        header.headerRevision = 0x0100;
        return header;
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
