// What the Windows-side harness and the test karvelk.sys share: a plain C
// interface, because the two are built by different compilers for different
// C++ ABIs (mingw-w64's Itanium, clang's MSVC). Only fixed-width fields and
// pointers to functions with C linkage cross it.
#pragma once

#include <stdint.h>

extern "C" {

// Deliberate ABI mistakes, for the test that shows a run catches them.
enum KarvelkMistake : uint32_t {
    kMistakeNone = 0,
    // The host's device-tree table with releaseQuery and removeListener swapped.
    kMistakeSlotOrder = 1,
    // compareFirmwareVersion's tSSVersion passed by reference, not by value.
    kMistakeVersionByReference = 2,
};

struct KarvelkBridge {
    void* context;
    // Sends one call (header and payload) to the lab and waits for its reply,
    // serving the lab's own calls meanwhile. Gives the reply payload's size,
    // or -1 when the lab is gone; the reply is cut to `capacity`.
    int32_t (*call)(void* context, const uint8_t* message, uint32_t size, uint8_t* reply, uint32_t capacity);
    // Memory for the host's own objects and for blocks handed to the module.
    void* (*allocate)(void* context, uint64_t size);
    void (*release)(void* context, void* block);
    // Where the dynamic-cast exports of karvelk.sys are, by class (transfer
    // parameter, USB control transfer, stream parameter, USB control stream)
    // and overload (const, non-const): the module's parameter objects must
    // hold them in this slot order.
    const void* castExports[4][2];
    uint32_t mistakes;
};

// Installs the bridge; every host call goes through it from now on.
void karvelkAttachBridge(const KarvelkBridge* bridge);
// Calls the module main of the registered module through its record.
// Gives 0 when no module is registered.
int32_t karvelkCallModuleMain(uint32_t reason, int32_t* result);
// Reports a device event to a listener record the module added: the host
// calls the callback's first virtual slot.
void karvelkDeliverEvent(uint64_t record, uint64_t device);
// What the host still holds for the module, one line per kind, "\n"-separated.
uint32_t karvelkLeftovers(char* text, uint32_t capacity);
}
