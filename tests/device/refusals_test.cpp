#include <functional>

#include "deviceHarness.h"
#include "tests/support/WorldTest.h"

using device_tests::kIn;
using device_tests::kOut;
using device_tests::RawLink;
using testing_support::WorldTest;

class RefusalTest : public WorldTest {};

TEST_F(RefusalTest, MalformedRequestsStallAndChangeNothing)
{
    struct Case {
        const char* what;
        std::function<tStatus(RawLink&)> send;
    };
    const Case cases[] = {
        {"unknown request", [](RawLink& l) { return l.send(kOut, 0xB1, 0, 0, 0, nullptr); }},
        {"read with a standard request type", [](RawLink& l) { return l.send(0x80, 0xB0, 0, 0x200, 4, l.buffer); }},
        {"read of 0 bytes", [](RawLink& l) { return l.send(kIn, 0xB0, 0, 0x200, 0, nullptr); }},
        {"read of 65 bytes", [](RawLink& l) { return l.send(kIn, 0xB0, 0, 0x200, 65, l.buffer); }},
        {"read with wValue", [](RawLink& l) { return l.send(kIn, 0xB0, 1, 0x200, 4, l.buffer); }},
        {"write of 0 bytes", [](RawLink& l) { return l.send(kOut, 0xB0, 0, 0x200, 0, nullptr); }},
        {"write of 513 bytes", [](RawLink& l) { return l.send(kOut, 0xB0, 0, 0x200, 513, l.buffer); }},
        {"erase with a data stage", [](RawLink& l) { return l.send(kOut, 0xB9, 1, 0, 1, l.buffer); }},
        {"erase of page 128", [](RawLink& l) { return l.erase(128); }},
        {"erase with wIndex", [](RawLink& l) { return l.send(kOut, 0xB9, 1, 1, 0, nullptr); }},
        {"restart with a data stage", [](RawLink& l) { return l.send(kOut, 0xBA, 0, 0, 1, l.buffer); }},
        {"restart with wValue", [](RawLink& l) { return l.send(kOut, 0xBA, 1, 0, 0, nullptr); }},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        sim::EmulatedDeviceOptions options;
        options.memory = {{0x0200, std::vector<uint8_t>(0x400, 0x00)}};
        sim::LoaderModeDevice& device = sim::plugInLoaderDevice(options);
        sim::PhysicalDevice& hardware = device.hardware();
        const std::vector<uint8_t> before = hardware.readMemory(0, 0x10000);
        RawLink link(device, 1024);
        std::fill(link.buffer, link.buffer + 1024, 0x77);

        EXPECT_EQ(c.send(link), sim::kHostTransferStalled);
        EXPECT_EQ(hardware.readMemory(0, 0x10000), before);
        EXPECT_EQ(link.buffer[0], 0x77);
        ASSERT_EQ(hardware.trace.size(), 1u);
        EXPECT_EQ(hardware.trace[0].outcome, sim::kHostTransferStalled);
        EXPECT_TRUE(hardware.trace[0].data.empty());
        EXPECT_EQ(hardware.current(), &device);  // still the same loader: nothing restarted
    }
}

TEST_F(RefusalTest, RequestsOnReleasedStreamsOrBuffersStallAndAreReported)
{
    sim::LoaderModeDevice& device = sim::plugInLoaderDevice();
    RawLink link(device);

    EXPECT_EQ(link.send(kIn, 0xB0, 0, 0, 64, link.buffer + 500), sim::kHostTransferStalled);  // runs past the end

    tStatus status = 0;
    link.stream->freeBuffer(link.buffer, status);
    EXPECT_EQ(link.send(kIn, 0xB0, 0, 0, 4, link.buffer), sim::kHostTransferStalled);
    link.buffer = nullptr;

    device.closeStream(link.stream, status);
    EXPECT_EQ(link.send(kOut, 0xB9, 1, 0, 0, nullptr), sim::kHostTransferStalled);
    link.stream = nullptr;

    EXPECT_EQ(host().misuse.size(), 3u);
    host().misuse.clear();
    EXPECT_EQ(device.hardware().flash.at(0x0200), 0xFF);
}
