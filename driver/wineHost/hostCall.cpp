#include "hostCall.h"

namespace karvelk {

namespace {

// Calls nest (lab, module, host, lab, module...) a few levels deep at most.
constexpr uint32_t kMaxDepth = 8;
constexpr uint32_t kBufferBytes = sizeof(bridge::Header) + bridge::kMaxPayload;

uint8_t gRequests[kMaxDepth][kBufferBytes];
uint8_t gReplies[kMaxDepth][bridge::kMaxPayload];
uint32_t gDepth;
KarvelkBridge gBridge;
bool gAttached;

uint8_t* requestBuffer(uint32_t depth)
{
    return depth < kMaxDepth ? gRequests[depth] + sizeof(bridge::Header) : nullptr;
}

}  // namespace

const KarvelkBridge& bridgeLink()
{
    return gBridge;
}

bool hasMistake(uint32_t mistake)
{
    return (gBridge.mistakes & mistake) != 0;
}

HostCall::HostCall(uint32_t kind)
    : kind_(kind),
      depth_(gDepth++),
      writer_(requestBuffer(depth_), depth_ < kMaxDepth ? bridge::kMaxPayload : 0),
      reader_(nullptr, 0)
{
}

HostCall::~HostCall()
{
    --gDepth;
}

bridge::Reader& HostCall::send()
{
    if (!gAttached || depth_ >= kMaxDepth || writer_.overflowed()) return reader_;
    uint8_t* message = gRequests[depth_];
    const bridge::Header header = {kind_, writer_.size()};
    const uint8_t* headerBytes = reinterpret_cast<const uint8_t*>(&header);
    for (uint32_t i = 0; i < sizeof(header); ++i) message[i] = headerBytes[i];
    const int32_t size = gBridge.call(gBridge.context, message, sizeof(header) + writer_.size(), gReplies[depth_],
                                      bridge::kMaxPayload);
    if (size > 0) reader_ = bridge::Reader(gReplies[depth_], static_cast<uint32_t>(size));
    return reader_;
}

void reportMisuse(const char* text)
{
    HostCall call(bridge::kMisuse);
    call.out().text(text);
    call.send();
}

void* hostMemory(uint64_t size)
{
    return gAttached ? gBridge.allocate(gBridge.context, size == 0 ? 1 : size) : nullptr;
}

void releaseHostMemory(void* block)
{
    if (gAttached && block != nullptr) gBridge.release(gBridge.context, block);
}

}  // namespace karvelk

extern "C" void karvelkAttachBridge(const KarvelkBridge* bridge)
{
    karvelk::gBridge = *bridge;
    karvelk::gAttached = bridge->call != nullptr && bridge->allocate != nullptr && bridge->release != nullptr;
}
