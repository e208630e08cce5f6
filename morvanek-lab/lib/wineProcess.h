// The Windows side of a run: the harness under wine64, with the lab on its
// standard input and output, in the prefix the runs share (one at a time).
#pragma once

#include <cstdint>
#include <filesystem>
#include <string>
#include <vector>

#include "driver/wineHost/bridgeWire.h"

namespace lab {

// Where the Windows engine's pieces are; found from the build, or from
// MORVANEK_WINE64, MORVANEK_WINE_HOST, MORVANEK_DRIVER_IMAGE and MORVANEK_WINE_PREFIX.
struct WineSetup {
    std::filesystem::path wine64;
    std::filesystem::path hostProgram;  // morvanek-wine-host.exe, with the test karvelk.sys beside it
    std::filesystem::path image;        // morvanek.sys
    std::filesystem::path prefix;

    // Throws LabError saying what is missing.
    static WineSetup find();
};

// "Z:\dir\file": how a Wine process sees a Linux path.
std::wstring windowsPathOf(const std::filesystem::path& path);

struct BridgeMessage {
    uint32_t kind = 0;
    std::vector<uint8_t> payload;
};

class WineProcess {
public:
    // Takes the prefix's lock and starts the harness. Throws LabError.
    explicit WineProcess(const WineSetup& setup);
    // Ends the harness (it has normally finished by itself) and frees the prefix.
    ~WineProcess();
    WineProcess(const WineProcess&) = delete;
    WineProcess& operator=(const WineProcess&) = delete;

    // Throw LabError, with what the harness said, when it is gone.
    void send(uint32_t kind, const std::vector<uint8_t>& payload);
    BridgeMessage receive();

    // Waits for the harness to end; its exit status.
    int wait();

private:
    [[noreturn]] void gone(const std::string& what);

    int lockFd_ = -1;
    int toHost_ = -1;
    int fromHost_ = -1;
    int pid_ = -1;
    std::filesystem::path errorFile_;
};

// A payload built with a Writer.
class BridgePayload {
public:
    BridgePayload() : buffer_(bridge::kMaxPayload), writer_(buffer_.data(), bridge::kMaxPayload) {}
    bridge::Writer& out() { return writer_; }
    std::vector<uint8_t> bytes() const;

private:
    std::vector<uint8_t> buffer_;
    bridge::Writer writer_;
};

void writeText16(bridge::Writer& out, const std::u16string& text);
std::string readText(bridge::Reader& in, bool* isNull = nullptr);
std::u16string readText16(bridge::Reader& in, bool* isNull = nullptr);

}  // namespace lab
