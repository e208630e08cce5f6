// Functions and plain classes of the host library karvelk.sys, as the module
// calls them.
#pragma once

#include <stddef.h>
#include <stdint.h>

#include "karvelkStatus.h"

struct _tLibModuleInfo;

typedef tStatus (*tModuleMain)(uint32_t reason);

// Only passed through; the meaning of its values is the host's.
enum tMemAllocationFlags : uint32_t {
    kMemAllocationDefault = 4,
};

int32_t pkgIsKarvelkInitialized();
tStatus pkgModulePackageEventLog(uint32_t event, const char* firstName, const char* secondName,
                                 const char* mainName, tModuleMain moduleMain);
void libRegisterModuleWithKARVEL(_tLibModuleInfo* module, tStatus& status);
void libUnregisterModuleWithKARVEL(_tLibModuleInfo* module, tStatus& status);

void* _memNewUsingCRT(size_t size, tMemAllocationFlags flags, tStatus* status);
void _memDelete(void* pointer);

void _kvlLogEvent(const char* component, const char* location, uint32_t level, const char* tag,
                  const char* format, ...);
int32_t ssprintf(const char* format, ...);

uint32_t kvlASCIIToU32Base16(const char* text);

// A packed version: major byte, minor nibble, update nibble, two phase bits and
// a 14-bit build. Versions compare as unsigned 32-bit numbers.
class tSSVersion {
public:
    tSSVersion(uint32_t packed = 0) : packed_(packed) {}
    uint32_t packed() const { return packed_; }
    // Writes a NUL-terminated text of at most 16 bytes and returns it.
    char* toString(char* text) const;

private:
    uint32_t packed_;
};
static_assert(sizeof(tSSVersion) == 4, "a version is one packed 32-bit value");
