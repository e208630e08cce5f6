// One host call carried over to the lab: the message is written into buffers
// of the current nesting depth, sent, and its reply read back.
#pragma once

#include <stdint.h>

#include "bridgeWire.h"
#include "karvelkBridge.h"

namespace karvelk {

const KarvelkBridge& bridgeLink();
bool hasMistake(uint32_t mistake);

class HostCall {
public:
    explicit HostCall(uint32_t kind);
    ~HostCall();
    HostCall(const HostCall&) = delete;
    HostCall& operator=(const HostCall&) = delete;

    bridge::Writer& out() { return writer_; }
    // Sends the call; the reader holds the reply (all zeros when the lab is
    // gone or the message did not fit).
    bridge::Reader& send();

private:
    uint32_t kind_;
    uint32_t depth_;
    bridge::Writer writer_;
    bridge::Reader reader_;
};

// What the host saw the module do wrong, for the lab's misuse list.
void reportMisuse(const char* text);

// Memory from the harness, for blocks handed to the module and host objects.
void* hostMemory(uint64_t size);
void releaseHostMemory(void* block);

}  // namespace karvelk
