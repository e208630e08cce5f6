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

// The module's own memcpy in the driver; blocks of the image pass through it.
inline void copyBytes(void* destination, const void* source, size_t count)
{
    __builtin_memcpy(destination, source, count);
}

inline void fillBytes(void* destination, uint8_t value, size_t count)
{
    uint8_t* to = static_cast<uint8_t*>(destination);
    for (size_t i = 0; i < count; ++i) to[i] = value;
}

// Index of the first byte at which two buffers differ, or -1. Every block the
// module programs is compared after its read-back, so words are compared
// first and bytes only where a word differs.
inline int32_t findFirstDifference(const uint8_t* expected, const uint8_t* actual, uint32_t length)
{
    typedef uint64_t __attribute__((may_alias, aligned(1))) UnalignedWord;
    uint32_t i = 0;
    for (; i + sizeof(UnalignedWord) <= length; i += sizeof(UnalignedWord)) {
        if (*reinterpret_cast<const UnalignedWord*>(expected + i) != *reinterpret_cast<const UnalignedWord*>(actual + i))
            break;
    }
    for (; i < length; ++i) {
        if (expected[i] != actual[i]) return static_cast<int32_t>(i);
    }
    return -1;
}
