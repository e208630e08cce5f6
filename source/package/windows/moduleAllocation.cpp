// The module's operator new and delete. Objects are normally placed in memory
// from allocateFromHost(); these exist for the deleting destructors, which
// return memory through operator delete.
#include <stddef.h>

#include "../../moduleMemory.h"

// noexcept, because it returns null when the host has no memory: only for a
// noexcept allocation function does a new-expression test the result before
// it constructs. The redeclaration differs from the implicit one;
// GCC and clang for the driver's target take it (the latter with a warning of
// Microsoft compatibility), clang for Linux refuses it, and there the module
// keeps the implicit form and uses no plain new-expression.
#if defined(__clang__) && !defined(_MSC_VER)
#define MODULE_NEW_NOEXCEPT
#else
#define MODULE_NEW_NOEXCEPT noexcept
#endif

#if defined(__clang__)
#pragma clang diagnostic push
// Only this one declaration: the Microsoft-compatibility warning on it.
#pragma clang diagnostic ignored "-Wmicrosoft"
#endif
void* operator new(size_t size) MODULE_NEW_NOEXCEPT
{
    return allocateFromHost(size);
}
#if defined(__clang__)
#pragma clang diagnostic pop
#endif

void operator delete(void* pointer) noexcept
{
    if (pointer != nullptr) _memDelete(pointer);
}

void operator delete(void* pointer, size_t) noexcept
{
    if (pointer != nullptr) _memDelete(pointer);
}
