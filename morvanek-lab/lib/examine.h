// morvanek-lab inspect: what the module makes of one image file or one
// identity block, found out by running the real module on it.
#pragma once

#include <cstdint>
#include <cstdio>
#include <optional>
#include <string>

namespace lab {

struct InspectOptions {
    std::string file;
    std::optional<uint32_t> expectedVersion;
    uint16_t productId = 0x4B01;
    std::optional<uint16_t> loaderProductId;
    std::optional<std::string> fvtpid;
    bool json = false;
    std::string modulePath;
};

// Both return an exit code of the lab's.
int inspectImage(const InspectOptions& options, std::FILE* out);
int inspectIdentity(const InspectOptions& options, std::FILE* out);

}  // namespace lab
