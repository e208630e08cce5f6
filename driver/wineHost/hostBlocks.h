// Blocks handed to the module: each is memory of this process standing for a
// block the lab's allocator counted, so allocation faults, live counts and
// misuse are the lab's, while the module touches only its own process.
#pragma once

#include <stddef.h>
#include <stdint.h>

namespace karvelk {

struct HostBlock {
    uint8_t* address;
    uint64_t size;
    uint64_t labId;    // the lab's name for the block
    uint64_t stream;   // for a stream buffer: the lab's stream; 0 otherwise
};

// Takes memory for a block the lab has counted; null when there is none.
void* adoptBlock(uint64_t labId, uint64_t size, uint64_t stream);
// The block holding [address, address + length), or null.
HostBlock* findBlock(const void* address, uint64_t length);
// The block that starts at address, or null.
HostBlock* findBlockAt(const void* address);
// Gives the memory back; the lab's count is the caller's business.
void dropBlock(HostBlock* block);
uint32_t liveBlocks();

}  // namespace karvelk
