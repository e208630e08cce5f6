// The test karvelk.sys: the host's plain functions over static memory, with
// every call the module makes counted in the state record the harness reads.
#include "../../host/karvelk.h"
#include "../../host/moduleRecords.h"
#include "../../host/transferParameters.h"
#include "fakeHost.h"

namespace {

constexpr tStatus kFakeHostOutOfMemory = -52001;
constexpr size_t kArenaBytes = 64 * 1024;
constexpr size_t kBlockAlignment = 16;

FakeHostState gState;

// Blocks are never reused: the smoke run allocates little, and a count of
// live blocks is all it checks.
alignas(kBlockAlignment) uint8_t gArena[kArenaBytes];
size_t gArenaUsed;

}  // namespace

FakeHostState& fakeHost()
{
    return gState;
}

extern "C" const FakeHostState* fakeHostState()
{
    return &gState;
}

int32_t pkgIsKarvelkInitialized()
{
    return 1;
}

tStatus pkgModulePackageEventLog(uint32_t event, const char*, const char*, const char*, tModuleMain)
{
    ++gState.packageEvents;
    gState.lastPackageEvent = event;
    return 0;
}

void libRegisterModuleWithKARVEL(_tLibModuleInfo* module, tStatus& status)
{
    if (status < 0) return;
    ++gState.registrations;
    gState.registeredModule = module;
}

void libUnregisterModuleWithKARVEL(_tLibModuleInfo* module, tStatus& status)
{
    if (status < 0 || module != gState.registeredModule) return;
    --gState.registrations;
}

void* _memNewUsingCRT(size_t size, tMemAllocationFlags, tStatus* status)
{
    if (status != nullptr && *status < 0) return nullptr;
    const size_t rounded = (size + kBlockAlignment - 1) & ~(kBlockAlignment - 1);
    if (rounded > kArenaBytes - gArenaUsed) {
        if (status != nullptr) setFailure(*status, kFakeHostOutOfMemory);
        return nullptr;
    }
    void* block = gArena + gArenaUsed;
    gArenaUsed += rounded;
    ++gState.liveAllocations;
    return block;
}

void _memDelete(void* pointer)
{
    if (pointer != nullptr) --gState.liveAllocations;
}

void _kvlLogEvent(const char* component, const char* location, uint32_t level, const char* tag, const char* format,
                  ...)
{
    ++gState.logLines;
    char message[kFakeHostLineBytes];
    va_list arguments;
    va_start(arguments, format);
    formatText(message, sizeof(message), format, arguments);
    va_end(arguments);
    formatInto(gState.lastLogLine, sizeof(gState.lastLogLine), "%s|%s|%u|%s|%s", component, location, level, tag,
               message);
}

int32_t ssprintf(const char* format, ...)
{
    ++gState.debugLines;
    va_list arguments;
    va_start(arguments, format);
    formatText(gState.lastDebugLine, sizeof(gState.lastDebugLine), format, arguments);
    va_end(arguments);
    return 0;
}

uint32_t kvlASCIIToU32Base16(const char* text)
{
    uint32_t value = 0;
    for (; *text != 0; ++text) {
        const char c = *text;
        uint32_t digit;
        if (c >= '0' && c <= '9') {
            digit = static_cast<uint32_t>(c - '0');
        } else if (c >= 'A' && c <= 'F') {
            digit = static_cast<uint32_t>(c - 'A' + 10);
        } else if (c >= 'a' && c <= 'f') {
            digit = static_cast<uint32_t>(c - 'a' + 10);
        } else {
            break;
        }
        value = value << 4 | digit;
    }
    return value;
}

char* tSSVersion::toString(char* text) const
{
    constexpr char kPhases[] = {'d', 'a', 'b', 'f'};
    const uint32_t v = packed_;
    formatInto(text, 16, "%u.%u.%u%c%u", v >> 24, (v >> 20) & 0xF, (v >> 16) & 0xF, kPhases[(v >> 14) & 3],
               v & 0x3FFF);
    return text;
}

namespace nQVKORD100 {

tUSBDeviceDescriptorProxy::tUSBDeviceDescriptorProxy() : descriptor{}, length(0) {}
tUSBDeviceDescriptorProxy::~tUSBDeviceDescriptorProxy() {}

// The module never asks for a cast; the host's own code would.
const void* tTransferParameter::___CPPKRLDynamicCast(const void*) const { return this; }
void* tTransferParameter::___CPPKRLDynamicCast(const void*) { return this; }
const void* tTransferParameterUSBControl::___CPPKRLDynamicCast(const void*) const { return this; }
void* tTransferParameterUSBControl::___CPPKRLDynamicCast(const void*) { return this; }
const void* tStreamParameter::___CPPKRLDynamicCast(const void*) const { return this; }
void* tStreamParameter::___CPPKRLDynamicCast(const void*) { return this; }
const void* tControlStreamParameterUSB::___CPPKRLDynamicCast(const void*) const { return this; }
void* tControlStreamParameterUSB::___CPPKRLDynamicCast(const void*) { return this; }

}  // namespace nQVKORD100
