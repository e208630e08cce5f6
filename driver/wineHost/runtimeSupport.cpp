// What the compiler may call in freestanding code: the test host links no
// runtime, like the module it serves.
#include <stddef.h>

extern "C" void* memcpy(void* to, const void* from, size_t count)
{
    unsigned char* out = static_cast<unsigned char*>(to);
    const unsigned char* in = static_cast<const unsigned char*>(from);
    for (size_t i = 0; i < count; ++i) out[i] = in[i];
    return to;
}

extern "C" void* memset(void* to, int value, size_t count)
{
    unsigned char* out = static_cast<unsigned char*>(to);
    for (size_t i = 0; i < count; ++i) out[i] = static_cast<unsigned char>(value);
    return to;
}
