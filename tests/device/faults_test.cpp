#include "deviceHarness.h"
#include "tests/support/WorldTest.h"

using device_tests::EventLog;
using device_tests::RawLink;
using testing_support::WorldTest;

class FaultTest : public WorldTest {};

TEST_F(FaultTest, UnpluggedAtTheNthRequestTheFlashStaysAsItWas)
{
    EventLog log(tree());
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
    EXPECT_TRUE(tree().presentDevices().empty());

    tree().deliverPendingEvents();
    EXPECT_TRUE(!log.events.back().arrival && log.events.back().device == &device);
    link.close();

    // Plugged back in, it answers again with the flash it kept.
    RawLink again(hardware.plugIn(tree()));
    EXPECT_EQ(again.read(0x0200, 2), (std::vector<uint8_t>{0x11, 0x22}));
}

TEST_F(FaultTest, StalledRequestsAndCorruptedReadsLeaveTheFlashAlone)
{
    sim::EmulatedDeviceOptions options;
    options.memory = {{0x0200, {0x10, 0x20, 0x30, 0x40}}};
    options.faults.stallRequests = {2};
    options.faults.stallKinds = {sim::RequestKind::Erase};
    options.faults.readCorruptions = {{0x0201, 0x0F, std::nullopt}, {0x0203, 0, uint8_t{0x99}}};
    sim::LoaderModeDevice& device = sim::plugInLoaderDevice(options);
    RawLink link(device);

    EXPECT_EQ(link.read(0x0200, 4), (std::vector<uint8_t>{0x10, 0x2F, 0x30, 0x99}));
    tStatus second = 0;
    link.read(0x0200, 4, &second);
    EXPECT_EQ(second, sim::kHostTransferStalled);
    EXPECT_EQ(link.erase(1), sim::kHostTransferStalled);
    EXPECT_EQ(link.read(0x0202, 1), std::vector<uint8_t>{0x30});  // outside the corrupted cells
    EXPECT_EQ(device.hardware().readMemory(0x0200, 4), (std::vector<uint8_t>{0x10, 0x20, 0x30, 0x40}));
}

TEST_F(FaultTest, RefusedStreamOrBufferLeavesNothingBehind)
{
    for (bool refuseOpen : {true, false}) {
        SCOPED_TRACE(refuseOpen ? "open refused" : "buffer refused");
        sim::EmulatedDeviceOptions options;
        options.faults.refuseOpenStream = refuseOpen;
        options.faults.refuseAllocateBuffer = !refuseOpen;
        sim::LoaderModeDevice& device = sim::plugInLoaderDevice(options);
        RawLink link(device);
        EXPECT_LT(link.openStatus, 0);
        EXPECT_EQ(link.buffer, nullptr);
        EXPECT_EQ(link.stream == nullptr, refuseOpen);
        EXPECT_EQ(host().allocator.liveBlocks(), 0u);
    }
}

TEST_F(FaultTest, StreamClosedWithItsBufferLeavesTheBufferCounted)
{
    sim::LoaderModeDevice& device = sim::plugInLoaderDevice();
    RawLink link(device);
    tStatus status = 0;
    device.closeStream(link.stream, status);
    link.stream = nullptr;
    link.buffer = nullptr;
    EXPECT_EQ(leftovers(), std::vector<std::string>{"1 host allocation(s) live (512 bytes)"});
    host().reset();  // the leak was the point; start the check at the end clean
}

TEST_F(FaultTest, OpenStreamChecksItsParameter)
{
    sim::LoaderModeDevice& device = sim::plugInLoaderDevice();
    nQVKORD100::tControlStreamParameterUSB parameter;
    parameter.first = 3;
    parameter.second = 1;
    tStatus status = 0;
    EXPECT_EQ(device.openStream(&parameter, status), nullptr);
    EXPECT_EQ(status, sim::kHostBadArgument);
    EXPECT_EQ(host().misuse.size(), 1u);
    host().misuse.clear();
}

TEST_F(FaultTest, TimingModelChargesPacketsEraseAndProgramming)
{
    for (const sim::TimingModel& model : {sim::TimingModel::fullSpeed(), sim::TimingModel::highSpeed()}) {
        sim::EmulatedDeviceOptions options;
        options.timing = model;
        sim::LoaderModeDevice& device = sim::plugInLoaderDevice(options);
        sim::PhysicalDevice& hardware = device.hardware();
        RawLink link(device);
        link.erase(1);
        EXPECT_EQ(hardware.elapsed, model.requestOverhead + model.pageErase);
        link.write(0x0200, std::vector<uint8_t>(512, 0));
        auto afterWrite =
            model.requestOverhead * 2 + model.pageErase + model.perPacket * 8 + model.programPerByte * 512;
        EXPECT_EQ(hardware.elapsed, afterWrite);
        link.read(0x0200, 65);  // stalled: the setup stage only
        EXPECT_EQ(hardware.elapsed, afterWrite + model.requestOverhead);
        EXPECT_EQ(hardware.trace.back().finishedAt, hardware.elapsed);
    }
    EXPECT_LT(sim::TimingModel::highSpeed().duration(64, false, 0),
              sim::TimingModel::fullSpeed().duration(64, false, 0));
}
