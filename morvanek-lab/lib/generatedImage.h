// Image files made up on the spot: a size, a fill pattern, and the header
// text at offset 514 where the loader reads it.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace lab {

constexpr size_t kImageHeaderOffset = 514;
constexpr const char* kDefaultHeaderText = "0143C000000000010002000302000A";

struct GeneratedImagePlan {
    size_t size = 0;
    std::optional<uint8_t> fillByte;  // unset: a counting pattern from the seed
    uint8_t seed = 1;
    std::optional<std::string> header = std::string(kDefaultHeaderText);
    bool headerAsUtf16 = false;
    bool markerRoom = true;  // bytes 6 and 7 erased (0xFF), so that the completion marker can be written
};

std::vector<uint8_t> generateImage(const GeneratedImagePlan& plan);

}  // namespace lab
