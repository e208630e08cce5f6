#include "flashMemory.h"

namespace sim {

std::vector<uint8_t> FlashMemory::read(uint16_t address, size_t count) const
{
    // Whole-memory snapshots are taken often; copy in one go unless the range wraps.
    if (address + count <= kSize) return std::vector<uint8_t>(bytes_.begin() + address, bytes_.begin() + address + count);
    std::vector<uint8_t> result(count);
    for (size_t i = 0; i < count; ++i) result[i] = bytes_[static_cast<uint16_t>(address + i)];
    return result;
}

void FlashMemory::program(uint16_t address, const uint8_t* data, size_t count)
{
    for (size_t i = 0; i < count; ++i) bytes_[static_cast<uint16_t>(address + i)] &= data[i];
}

void FlashMemory::erasePage(uint16_t page)
{
    for (uint32_t i = 0; i < kPageSize; ++i) bytes_[(page * kPageSize + i) % kSize] = 0xFF;
}

void FlashMemory::load(uint16_t address, const std::vector<uint8_t>& bytes)
{
    for (size_t i = 0; i < bytes.size(); ++i) bytes_[static_cast<uint16_t>(address + i)] = bytes[i];
}

}  // namespace sim
