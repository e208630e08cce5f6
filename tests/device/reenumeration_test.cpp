#include "deviceHarness.h"
#include "tests/support/WorldTest.h"

using device_tests::EventLog;
using device_tests::RawLink;
using testing_support::WorldTest;

namespace {

struct Loader {
    uint16_t productId;
    uint16_t markerAddress;
};

sim::EmulatedDeviceOptions optionsFor(const Loader& loader, std::vector<uint8_t> markerBytes)
{
    sim::EmulatedDeviceOptions options;
    options.loaderProductId = loader.productId;
    options.identity = sim::IdentityValues{0x1234, 0x4B03, 0x00E0D00B};
    options.memory = {{loader.markerAddress, markerBytes}};
    return options;
}

}  // namespace

class ReenumerationTest : public WorldTest, public testing::WithParamInterface<Loader> {};

INSTANTIATE_TEST_SUITE_P(BothLoaders, ReenumerationTest,
                         testing::Values(Loader{0x4A10, 0x0206}, Loader{0x4A20, 0x0606}));

TEST_P(ReenumerationTest, WithTheMarkerTheDeviceComesBackAsTheProductOfItsIdentityBlock)
{
    EventLog log(tree());
    sim::LoaderModeDevice& loader = sim::plugInLoaderDevice(optionsFor(GetParam(), {0xAA, 0x55}));
    sim::PhysicalDevice& hardware = loader.hardware();
    log.events.clear();
    RawLink link(loader);

    ASSERT_EQ(link.restart(), 0);
    EXPECT_TRUE(log.events.empty());  // a host reports arrivals on its own thread, not inside the transfer
    tree().deliverPendingEvents();

    ASSERT_EQ(log.events.size(), 2u);
    EXPECT_TRUE(!log.events[0].arrival && log.events[0].device == &loader);
    EXPECT_TRUE(log.events[1].arrival && log.events[1].device == hardware.current());
    sim::UsbDeviceSim& product = *log.events[1].device;
    EXPECT_EQ(product.getAttribute(1, nullptr), 0x1234u);
    EXPECT_EQ(product.getAttribute(2, nullptr), 0x4B03u);
    EXPECT_EQ(tree().presentDevices(), std::vector<sim::UsbDeviceSim*>{&product});

    // The old enumeration is gone: every request on it fails, but its stream and buffer can still be released.
    EXPECT_EQ(link.read(0x0000, 4).size(), 4u);
    EXPECT_EQ(hardware.trace.back().outcome, sim::kHostDeviceGone);
    tStatus status = 0;
    EXPECT_EQ(loader.getAttribute(2, &status), 0xFFFFFFFFu);
    EXPECT_EQ(status, sim::kHostDeviceGone);
    link.close();
    EXPECT_EQ(loader.openStreams(), 0u);
}

TEST_P(ReenumerationTest, WithoutTheMarkerTheDeviceComesBackInLoaderModeAFewTimesOnly)
{
    EventLog log(tree());
    // The marker bytes reversed are no marker.
    sim::LoaderModeDevice& first = sim::plugInLoaderDevice(optionsFor(GetParam(), {0x55, 0xAA}));
    sim::PhysicalDevice& hardware = first.hardware();
    log.events.clear();

    for (int restart = 1; restart <= 5; ++restart) {
        SCOPED_TRACE(restart);
        sim::EnumeratedDevice* before = hardware.current();
        RawLink link(*before);
        ASSERT_EQ(link.restart(), 0);
        link.close();
        tree().deliverPendingEvents();
        sim::EnumeratedDevice* after = hardware.current();
        ASSERT_NE(after, nullptr);
        EXPECT_NE(after, before);
        EXPECT_EQ(after->getAttribute(2, nullptr), GetParam().productId);
        EXPECT_EQ(hardware.loaderComebacks(), restart);
        bool announced = !log.events.empty() && log.events.back().arrival && log.events.back().device == after;
        EXPECT_EQ(announced, restart <= 3);
    }
    EXPECT_NE(hardware.notes.back().find("no longer announces"), std::string::npos);

    // A product start ends the run of comebacks.
    hardware.flash.load(GetParam().markerAddress, {0xAA, 0x55});
    RawLink link(*hardware.current());
    ASSERT_EQ(link.restart(), 0);
    EXPECT_EQ(hardware.loaderComebacks(), 0);
    EXPECT_EQ(hardware.current()->getAttribute(2, nullptr), 0x4B03u);
}
