// The few routines the compiler may call on its own. The module links no C
// runtime, so it supplies them itself.
#include <stddef.h>
#include <stdint.h>

extern "C" {

void* memcpy(void* destination, const void* source, size_t count)
{
    volatile uint8_t* to = static_cast<volatile uint8_t*>(destination);
    const uint8_t* from = static_cast<const uint8_t*>(source);
    for (size_t i = 0; i < count; ++i) to[i] = from[i];
    return destination;
}

void* memset(void* destination, int value, size_t count)
{
    volatile uint8_t* to = static_cast<volatile uint8_t*>(destination);
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
