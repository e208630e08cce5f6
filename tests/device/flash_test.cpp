// The flash behind the loader's requests: programming only clears bits, erase
// sets one page, the identity block's layout, and the faults a device can be
// told to have.
#include "deviceHarness.h"

using namespace device_tests;

namespace {

TEST_F(DeviceTest, ProgrammingOnlyClearsBitsUntilErasedAndEraseSetsExactlyOnePageToFF)
{
    sim::EmulatedDeviceOptions options;
    options.memory = {{0x03FF, std::vector<uint8_t>(0x202, 0x00)}, {0x0800, {0xFF, 0xF0, 0xA5}}};
    sim::LoaderModeDevice& device = sim::plugInLoaderDevice(options);
    sim::PhysicalDevice& hardware = device.hardware();
    RawLink link(device);

    // Written over old content, a cell holds old AND new.
    ASSERT_EQ(link.write(0x0800, {0x5A, 0x0F, 0xFF}), 0);
    EXPECT_EQ(link.read(0x0800, 3), (std::vector<uint8_t>{0x5A, 0x00, 0xA5}));
    EXPECT_EQ(hardware.readMemory(0x0800, 3), (std::vector<uint8_t>{0x5A, 0x00, 0xA5}));

    ASSERT_EQ(link.erase(2), 0);
    EXPECT_EQ(hardware.readMemory(0x0400, 0x200), std::vector<uint8_t>(0x200, 0xFF));
    EXPECT_EQ(hardware.flash.at(0x03FF) | hardware.flash.at(0x0600), 0x00);
    ASSERT_EQ(link.write(0x0410, {0x0F}), 0);
    EXPECT_EQ(link.read(0x0410, 1), std::vector<uint8_t>{0x0F});
}

TEST_F(DeviceTest, TheIdentityBlockIsBigEndianAtTheEndOfTheLoadersIdentityPage)
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

TEST_F(DeviceTest, UnpluggedAtTheNthRequestTheFlashStaysAsItWas)
{
    sim::EmulatedDeviceOptions options;
    options.faults.unplugAtRequest = 3;
    sim::LoaderModeDevice& device = sim::plugInLoaderDevice(options);
    sim::PhysicalDevice& hardware = device.hardware();
    RawLink link(device);

    EXPECT_EQ(link.erase(1), 0);
    EXPECT_EQ(link.write(0x0200, {0x11, 0x22}), 0);
    EXPECT_EQ(link.write(0x0300, {0x33}), sim::kHostDeviceGone);
    EXPECT_EQ(link.erase(1), sim::kHostDeviceGone);
    EXPECT_EQ(hardware.readMemory(0x0200, 2), (std::vector<uint8_t>{0x11, 0x22}));
    EXPECT_EQ(hardware.flash.at(0x0300), 0xFF);
    EXPECT_EQ(hardware.current(), nullptr);
    tree().deliverPendingEvents();
    EXPECT_TRUE(tree().presentDevices().empty());
    link.close();

    // Plugged back in, it answers again with the flash it kept.
    RawLink again(hardware.plugIn(tree()));
    EXPECT_EQ(again.read(0x0200, 2), (std::vector<uint8_t>{0x11, 0x22}));
}

TEST_F(DeviceTest, StalledRequestsAndCorruptedReadsLeaveTheFlashAlone)
{
    sim::EmulatedDeviceOptions options;
    options.memory = {{0x0200, {0x10, 0x20, 0x30, 0x40}}};
    options.faults.stallRequests = {2};
    options.faults.stallKinds = {sim::RequestKind::Erase};
    options.faults.readCorruptions = {{0x0201, 0x0F, std::nullopt}, {0x0203, 0, uint8_t{0x99}}};
    sim::LoaderModeDevice& device = sim::plugInLoaderDevice(options);
    RawLink link(device);

    EXPECT_EQ(link.read(0x0200, 4), (std::vector<uint8_t>{0x10, 0x2F, 0x30, 0x99}));
    EXPECT_EQ(link.send(kIn, 0xB0, 0, 0x0200, 4, link.buffer), sim::kHostTransferStalled);
    EXPECT_EQ(link.erase(1), sim::kHostTransferStalled);
    EXPECT_EQ(link.read(0x0202, 1), std::vector<uint8_t>{0x30});  // outside the corrupted cells
    EXPECT_EQ(device.hardware().readMemory(0x0200, 4), (std::vector<uint8_t>{0x10, 0x20, 0x30, 0x40}));
}

}  // namespace
