#include "hostBlocks.h"

#include "hostCall.h"

namespace karvelk {

namespace {

// The module holds a handful of blocks at a time (its table, two listener
// records, stop-list nodes, one transfer buffer per update, a device array).
constexpr uint32_t kMaxBlocks = 256;
HostBlock gBlocks[kMaxBlocks];

}  // namespace

void* adoptBlock(uint64_t labId, uint64_t size, uint64_t stream)
{
    for (HostBlock& block : gBlocks) {
        if (block.address != nullptr) continue;
        block.address = static_cast<uint8_t*>(hostMemory(size));
        if (block.address == nullptr) return nullptr;
        block.size = size;
        block.labId = labId;
        block.stream = stream;
        return block.address;
    }
    return nullptr;
}

HostBlock* findBlock(const void* address, uint64_t length)
{
    const uint8_t* start = static_cast<const uint8_t*>(address);
    if (start == nullptr) return nullptr;
    for (HostBlock& block : gBlocks) {
        if (block.address == nullptr) continue;
        // Compared as addresses, so that no pointer outside a block is formed.
        const uintptr_t from = reinterpret_cast<uintptr_t>(block.address);
        const uintptr_t at = reinterpret_cast<uintptr_t>(start);
        if (at < from || at - from >= (block.size == 0 ? 1 : block.size)) continue;
        if (length > block.size - (at - from)) return nullptr;
        return &block;
    }
    return nullptr;
}

HostBlock* findBlockAt(const void* address)
{
    if (address == nullptr) return nullptr;
    for (HostBlock& block : gBlocks) {
        if (block.address == address) return &block;
    }
    return nullptr;
}

void dropBlock(HostBlock* block)
{
    releaseHostMemory(block->address);
    block->address = nullptr;
    block->size = 0;
    block->labId = 0;
    block->stream = 0;
}

uint32_t liveBlocks()
{
    uint32_t live = 0;
    for (const HostBlock& block : gBlocks) live += block.address != nullptr ? 1 : 0;
    return live;
}

}  // namespace karvelk
