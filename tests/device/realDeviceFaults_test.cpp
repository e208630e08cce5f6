// Faults a real device has: a request that takes effect but loses its status
// stage, bits that do not program, an erase that does nothing, and releases
// the host reports as failed although they happened.
#include <functional>
#include <ostream>
#include <string>

#include "deviceHarness.h"

using namespace device_tests;

namespace {

// Each request of the loader, its status stage lost: it reports failure, and
// the flash (or the device's mode) shows it was carried out all the same.
struct LostStatusCase {
    const char* name;
    std::function<tStatus(RawLink&)> send;
    std::function<void(sim::PhysicalDevice&)> check;
};

void PrintTo(const LostStatusCase& c, std::ostream* out)
{
    *out << c.name;
}

class LostStatus : public DeviceTest, public testing::WithParamInterface<LostStatusCase> {};

TEST_P(LostStatus, TheRequestTookEffectButReportsFailure)
{
    sim::EmulatedDeviceOptions options;
    options.memory = {{0x0206, {0xAA, 0x55}}, {0x0400, {0x00, 0x00}}};
    options.faults.lostStatus = {1};
    sim::LoaderModeDevice& device = sim::plugInLoaderDevice(options);
    sim::PhysicalDevice& hardware = device.hardware();
    RawLink link(device);

    EXPECT_EQ(GetParam().send(link), sim::kHostTransferStalled);
    GetParam().check(hardware);
    ASSERT_EQ(hardware.trace.size(), 1u);
    EXPECT_LT(hardware.trace[0].outcome, 0);
    ASSERT_EQ(hardware.notes.size(), 1u);
    EXPECT_NE(hardware.notes[0].find("status stage was lost"), std::string::npos);
}

const LostStatusCase kLostStatus[] = {
    {"Write", [](RawLink& link) { return link.write(0x0300, {0x12, 0x34}); },
     [](sim::PhysicalDevice& hardware) {
         EXPECT_EQ(hardware.readMemory(0x0300, 2), (std::vector<uint8_t>{0x12, 0x34}));
     }},
    {"Erase", [](RawLink& link) { return link.erase(2); },
     [](sim::PhysicalDevice& hardware) {
         EXPECT_EQ(hardware.readMemory(0x0400, 2), (std::vector<uint8_t>{0xFF, 0xFF}));
     }},
    {"Restart", [](RawLink& link) { return link.restart(); },
     [](sim::PhysicalDevice& hardware) {
         // The marker was in place: the device left loader mode and runs its firmware.
         EXPECT_NE(dynamic_cast<sim::ProductDevice*>(hardware.current()), nullptr);
     }},
};

INSTANTIATE_TEST_SUITE_P(EachRequest, LostStatus, testing::ValuesIn(kLostStatus),
                         [](const testing::TestParamInfo<LostStatusCase>& info) { return std::string(info.param.name); });

TEST_F(DeviceTest, StuckBitsKeepTheirValueWhenWrittenAndAreZeroAfterAnErase)
{
    sim::EmulatedDeviceOptions options;
    options.memory = {{0x0400, {0xF0}}};
    options.faults.stuckBits = {{0x0400, 0x81}, {0x0500, 0x01}};
    sim::LoaderModeDevice& device = sim::plugInLoaderDevice(options);
    sim::PhysicalDevice& hardware = device.hardware();
    RawLink link(device);

    // 0xF0 written with 0x0F: bit 7 is stuck at its 1, bit 0 at its 0.
    ASSERT_EQ(link.write(0x0400, {0x0F}), 0);
    EXPECT_EQ(hardware.flash.at(0x0400), 0x80);
    ASSERT_EQ(link.erase(2), 0);
    EXPECT_EQ(hardware.flash.at(0x0400), 0x7E);
    EXPECT_EQ(hardware.flash.at(0x0500), 0xFE);
    EXPECT_EQ(hardware.flash.at(0x0401), 0xFF);
    ASSERT_EQ(link.write(0x0500, {0x5B}), 0);
    EXPECT_EQ(link.read(0x0500, 1), std::vector<uint8_t>{0x5A});
}

TEST_F(DeviceTest, ADeadEraseReportsSuccessAndLeavesThePageAsItWas)
{
    sim::EmulatedDeviceOptions options;
    options.memory = {{0x0400, {0x12, 0x34}}, {0x0600, {0x56}}};
    options.faults.deadErases = {2};
    sim::LoaderModeDevice& device = sim::plugInLoaderDevice(options);
    sim::PhysicalDevice& hardware = device.hardware();
    RawLink link(device);

    EXPECT_EQ(link.erase(2), 0);
    EXPECT_EQ(link.erase(3), 0);
    EXPECT_EQ(hardware.readMemory(0x0400, 2), (std::vector<uint8_t>{0x12, 0x34}));
    EXPECT_EQ(hardware.flash.at(0x0600), 0xFF);
}

// A release the host reports as failed has still happened: nothing is left.
TEST_F(DeviceTest, FailedReleasesStillRelease)
{
    sim::EmulatedDeviceOptions options;
    options.faults.failFreeBuffer = sim::kHostFailure;
    options.faults.failCloseStream = sim::kHostBadArgument;
    sim::LoaderModeDevice& device = sim::plugInLoaderDevice(options);
    RawLink link(device);
    ASSERT_NE(link.buffer, nullptr);

    tStatus freed = 0;
    link.stream->freeBuffer(link.buffer, freed);
    tStatus closed = 0;
    device.closeStream(link.stream, closed);
    link.buffer = nullptr;
    link.stream = nullptr;
    EXPECT_EQ(freed, sim::kHostFailure);
    EXPECT_EQ(closed, sim::kHostBadArgument);
    EXPECT_EQ(sim::Host::get().allocator.liveBlocks(), 0u);
    EXPECT_EQ(device.openStreams(), 0u);
    EXPECT_TRUE(sim::Host::get().misuse.empty());
}

TEST_F(DeviceTest, ANamedTransferBufferAllocationFailsAndTheHostNamesWhatEachAllocationWasFor)
{
    sim::EmulatedDeviceOptions options;
    options.name = "bench";
    options.faults.failTransferBuffers = {2};
    sim::LoaderModeDevice& device = sim::plugInLoaderDevice(options);
    {
        RawLink first(device);
        EXPECT_NE(first.buffer, nullptr);
    }
    RawLink second(device);
    EXPECT_EQ(second.buffer, nullptr);
    EXPECT_EQ(second.openStatus, sim::kHostAllocationFailed);
    RawLink third(device);
    EXPECT_NE(third.buffer, nullptr);
    // The second never reached the allocator.
    EXPECT_EQ(sim::Host::get().allocator.attempts(),
              (std::vector<std::string>{"the transfer buffer of bench", "the transfer buffer of bench"}));
}

}  // namespace
