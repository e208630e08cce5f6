// pe-checksum stamp <image> <stamped image>: writes a copy with its checksum set.
// pe-checksum verify <image>: fails unless the stored checksum is the right one.
#include <cstdio>
#include <cstring>
#include <fstream>
#include <iterator>
#include <string>

#include "peChecksum.h"

namespace {

bool readFile(const char* path, std::vector<uint8_t>& bytes)
{
    std::ifstream in(path, std::ios::binary);
    if (!in) return false;
    bytes.assign(std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>());
    return !in.bad();
}

bool writeFile(const char* path, const std::vector<uint8_t>& bytes)
{
    std::ofstream out(path, std::ios::binary | std::ios::trunc);
    out.write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
    return static_cast<bool>(out.flush());
}

int usage()
{
    std::fprintf(stderr, "usage: pe-checksum stamp <image> <stamped image>\n       pe-checksum verify <image>\n");
    return 2;
}

}  // namespace

int main(int argc, char** argv)
{
    const bool stamp = argc == 4 && std::strcmp(argv[1], "stamp") == 0;
    const bool verify = argc == 3 && std::strcmp(argv[1], "verify") == 0;
    if (!stamp && !verify) return usage();

    std::vector<uint8_t> image;
    if (!readFile(argv[2], image)) {
        std::fprintf(stderr, "pe-checksum: cannot read %s\n", argv[2]);
        return 1;
    }
    const std::optional<size_t> field = pe::checksumFieldOffset(image);
    if (!field) {
        std::fprintf(stderr, "pe-checksum: %s is not a PE image\n", argv[2]);
        return 1;
    }
    const uint32_t checksum = pe::computeChecksum(image, *field);

    if (verify) {
        const uint32_t stored = pe::storedChecksum(image, *field);
        std::printf("%s: stored checksum 0x%08X, computed 0x%08X\n", argv[2], stored, checksum);
        return stored == checksum ? 0 : 1;
    }
    pe::storeChecksum(image, *field, checksum);
    if (!writeFile(argv[3], image)) {
        std::fprintf(stderr, "pe-checksum: cannot write %s\n", argv[3]);
        return 1;
    }
    return 0;
}
