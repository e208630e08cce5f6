// The kernel's string services as the module uses them.
#include <cstdint>

#include "../../kernel/ntkernel.h"

extern "C" void RtlInitUnicodeString(UNICODE_STRING* destination, const WCHAR* source)
{
    destination->Buffer = const_cast<WCHAR*>(source);
    if (source == nullptr) {
        destination->Length = 0;
        destination->MaximumLength = 0;
        return;
    }
    size_t length = 0;
    while (source[length] != 0) ++length;
    // The kernel caps a counted string at what 16 bits can count.
    if (length > 32766) length = 32766;
    destination->Length = static_cast<uint16_t>(length * sizeof(WCHAR));
    destination->MaximumLength = static_cast<uint16_t>(destination->Length + sizeof(WCHAR));
}

extern "C" void RtlCopyUnicodeString(UNICODE_STRING* destination, const UNICODE_STRING* source)
{
    if (source == nullptr) {
        destination->Length = 0;
        return;
    }
    uint16_t bytes = source->Length < destination->MaximumLength ? source->Length : destination->MaximumLength;
    bytes = static_cast<uint16_t>(bytes & ~1u);
    for (uint16_t i = 0; i < bytes / sizeof(WCHAR); ++i) destination->Buffer[i] = source->Buffer[i];
    destination->Length = bytes;
    // Like the kernel: terminate when there is room for it.
    if (bytes + sizeof(WCHAR) <= destination->MaximumLength) destination->Buffer[bytes / sizeof(WCHAR)] = 0;
}

// Bound to the C symbol "wcschr" by its declaration in ntkernel.h.
WCHAR* wcschr(const WCHAR* text, WCHAR character)
{
    for (;; ++text) {
        if (*text == character) return const_cast<WCHAR*>(text);
        if (*text == 0) return nullptr;
    }
}
