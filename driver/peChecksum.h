// The checksum field of a PE image's optional header. The kernel refuses to
// load a driver image whose checksum is wrong, and our linker leaves it 0.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <vector>

namespace pe {

// Where the checksum field sits, or nothing when the bytes are not a PE image
// (no "MZ", no "PE\0\0" where the DOS header points, or a header cut short).
std::optional<size_t> checksumFieldOffset(const std::vector<uint8_t>& image);

// The 16-bit end-around-carry sum of the image's little-endian words, with the
// checksum field itself counted as zero and an odd last byte as a word of its
// own, plus the image's length in bytes.
uint32_t computeChecksum(const std::vector<uint8_t>& image, size_t fieldOffset);

uint32_t storedChecksum(const std::vector<uint8_t>& image, size_t fieldOffset);
void storeChecksum(std::vector<uint8_t>& image, size_t fieldOffset, uint32_t checksum);

}  // namespace pe
