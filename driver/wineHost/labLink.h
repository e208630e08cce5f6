// The harness's end of the pipe to the lab: standard input and output carry
// the messages of bridgeWire.h.
#pragma once

#include <cstdint>
#include <functional>
#include <vector>

#include "bridgeWire.h"

namespace winehost {

struct Message {
    uint32_t kind = 0;
    std::vector<uint8_t> payload;
};

// Serves one call from the lab and gives the reply's payload.
using CallServer = std::function<std::vector<uint8_t>(const Message& call)>;

void setCallServer(CallServer server);
// Sends a call and waits for its reply, serving the lab's calls meanwhile.
// The process ends when the lab is gone: nothing here can go on without it.
std::vector<uint8_t> callLab(uint32_t kind, const std::vector<uint8_t>& payload);
// Serves the lab's calls until it sends kFinish, whose reply is sent too.
void serveUntilFinished();

// A payload built with a Writer over a growing buffer.
class Payload {
public:
    Payload() : buffer_(bridge::kMaxPayload), writer_(buffer_.data(), bridge::kMaxPayload) {}
    bridge::Writer& out() { return writer_; }
    std::vector<uint8_t> bytes() const { return {buffer_.begin(), buffer_.begin() + writer_.size()}; }

private:
    std::vector<uint8_t> buffer_;
    bridge::Writer writer_;
};

}  // namespace winehost
