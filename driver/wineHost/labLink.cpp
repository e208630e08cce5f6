#include "labLink.h"

#include <windows.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace winehost {

namespace {

CallServer gServer;
bool gFinished = false;

void readExactly(void* to, uint32_t size)
{
    HANDLE in = GetStdHandle(STD_INPUT_HANDLE);
    uint8_t* at = static_cast<uint8_t*>(to);
    while (size != 0) {
        DWORD got = 0;
        if (!ReadFile(in, at, size, &got, nullptr) || got == 0) {
            std::fprintf(stderr, "morvanek-wine-host: the lab closed the pipe\n");
            ExitProcess(4);
        }
        at += got;
        size -= got;
    }
}

void writeAll(const void* from, uint32_t size)
{
    HANDLE out = GetStdHandle(STD_OUTPUT_HANDLE);
    const uint8_t* at = static_cast<const uint8_t*>(from);
    while (size != 0) {
        DWORD put = 0;
        if (!WriteFile(out, at, size, &put, nullptr) || put == 0) {
            std::fprintf(stderr, "morvanek-wine-host: cannot write to the lab\n");
            ExitProcess(4);
        }
        at += put;
        size -= put;
    }
}

void send(uint32_t kind, const std::vector<uint8_t>& payload)
{
    const bridge::Header header = {kind, static_cast<uint32_t>(payload.size())};
    std::vector<uint8_t> message(sizeof(header) + payload.size());
    std::memcpy(message.data(), &header, sizeof(header));
    if (!payload.empty()) std::memcpy(message.data() + sizeof(header), payload.data(), payload.size());
    writeAll(message.data(), static_cast<uint32_t>(message.size()));
}

Message receive()
{
    bridge::Header header = {};
    readExactly(&header, sizeof(header));
    if (header.size > bridge::kMaxPayload) {
        std::fprintf(stderr, "morvanek-wine-host: a message of %u bytes from the lab\n", header.size);
        ExitProcess(4);
    }
    Message message;
    message.kind = header.kind;
    message.payload.resize(header.size);
    if (header.size != 0) readExactly(message.payload.data(), header.size);
    return message;
}

void serve(const Message& call)
{
    if (call.kind == bridge::kFinish) gFinished = true;
    send(bridge::kReply, gServer(call));
}

}  // namespace

void setCallServer(CallServer server)
{
    gServer = std::move(server);
}

std::vector<uint8_t> callLab(uint32_t kind, const std::vector<uint8_t>& payload)
{
    send(kind, payload);
    for (;;) {
        Message message = receive();
        if (message.kind == bridge::kReply) return message.payload;
        serve(message);
    }
}

void serveUntilFinished()
{
    while (!gFinished) serve(receive());
}

}  // namespace winehost
