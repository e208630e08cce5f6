// Every header of the module, the host and the kernel in one translation unit,
// compiled for the driver's target: the layout assertions they carry must hold
// for the real ABI, not only for the Linux stand-ins. The list is gathered by
// the build, so a new header cannot be left out.
#include "everyModuleHeader.inc"

// What the host's decorated names and the records assume of the target.
static_assert(__is_same(tStatus, long), "the status is a long: the exported and imported names say so");
static_assert(sizeof(long) == 4 && sizeof(void*) == 8, "LLP64");
static_assert(sizeof(WCHAR) == 2, "kernel text is UTF-16");
// A version is one 32-bit word. Its user-provided constructor (and its private
// field) make MSVC return it through a hidden pointer rather than in RAX;
// callers of the version exports, the smoke harness among them, rely on that.
static_assert(sizeof(tSSVersion) == 4 && !__is_trivially_constructible(tSSVersion),
              "tSSVersion is returned through a hidden pointer");
