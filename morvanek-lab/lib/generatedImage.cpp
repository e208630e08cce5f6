#include "generatedImage.h"

namespace lab {

std::vector<uint8_t> generateImage(const GeneratedImagePlan& plan)
{
    std::vector<uint8_t> image(plan.size);
    for (size_t i = 0; i < plan.size; ++i) {
        // Varies within and across blocks, so that a block landing in the wrong place shows.
        image[i] = plan.fillByte ? *plan.fillByte : static_cast<uint8_t>(plan.seed + i * 7 + (i >> 9));
    }
    if (plan.markerRoom) {
        for (size_t i = 6; i < 8 && i < plan.size; ++i) image[i] = 0xFF;
    }
    if (plan.header) {
        std::vector<uint8_t> text;
        for (char c : *plan.header) {
            text.push_back(static_cast<uint8_t>(c));
            if (plan.headerAsUtf16) text.push_back(0);
        }
        for (size_t i = 0; i < text.size() && kImageHeaderOffset + i < plan.size; ++i)
            image[kImageHeaderOffset + i] = text[i];
    }
    return image;
}

}  // namespace lab
