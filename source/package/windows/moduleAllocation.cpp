// The module's operator new and delete. Objects are normally placed in memory
// from allocateFromHost(); these exist for the deleting destructors, which
// return memory through operator delete.
#include <stddef.h>

#include "../../moduleMemory.h"

// Not noexcept: it must match the implicit declaration on both targets.
// The module itself never allocates with a plain new.
void* operator new(size_t size)
{
    return allocateFromHost(size);
}

void operator delete(void* pointer) noexcept
{
    if (pointer != nullptr) _memDelete(pointer);
}

void operator delete(void* pointer, size_t) noexcept
{
    if (pointer != nullptr) _memDelete(pointer);
}
