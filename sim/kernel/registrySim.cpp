// Placeholder until the registry stand-in lands.
#include "../../kernel/ntkernel.h"

extern "C" NTSTATUS ZwCreateKey(HANDLE*, uint32_t, OBJECT_ATTRIBUTES*, uint32_t, UNICODE_STRING*, uint32_t, uint32_t*)
{
    return kStatusObjectNameNotFound;
}

extern "C" NTSTATUS ZwQueryValueKey(HANDLE, UNICODE_STRING*, int, void*, uint32_t, uint32_t*)
{
    return kStatusObjectNameNotFound;
}

#include "registrySim.h"

namespace sim::kernel {
void Registry::reset() {}
Registry& registry()
{
    static Registry instance;
    return instance;
}
}  // namespace sim::kernel
