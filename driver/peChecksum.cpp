#include "peChecksum.h"

namespace pe {

namespace {

constexpr size_t kNewHeaderPointerOffset = 0x3C;
constexpr size_t kSignatureBytes = 4;
constexpr size_t kFileHeaderBytes = 20;
// The same offset in PE32 and PE32+ optional headers.
constexpr size_t kChecksumInOptionalHeader = 64;
constexpr size_t kChecksumBytes = 4;

uint32_t readLittleEndian32(const std::vector<uint8_t>& bytes, size_t at)
{
    return static_cast<uint32_t>(bytes[at]) | static_cast<uint32_t>(bytes[at + 1]) << 8 |
           static_cast<uint32_t>(bytes[at + 2]) << 16 | static_cast<uint32_t>(bytes[at + 3]) << 24;
}

}  // namespace

std::optional<size_t> checksumFieldOffset(const std::vector<uint8_t>& image)
{
    if (image.size() < kNewHeaderPointerOffset + 4 || image[0] != 'M' || image[1] != 'Z') return std::nullopt;
    const size_t peHeader = readLittleEndian32(image, kNewHeaderPointerOffset);
    const size_t field = peHeader + kSignatureBytes + kFileHeaderBytes + kChecksumInOptionalHeader;
    if (field + kChecksumBytes > image.size()) return std::nullopt;
    if (image[peHeader] != 'P' || image[peHeader + 1] != 'E' || image[peHeader + 2] != 0 || image[peHeader + 3] != 0) {
        return std::nullopt;
    }
    return field;
}

uint32_t computeChecksum(const std::vector<uint8_t>& image, size_t fieldOffset)
{
    // Byte by byte, so that the field counts as zero wherever it falls.
    auto byteAt = [&](size_t at) -> uint32_t {
        if (at >= image.size() || (at >= fieldOffset && at < fieldOffset + kChecksumBytes)) return 0;
        return image[at];
    };
    uint32_t sum = 0;
    for (size_t at = 0; at < image.size(); at += 2) {
        sum += byteAt(at) | byteAt(at + 1) << 8;
        sum = (sum & 0xFFFF) + (sum >> 16);
    }
    return sum + static_cast<uint32_t>(image.size());
}

uint32_t storedChecksum(const std::vector<uint8_t>& image, size_t fieldOffset)
{
    return readLittleEndian32(image, fieldOffset);
}

void storeChecksum(std::vector<uint8_t>& image, size_t fieldOffset, uint32_t checksum)
{
    for (size_t i = 0; i < kChecksumBytes; ++i) image[fieldOffset + i] = static_cast<uint8_t>(checksum >> (8 * i));
}

}  // namespace pe
