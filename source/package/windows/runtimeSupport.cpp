// The few routines the compiler may call on its own. The module links no C
// runtime, so it supplies them itself.
#include <stddef.h>
#include <stdint.h>

namespace {

// A word the compiler may read through any pointer, so that copying by words
// does not break the aliasing rules.
typedef uint64_t __attribute__((may_alias)) AliasingWord;

constexpr uintptr_t kWordMask = sizeof(AliasingWord) - 1;

}  // namespace

extern "C" {

// Word by word where the two pointers can be aligned together: every block
// the module programs is copied through here twice.
void* memcpy(void* destination, const void* source, size_t count)
{
    uint8_t* to = static_cast<uint8_t*>(destination);
    const uint8_t* from = static_cast<const uint8_t*>(source);
    if (((reinterpret_cast<uintptr_t>(to) ^ reinterpret_cast<uintptr_t>(from)) & kWordMask) == 0) {
        for (; count != 0 && (reinterpret_cast<uintptr_t>(to) & kWordMask) != 0; --count) *to++ = *from++;
        for (; count >= sizeof(AliasingWord); count -= sizeof(AliasingWord)) {
            *reinterpret_cast<AliasingWord*>(to) = *reinterpret_cast<const AliasingWord*>(from);
            to += sizeof(AliasingWord);
            from += sizeof(AliasingWord);
        }
    }
    for (; count != 0; --count) *to++ = *from++;
    return destination;
}

void* memset(void* destination, int value, size_t count)
{
    uint8_t* to = static_cast<uint8_t*>(destination);
    for (size_t i = 0; i < count; ++i) to[i] = static_cast<uint8_t>(value);
    return destination;
}

// A pure virtual call means a destroyed or half-built object was used: stop
// where it happened rather than run on.
#if defined(_WIN32)
int _purecall()
{
    __builtin_trap();
}
#else
void __cxa_pure_virtual()
{
    __builtin_trap();
}
#endif
}
