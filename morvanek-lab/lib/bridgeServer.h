// The lab's end of the Windows engine's host calls: each call karvelk.sys
// carries over is done here, by the same host stand-in and emulated devices
// the Linux engine uses, so the two engines share one emulator and one
// report. The module's records and objects live in the Windows process; the
// stand-in sees copies of them (mirrors) whose links are kept, and whose
// callbacks go back to the Windows process.
#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "driver/wineHost/bridgeWire.h"
#include "sim/host/simHost.h"

namespace lab {

class BridgeServer {
public:
    using CallWindows = std::function<std::vector<uint8_t>(uint32_t kind, const std::vector<uint8_t>& payload)>;
    using HostPath = std::function<std::optional<std::filesystem::path>(const std::string& dosPath)>;

    BridgeServer(CallWindows callWindows, HostPath hostPath);
    ~BridgeServer();

    // One host call from the Windows side; the reply's payload.
    std::vector<uint8_t> serve(uint32_t kind, bridge::Reader& in);

    // The module main behind the registration mirror.
    tStatus callModuleMain(uint32_t reason);

private:
    struct Registration;
    class Listener;

    sim::UsbDeviceSim* device(uint64_t id);
    ControlStream* stream(uint64_t id);
    DeviceQuery* query(uint64_t id);
    void* block(uint64_t id);

    std::vector<uint8_t> registerModule(bridge::Reader& in);
    std::vector<uint8_t> unregisterModule(bridge::Reader& in);
    std::vector<uint8_t> addListener(bridge::Reader& in);
    std::vector<uint8_t> removeListener(bridge::Reader& in);
    std::vector<uint8_t> findDevices(bridge::Reader& in);
    std::vector<uint8_t> transfer(bridge::Reader& in);
    std::vector<uint8_t> kernelCall(uint32_t kind, bridge::Reader& in);

    CallWindows callWindows_;
    HostPath hostPath_;
    std::map<uint64_t, std::unique_ptr<Registration>> registrations_;
    std::map<uint64_t, std::unique_ptr<Listener>> listeners_;
    std::map<uint64_t, void*> blocks_;  // host blocks the Windows side holds a copy of
    std::map<uint64_t, uint32_t> blockSizes_;
    std::map<uint64_t, ControlStream*> streams_;
    std::set<uint64_t> queries_;
};

}  // namespace lab
