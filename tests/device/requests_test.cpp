// The loader's requests as the device checks them, the host's checks on
// streams and buffers, and the restart that re-enumerates the device.
#include "deviceHarness.h"

#include <sstream>

using namespace device_tests;

namespace {

TEST_F(DeviceTest, MalformedRequestsStallAndChangeNothing)
{
    using Send = tStatus (*)(RawLink&);
    const std::pair<const char*, Send> cases[] = {
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
    for (const auto& [what, send] : cases) {
        SCOPED_TRACE(what);
        sim::EmulatedDeviceOptions options;
        options.memory = {{0x0200, std::vector<uint8_t>(0x400, 0x00)}};
        sim::LoaderModeDevice& device = sim::plugInLoaderDevice(options);
        const std::vector<uint8_t> before = device.hardware().readMemory(0, 0x10000);
        RawLink link(device, 1024);
        std::fill(link.buffer, link.buffer + 1024, 0x77);

        EXPECT_EQ(send(link), sim::kHostTransferStalled);

        EXPECT_EQ(device.hardware().readMemory(0, 0x10000), before);
        EXPECT_EQ(link.buffer[0], 0x77);
        EXPECT_EQ(device.hardware().current(), &device);  // nothing restarted
    }
}

TEST_F(DeviceTest, MisusedStreamsAndBuffersAreRefusedAndReportedAndLeakedBuffersShow)
{
    sim::LoaderModeDevice& device = sim::plugInLoaderDevice();
    nQVKORD100::tControlStreamParameterUSB parameter;
    parameter.first = 3;
    parameter.second = 1;
    tStatus status = 0;
    EXPECT_EQ(device.openStream(&parameter, status), nullptr);
    EXPECT_EQ(status, sim::kHostBadArgument);

    RawLink link(device);
    EXPECT_EQ(link.send(kIn, 0xB0, 0, 0, 64, link.buffer + 500), sim::kHostTransferStalled);  // past the buffer's end
    status = 0;
    link.stream->freeBuffer(link.buffer, status);
    EXPECT_EQ(link.send(kIn, 0xB0, 0, 0, 4, link.buffer), sim::kHostTransferStalled);
    link.buffer = nullptr;
    device.closeStream(link.stream, status);
    EXPECT_EQ(link.send(kOut, 0xB9, 1, 0, 0, nullptr), sim::kHostTransferStalled);
    link.stream = nullptr;
    EXPECT_EQ(host().misuse.size(), 4u);
    host().misuse.clear();
    EXPECT_EQ(device.hardware().flash.at(0x0200), 0xFF);

    // A stream closed with its buffer still allocated leaves the buffer counted.
    RawLink leaking(device);
    device.closeStream(leaking.stream, status);
    leaking.stream = nullptr;
    leaking.buffer = nullptr;
    EXPECT_EQ(leftovers(), std::vector<std::string>{"1 host allocation(s) live (512 bytes)"});
    host().reset();  // the leak was the point
}

struct Loader {
    uint16_t productId;
    uint16_t markerAddress;
};
void PrintTo(const Loader& loader, std::ostream* out)
{
    *out << std::hex << loader.productId;
}

class Reenumeration : public DeviceTest, public testing::WithParamInterface<Loader> {
  protected:
    sim::LoaderModeDevice& plugIn(std::vector<uint8_t> markerBytes)
    {
        sim::EmulatedDeviceOptions options;
        options.loaderProductId = GetParam().productId;
        options.identity = sim::IdentityValues{0x1234, 0x4B03, 0x00E0D00B};
        options.memory = {{GetParam().markerAddress, markerBytes}};
        return sim::plugInLoaderDevice(options);
    }
};

INSTANTIATE_TEST_SUITE_P(BothLoaders, Reenumeration, testing::Values(Loader{0x4A10, 0x0206}, Loader{0x4A20, 0x0606}),
                         [](const auto& info) {
                             std::ostringstream name;
                             name << "Loader" << std::hex << std::uppercase << info.param.productId;
                             return name.str();
                         });

TEST_P(Reenumeration, WithTheMarkerTheDeviceComesBackAsTheProductOfItsIdentityBlock)
{
    ArrivalLog log(tree());
    sim::LoaderModeDevice& loader = plugIn({0xAA, 0x55});
    sim::PhysicalDevice& hardware = loader.hardware();
    log.arrivals.clear();
    RawLink link(loader);

    ASSERT_EQ(link.restart(), 0);
    EXPECT_TRUE(log.arrivals.empty());  // a host reports arrivals on its own thread, not inside the transfer
    tree().deliverPendingEvents();

    ASSERT_EQ(log.arrivals.size(), 1u);
    sim::UsbDeviceSim& product = *log.arrivals[0];
    EXPECT_EQ(&product, hardware.current());
    EXPECT_EQ(product.getAttribute(1, nullptr), 0x1234u);
    EXPECT_EQ(product.getAttribute(2, nullptr), 0x4B03u);
    EXPECT_EQ(tree().presentDevices(), std::vector<sim::UsbDeviceSim*>{&product});

    // The old enumeration is gone: every request on it fails, but its stream and buffer can still be released.
    EXPECT_EQ(link.send(kIn, 0xB0, 0, 0, 4, link.buffer), sim::kHostDeviceGone);
    tStatus status = 0;
    EXPECT_EQ(loader.getAttribute(2, &status), 0xFFFFFFFFu);
    EXPECT_EQ(status, sim::kHostDeviceGone);
    link.close();
    EXPECT_EQ(loader.openStreams(), 0u);
}

TEST_P(Reenumeration, WithoutTheMarkerTheDeviceComesBackInLoaderModeAndIsAnnouncedAFewTimesOnly)
{
    ArrivalLog log(tree());
    sim::PhysicalDevice& hardware = plugIn({0x55, 0xAA}).hardware();  // the marker's bytes reversed
    for (int restart = 1; restart <= 5; ++restart) {
        SCOPED_TRACE(restart);
        log.arrivals.clear();
        sim::EnumeratedDevice* before = hardware.current();
        RawLink(*before).restart();
        tree().deliverPendingEvents();

        sim::EnumeratedDevice* after = hardware.current();
        ASSERT_NE(after, nullptr);
        EXPECT_NE(after, before);
        EXPECT_EQ(after->getAttribute(2, nullptr), GetParam().productId);
        EXPECT_EQ(hardware.loaderComebacks(), restart);
        EXPECT_EQ(log.arrivals,
                  restart <= 3 ? std::vector<sim::UsbDeviceSim*>{after} : std::vector<sim::UsbDeviceSim*>{});
    }

    // A product start ends the run of comebacks.
    hardware.flash.load(GetParam().markerAddress, {0xAA, 0x55});
    EXPECT_EQ(RawLink(*hardware.current()).restart(), 0);
    EXPECT_EQ(hardware.loaderComebacks(), 0);
    EXPECT_EQ(hardware.current()->getAttribute(2, nullptr), 0x4B03u);
}

// Restarted or plugged in again, a device keeps its place in the host's
// search order, and a power-up starts it as its flash says.
TEST_P(Reenumeration, PluggedInAgainTheDeviceStartsAsItsFlashSaysInItsPlace)
{
    sim::PhysicalDevice& first = plugIn({0xAA, 0x55}).hardware();
    sim::PhysicalDevice& second = plugIn({0xFF, 0xFF}).hardware();
    auto order = [&] { return tree().presentDevices(); };

    EXPECT_EQ(RawLink(*first.current()).restart(), 0);
    tree().deliverPendingEvents();
    EXPECT_EQ(order(), (std::vector<sim::UsbDeviceSim*>{first.current(), second.current()}));
    EXPECT_EQ(dynamic_cast<sim::ProductDevice*>(first.current()) != nullptr, true);

    first.unplug();
    second.unplug();
    second.plugIn(tree(), sim::PhysicalDevice::PowerUp::asFlashSays);
    first.plugIn(tree(), sim::PhysicalDevice::PowerUp::asFlashSays);
    EXPECT_EQ(order(), (std::vector<sim::UsbDeviceSim*>{first.current(), second.current()}));
    EXPECT_EQ(first.current()->getAttribute(2, nullptr), 0x4B03u) << "programmed and restarted: its firmware runs";
    EXPECT_EQ(second.current()->getAttribute(2, nullptr), GetParam().productId) << "no marker: its loader runs";

    // Held in the loader, or started in its firmware, whatever the flash holds.
    first.plugIn(tree(), sim::PhysicalDevice::PowerUp::loader);
    EXPECT_EQ(first.current()->getAttribute(2, nullptr), GetParam().productId);
    second.plugIn(tree(), sim::PhysicalDevice::PowerUp::firmware);
    EXPECT_EQ(second.current()->getAttribute(2, nullptr), 0x4B03u);
    EXPECT_EQ(order().size(), 2u);
}

// An unplug fault that fired is spent by the next plug-in; one that has not
// fired yet survives a pull and plug by hand.
TEST_F(DeviceTest, AnUnplugFaultIsSpentOnceItFiredAndKeptUntilThen)
{
    sim::EmulatedDeviceOptions options;
    options.faults.unplugAtRequest = 3;
    sim::PhysicalDevice& hardware = sim::plugInLoaderDevice(options).hardware();
    {
        RawLink link(*hardware.current());
        EXPECT_EQ(link.read(0, 4).size(), 4u);
    }
    hardware.unplug();
    hardware.plugIn(tree());
    {
        RawLink link(*hardware.current());
        EXPECT_EQ(link.send(kIn, 0xB0, 0, 0, 4, link.buffer), 0);
        EXPECT_EQ(link.send(kIn, 0xB0, 0, 0, 4, link.buffer), sim::kHostDeviceGone);  // request 3
    }
    EXPECT_TRUE(hardware.unplugged());
    hardware.plugIn(tree());
    RawLink link(*hardware.current());
    for (int i = 0; i < 5; ++i) EXPECT_EQ(link.send(kIn, 0xB0, 0, 0, 4, link.buffer), 0);
    EXPECT_EQ(hardware.faults.unplugAtRequest, 0u);
}

}  // namespace
