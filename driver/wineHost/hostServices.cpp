// The test karvelk.sys's plain functions. Each is carried over to the lab,
// whose host stand-in does the work and the counting; what only this process
// can do (memory the module touches, reading the module's records and
// variable arguments by this ABI's rules) is done here.
#include <stdarg.h>

#include "../../host/karvelk.h"
#include "../../host/moduleRecords.h"
#include "../../host/transferParameters.h"
#include "../../sim/host/formatDirective.h"
#include "hostBlocks.h"
#include "hostCall.h"
#include "hostRegistration.h"

namespace {

using karvelk::HostCall;

void writeStatus(tStatus* status, uint32_t value)
{
    if (status != nullptr) *status = static_cast<tStatus>(value);
}

// The arguments a format takes, off this ABI's va_list, in order; the lab
// formats them with the stand-in's formatter.
void writeArguments(bridge::Writer& out, const char* format, va_list arguments)
{
    using hostformat::Argument;
    for (const char* p = format; p != nullptr && *p != 0;) {
        if (*p != '%') {
            ++p;
            continue;
        }
        const hostformat::Directive directive = hostformat::readDirective(p);
        if (directive.end == nullptr) break;
        p = directive.end;
        if (directive.argument == Argument::none) continue;
        out.u32(static_cast<uint32_t>(directive.argument));
        switch (directive.argument) {
        case Argument::signedInt:
        case Argument::character:
            out.u64(static_cast<uint64_t>(static_cast<int64_t>(va_arg(arguments, int))));
            break;
        case Argument::signedLong:
            out.u64(static_cast<uint64_t>(static_cast<int64_t>(va_arg(arguments, long))));
            break;
        case Argument::signedLongLong:
            out.u64(static_cast<uint64_t>(va_arg(arguments, long long)));
            break;
        case Argument::unsignedInt:
            out.u64(va_arg(arguments, unsigned int));
            break;
        case Argument::unsignedLong:
            out.u64(va_arg(arguments, unsigned long));
            break;
        case Argument::unsignedLongLong:
            out.u64(va_arg(arguments, unsigned long long));
            break;
        case Argument::pointer:
            out.u64(reinterpret_cast<uintptr_t>(va_arg(arguments, void*)));
            break;
        case Argument::text:
            out.text(va_arg(arguments, const char*));
            break;
        case Argument::text16:
            out.text16(va_arg(arguments, const uint16_t*));
            break;
        case Argument::none:
            break;
        }
    }
    out.u32(bridge::kNullText);
}

}  // namespace

int32_t pkgIsKarvelkInitialized()
{
    HostCall call(bridge::kIsInitialized);
    return static_cast<int32_t>(call.send().u32());
}

tStatus pkgModulePackageEventLog(uint32_t event, const char* firstName, const char* secondName, const char* mainName,
                                 tModuleMain moduleMain)
{
    HostCall call(bridge::kPackageEvent);
    call.out().u32(event);
    call.out().text(firstName);
    call.out().text(secondName);
    call.out().text(mainName);
    call.out().u64(reinterpret_cast<uintptr_t>(moduleMain));
    return static_cast<tStatus>(call.send().u32());
}

void libRegisterModuleWithKARVEL(_tLibModuleInfo* module, tStatus& status)
{
    karvelk::registerModule(module, status);
}

void libUnregisterModuleWithKARVEL(_tLibModuleInfo* module, tStatus& status)
{
    karvelk::unregisterModule(module, status);
}

void* _memNewUsingCRT(size_t size, tMemAllocationFlags flags, tStatus* status)
{
    HostCall call(bridge::kAllocate);
    call.out().u64(size);
    call.out().u32(flags);
    call.out().u32(status != nullptr ? 1 : 0);
    call.out().u32(status != nullptr ? static_cast<uint32_t>(*status) : 0);
    bridge::Reader& reply = call.send();
    const uint64_t labId = reply.u64();
    writeStatus(status, reply.u32());
    if (labId == 0) return nullptr;
    void* block = karvelk::adoptBlock(labId, size, 0);
    if (block == nullptr) karvelk::reportMisuse("the Windows side ran out of memory for a block the lab counted");
    return block;
}

void _memDelete(void* pointer)
{
    if (pointer == nullptr) return;
    karvelk::HostBlock* block = karvelk::findBlockAt(pointer);
    HostCall call(bridge::kRelease);
    call.out().u64(block != nullptr ? block->labId : 0);
    call.out().u64(reinterpret_cast<uintptr_t>(pointer));
    if (block != nullptr) karvelk::dropBlock(block);
    call.send();
}

void _kvlLogEvent(const char* component, const char* location, uint32_t level, const char* tag, const char* format,
                  ...)
{
    HostCall call(bridge::kLogEvent);
    call.out().text(component);
    call.out().text(location);
    call.out().u32(level);
    call.out().text(tag);
    call.out().text(format);
    va_list arguments;
    va_start(arguments, format);
    writeArguments(call.out(), format, arguments);
    va_end(arguments);
    call.send();
}

int32_t ssprintf(const char* format, ...)
{
    HostCall call(bridge::kDebugLine);
    call.out().text(format);
    va_list arguments;
    va_start(arguments, format);
    writeArguments(call.out(), format, arguments);
    va_end(arguments);
    return static_cast<int32_t>(call.send().u32());
}

uint32_t kvlASCIIToU32Base16(const char* text)
{
    HostCall call(bridge::kHexValue);
    call.out().text(text);
    return call.send().u32();
}

char* tSSVersion::toString(char* text) const
{
    HostCall call(bridge::kVersionText);
    call.out().u32(packed_);
    constexpr uint32_t kTextBytes = 16;
    const uint32_t length = call.send().bytes(text, kTextBytes - 1);
    text[length < kTextBytes - 1 ? length : kTextBytes - 1] = 0;
    return text;
}

namespace nQVKORD100 {

tUSBDeviceDescriptorProxy::tUSBDeviceDescriptorProxy() : descriptor{}, length(0) {}
tUSBDeviceDescriptorProxy::~tUSBDeviceDescriptorProxy() {}

// The host's own code would ask for casts; the module never does.
const void* tTransferParameter::___CPPKRLDynamicCast(const void*) const { return this; }
void* tTransferParameter::___CPPKRLDynamicCast(const void*) { return this; }
const void* tTransferParameterUSBControl::___CPPKRLDynamicCast(const void*) const { return this; }
void* tTransferParameterUSBControl::___CPPKRLDynamicCast(const void*) { return this; }
const void* tStreamParameter::___CPPKRLDynamicCast(const void*) const { return this; }
void* tStreamParameter::___CPPKRLDynamicCast(const void*) { return this; }
const void* tControlStreamParameterUSB::___CPPKRLDynamicCast(const void*) const { return this; }
void* tControlStreamParameterUSB::___CPPKRLDynamicCast(const void*) { return this; }

}  // namespace nQVKORD100
