#include "deviceHarness.h"
#include "tests/support/WorldTest.h"

using device_tests::RawLink;
using testing_support::WorldTest;

class FlashTest : public WorldTest {};

TEST_F(FlashTest, ProgrammingOnlyClearsBitsUntilThePageIsErased)
{
    struct Case {
        uint8_t stored;
        uint8_t written;
        bool eraseFirst;
        uint8_t readBack;
    };
    const Case cases[] = {
        {0xFF, 0x5A, false, 0x5A},
        {0xF0, 0x0F, false, 0x00},  // written over old content: old AND new
        {0xA5, 0xFF, false, 0xA5},
        {0xF0, 0x0F, true, 0x0F},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(testing::Message() << "stored " << int(c.stored) << " written " << int(c.written));
        sim::EmulatedDeviceOptions options;
        options.memory = {{0x0410, {c.stored}}};
        sim::LoaderModeDevice& device = sim::plugInLoaderDevice(options);
        RawLink link(device);
        if (c.eraseFirst) {
            EXPECT_EQ(link.erase(2), 0);
        }
        EXPECT_EQ(link.write(0x0410, {c.written}), 0);
        EXPECT_EQ(link.read(0x0410, 1), std::vector<uint8_t>{c.readBack});
        EXPECT_EQ(device.hardware().flash.at(0x0410), c.readBack);
    }
}

TEST_F(FlashTest, EraseSetsExactlyOnePageToFF)
{
    sim::EmulatedDeviceOptions options;
    options.memory = {{0x03FF, std::vector<uint8_t>(0x202, 0x00)}};
    sim::LoaderModeDevice& device = sim::plugInLoaderDevice(options);
    RawLink link(device);
    ASSERT_EQ(link.erase(2), 0);
    sim::PhysicalDevice& hardware = device.hardware();
    EXPECT_EQ(hardware.readMemory(0x0400, 0x200), std::vector<uint8_t>(0x200, 0xFF));
    EXPECT_EQ(hardware.flash.at(0x03FF), 0x00);
    EXPECT_EQ(hardware.flash.at(0x0600), 0x00);
}

TEST_F(FlashTest, AddressesWrapAtSixteenBits)
{
    sim::LoaderModeDevice& device = sim::plugInLoaderDevice();
    RawLink link(device);
    ASSERT_EQ(link.write(0xFFFE, {1, 2, 3, 4}), 0);
    EXPECT_EQ(device.hardware().readMemory(0x0000, 2), (std::vector<uint8_t>{3, 4}));
    EXPECT_EQ(link.read(0xFFFE, 4), (std::vector<uint8_t>{1, 2, 3, 4}));
}

TEST_F(FlashTest, IdentityBlockIsBigEndianAtTheLoadersIdentityPage)
{
    sim::EmulatedDeviceOptions options;
    options.loaderProductId = 0x4A20;
    options.identity = sim::IdentityValues{0x5C1D, 0x4B02, 0x00E10F22, 0x4B01, 0x4B03};
    sim::LoaderModeDevice& device = sim::plugInLoaderDevice(options);
    const std::vector<uint8_t> block = {0x4B, 0x02, 0x4B, 0x01, 0xFF, 0xFF, 0xFF, 0xFF,
                                        0x5C, 0x1D, 0x4B, 0x03, 0x00, 0xE1, 0x0F, 0x22};
    EXPECT_EQ(device.hardware().readMemory(0x7DF0, 16), block);
    EXPECT_EQ(device.hardware().identity().serialNumber, 0x00E10F22u);
}
