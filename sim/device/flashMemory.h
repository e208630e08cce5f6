// The device's 64 KiB of byte-addressed memory, which behaves as flash: a page
// erase sets 512 bytes to 0xFF, and programming can only clear bits.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <vector>

namespace sim {

class FlashMemory {
public:
    static constexpr uint32_t kSize = 0x10000;
    static constexpr uint32_t kPageSize = 0x200;
    static constexpr uint32_t kPages = kSize / kPageSize;

    FlashMemory() { bytes_.fill(0xFF); }  // a blank part

    uint8_t at(uint16_t address) const { return bytes_[address]; }
    // Addresses wrap at 16 bits, as the loader's address register does.
    std::vector<uint8_t> read(uint16_t address, size_t count) const;
    // Each stored byte becomes old AND new: a block written without an erase reads back wrong.
    void program(uint16_t address, const uint8_t* data, size_t count);
    void erasePage(uint16_t page);
    // Sets bytes as they were put there at the factory or by an earlier install.
    void load(uint16_t address, const std::vector<uint8_t>& bytes);

private:
    std::array<uint8_t, kSize> bytes_;
};

}  // namespace sim
