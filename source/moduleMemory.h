// Allocation and raw memory helpers of the module. All memory comes from the
// host allocator; there is no other heap in the kernel.
#pragma once

#include <stddef.h>
#include <stdint.h>

#include "../host/karvelk.h"

// Tag for constructing an object in memory the module obtained itself.
struct ConstructInPlace {};
inline void* operator new(size_t, void* where, ConstructInPlace) noexcept { return where; }

inline void* allocateFromHost(size_t size)
{
    return _memNewUsingCRT(size, kMemAllocationDefault, nullptr);
}

inline void copyBytes(void* destination, const void* source, size_t count)
{
    uint8_t* to = static_cast<uint8_t*>(destination);
    const uint8_t* from = static_cast<const uint8_t*>(source);
    for (size_t i = 0; i < count; ++i) to[i] = from[i];
}

inline void fillBytes(void* destination, uint8_t value, size_t count)
{
    uint8_t* to = static_cast<uint8_t*>(destination);
    for (size_t i = 0; i < count; ++i) to[i] = value;
}
