// A format's arguments as the Windows-side host sends them: each taken off
// that process's own va_list by the shared directive reader, tagged with its
// kind, so the lab's one formatter can print the line.
#pragma once

#include <string>

#include "driver/wineHost/bridgeWire.h"
#include "sim/host/simHost.h"

namespace lab {

class WireArguments final : public sim::FormatArguments {
public:
    explicit WireArguments(bridge::Reader& in) : in_(in) {}

    long long nextSigned(hostformat::Argument kind) override;
    unsigned long long nextUnsigned(hostformat::Argument kind) override;
    const void* nextPointer() override;
    std::string nextText() override;
    std::string nextText16() override;

    // An argument of another kind than the format asks for: the rest is
    // unreadable, and each further argument comes out empty.
    bool broken() const { return broken_; }

private:
    bool expect(hostformat::Argument kind);
    uint64_t number(hostformat::Argument kind);

    bridge::Reader& in_;
    bool broken_ = false;
};

}  // namespace lab
