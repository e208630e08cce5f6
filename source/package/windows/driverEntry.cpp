// An export driver is loaded through DllInitialize; an ordinary driver load
// of this image is refused.
#include "../../../kernel/ntkernel.h"

extern "C" NTSTATUS DriverEntry(void* driverObject, UNICODE_STRING* registryPath)
{
    (void)driverObject;
    (void)registryPath;
    return kStatusDriverUnableToLoad;
}
