// What the smoke harness sees of the test karvelk.sys: one snapshot record
// and two controls, exported in plain C. The fake host is built for the MSVC
// ABI and the harness with mingw-w64, so the record holds only fixed-width
// fields and its layout is asserted on both sides.
#pragma once

#include <stddef.h>
#include <stdint.h>

constexpr uint32_t kFakeHostLineBytes = 512;

struct FakeHostState {
    uint32_t liveAllocations;  // host blocks not yet given back
    uint32_t registrations;    // registered minus unregistered modules
    uint32_t packageEvents;    // pkgModulePackageEventLog calls
    uint32_t lastPackageEvent;
    uint32_t openQueries;
    uint32_t listeners;         // records added and not yet removed
    uint32_t listenerKindMask;  // bit n set: a record of event kind n is added
    uint32_t attributeReads;    // getAttribute calls on offered devices
    uint32_t streamsOpened;
    uint32_t debugLines;  // ssprintf calls
    uint32_t logLines;    // _kvlLogEvent calls
    uint32_t reserved;
    const void* registeredModule;  // the _tLibModuleInfo last registered
    char lastDebugLine[kFakeHostLineBytes];
    // "component|location|level|tag|message"
    char lastLogLine[kFakeHostLineBytes];
};
static_assert(offsetof(FakeHostState, registeredModule) == 48, "module pointer at 48");
static_assert(offsetof(FakeHostState, lastDebugLine) == 56, "debug line at 56");
static_assert(sizeof(FakeHostState) == 56 + 2 * kFakeHostLineBytes, "no padding at the end");

extern "C" {
const FakeHostState* fakeHostState();
// With no tree, iDeviceTree::getDeviceTree() gives null.
void fakeHostSetDeviceTreePresent(int32_t present);
// Offers a device with these IDs to every arrival listener.
void fakeHostOfferDevice(uint16_t vendorId, uint16_t productId);
}
