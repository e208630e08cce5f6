#include <utility>

#include "sim/device/enumeratedDevice.h"
#include "source/LoaderChannel.h"
#include "source/statusCodes.h"
#include "tests/support/WorldTest.h"

using testing_support::WorldTest;

namespace {

using Chunk = std::pair<uint16_t, uint32_t>;  // wIndex, length

// Every byte differs from its neighbours, so a misplaced chunk shows.
std::vector<uint8_t> patternedMemory()
{
    std::vector<uint8_t> bytes(0x10000);
    for (size_t i = 0; i < bytes.size(); ++i) bytes[i] = static_cast<uint8_t>(i * 7 + (i >> 8));
    return bytes;
}

}  // namespace

class LoaderChannelTest : public WorldTest {
protected:
    sim::LoaderModeDevice& plugIn(uint16_t loaderProductId = 0x4A10, sim::DeviceFaults faults = {})
    {
        sim::EmulatedDeviceOptions options;
        options.loaderProductId = loaderProductId;
        options.memory = {{0x0000, patternedMemory()}};
        options.faults = std::move(faults);
        return sim::plugInLoaderDevice(options);
    }

    static void expectSetup(const sim::RequestRecord& record, uint8_t type, uint8_t request, uint16_t value,
                            uint16_t index, uint32_t length)
    {
        EXPECT_EQ(record.bmRequestType, type);
        EXPECT_EQ(record.bRequest, request);
        EXPECT_EQ(record.wValue, value);
        EXPECT_EQ(record.wIndex, index);
        EXPECT_EQ(record.length, length);
        EXPECT_EQ(record.dataPointerGiven, length != 0);
        EXPECT_EQ(record.outcome, 0);
    }
};

TEST_F(LoaderChannelTest, ReadsGoInChunksOfAtMost64Bytes)
{
    struct Case {
        uint16_t address;
        uint32_t count;
        std::vector<Chunk> chunks;
    };
    const Case cases[] = {
        {0x37F8, 1, {{0x37F8, 1}}},
        {0x37F8, 2, {{0x37F8, 2}}},
        {0x37F0, 16, {{0x37F0, 16}}},
        {0x0200, 64, {{0x0200, 64}}},
        {0x0200, 65, {{0x0200, 64}, {0x0240, 1}}},
        {0x0400, 100, {{0x0400, 64}, {0x0440, 36}}},
        {0x0200, 512, {{0x0200, 64}, {0x0240, 64}, {0x0280, 64}, {0x02C0, 64},
                       {0x0300, 64}, {0x0340, 64}, {0x0380, 64}, {0x03C0, 64}}},
        {0xFFF0, 100, {{0xFFF0, 64}, {0x0030, 36}}},  // the address wraps, within a chunk and between chunks
    };
    sim::LoaderModeDevice& device = plugIn();
    sim::PhysicalDevice& hardware = device.hardware();
    for (const Case& c : cases) {
        for (bool toNull : {false, true}) {
            SCOPED_TRACE(testing::Message() << c.count << " bytes at " << c.address << (toNull ? " to null" : ""));
            hardware.trace.clear();
            tStatus status = 0;
            LoaderChannel channel;
            openLoaderChannel(channel, &device, 0x4A10, status);
            std::vector<uint8_t> destination(c.count, 0xEE);
            readLoaderMemory(channel, c.address, toNull ? nullptr : destination.data(), c.count, status);
            closeLoaderChannel(channel);

            EXPECT_EQ(status, 0);
            ASSERT_EQ(hardware.trace.size(), c.chunks.size());
            for (size_t i = 0; i < c.chunks.size(); ++i)
                expectSetup(hardware.trace[i], 0xC0, 0xB0, 0, c.chunks[i].first, c.chunks[i].second);
            if (!toNull) {
                EXPECT_EQ(destination, hardware.readMemory(c.address, c.count));
            }
        }
    }
}

TEST_F(LoaderChannelTest, WriteEraseAndRestartSendTheLoadersSetupValues)
{
    sim::LoaderModeDevice& device = plugIn();
    sim::PhysicalDevice& hardware = device.hardware();
    tStatus status = 0;
    LoaderChannel channel;
    openLoaderChannel(channel, &device, 0x4A10, status);
    std::vector<uint8_t> block(512);
    for (size_t i = 0; i < block.size(); ++i) block[i] = static_cast<uint8_t>(0xC3 ^ i);

    eraseLoaderPage(channel, 5, status);
    writeLoaderMemory(channel, 0x0A00, block.data(), 512, status);
    writeLoaderMemory(channel, 0x0206, "\xAA\x55", 2, status);
    restartLoader(channel, status);
    closeLoaderChannel(channel);

    EXPECT_EQ(status, 0);
    ASSERT_EQ(hardware.trace.size(), 4u);
    expectSetup(hardware.trace[0], 0x40, 0xB9, 5, 0, 0);
    expectSetup(hardware.trace[1], 0x40, 0xB0, 0, 0x0A00, 512);
    expectSetup(hardware.trace[2], 0x40, 0xB0, 0, 0x0206, 2);
    expectSetup(hardware.trace[3], 0x40, 0xBA, 0, 0, 0);
    EXPECT_EQ(hardware.trace[1].data, block);
    EXPECT_EQ(hardware.readMemory(0x0A00, 512), block);  // erased first, so it reads back whole
}

TEST_F(LoaderChannelTest, EachLoaderProductIdHasItsFlashMap)
{
    struct Case {
        uint16_t loaderProductId;
        uint16_t firmwareBase;
        uint16_t identityPage;
        uint16_t firstImagePage;
    };
    for (const Case& c : {Case{0x4A10, 0x0200, 0x3600, 1}, Case{0x4A20, 0x0600, 0x7C00, 3}}) {
        SCOPED_TRACE(c.loaderProductId);
        sim::LoaderModeDevice& device = plugIn(c.loaderProductId);
        tStatus status = 0;
        LoaderChannel channel;
        openLoaderChannel(channel, &device, c.loaderProductId, status);
        EXPECT_EQ(channel.firmwareBase, c.firmwareBase);
        EXPECT_EQ(channel.identityPage, c.identityPage);
        eraseLoaderPage(channel, static_cast<uint16_t>(channel.firmwareBase >> 9), status);
        closeLoaderChannel(channel);

        EXPECT_EQ(status, 0);
        expectSetup(device.hardware().trace.at(0), 0x40, 0xB9, c.firstImagePage, 0, 0);
        EXPECT_EQ(device.hardware().readMemory(c.firmwareBase, 512), std::vector<uint8_t>(512, 0xFF));
    }
}

TEST_F(LoaderChannelTest, ProductIdWithoutAFlashMapOpensNothing)
{
    sim::LoaderModeDevice& device = plugIn();
    for (uint16_t productId : {0x0000, 0x4A11, 0x4A30, 0x4B01, 0xFFFF}) {
        SCOPED_TRACE(productId);
        tStatus status = 0;
        LoaderChannel channel;
        openLoaderChannel(channel, &device, productId, status);
        EXPECT_EQ(status, kStatusMissingOrMalformed);
        EXPECT_EQ(channel.stream, nullptr);
        EXPECT_EQ(channel.transferBuffer, nullptr);
        closeLoaderChannel(channel);
    }
    EXPECT_EQ(device.openStreamCalls, 0);
    EXPECT_EQ(device.closeStreamCalls, 0);
    EXPECT_EQ(host().allocator.totalAllocations(), 0u);
}

TEST_F(LoaderChannelTest, NegativeStatusOnEntryDoesNothing)
{
    sim::LoaderModeDevice& device = plugIn();
    tStatus status = -7;
    LoaderChannel refused;
    openLoaderChannel(refused, &device, 0x4A10, status);
    EXPECT_EQ(refused.stream, nullptr);
    closeLoaderChannel(refused);

    tStatus good = 0;
    LoaderChannel channel;
    openLoaderChannel(channel, &device, 0x4A10, good);
    uint8_t bytes[4] = {};
    readLoaderMemory(channel, 0x0200, bytes, 4, status);
    writeLoaderMemory(channel, 0x0200, bytes, 4, status);
    eraseLoaderPage(channel, 1, status);
    restartLoader(channel, status);
    closeLoaderChannel(channel);

    EXPECT_EQ(status, -7);
    EXPECT_EQ(device.openStreamCalls, 1);
    EXPECT_EQ(device.hardware().requestCount(), 0u);
}

TEST_F(LoaderChannelTest, FailedOpenMakesNoRequestAndCloseCleansUp)
{
    struct Case {
        const char* what;
        bool refuseStream;
        bool refuseBuffer;
        bool failAllocation;
        tStatus expected;
    };
    const Case cases[] = {
        {"stream refused", true, false, false, sim::kHostFailure},
        {"buffer refused", false, true, false, sim::kHostAllocationFailed},
        {"allocator out of memory", false, false, true, sim::kHostAllocationFailed},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        sim::DeviceFaults faults;
        faults.refuseOpenStream = c.refuseStream;
        faults.refuseAllocateBuffer = c.refuseBuffer;
        sim::LoaderModeDevice& device = plugIn(0x4A10, faults);
        if (c.failAllocation) host().allocator.failNth(1);
        tStatus status = 0;
        LoaderChannel channel;
        openLoaderChannel(channel, &device, 0x4A10, status);
        EXPECT_EQ(status, c.expected);
        EXPECT_EQ(channel.transferBuffer, nullptr);
        readLoaderMemory(channel, 0x0200, nullptr, 4, status);
        eraseLoaderPage(channel, 1, status);
        closeLoaderChannel(channel);

        EXPECT_EQ(status, c.expected);
        EXPECT_EQ(device.hardware().requestCount(), 0u);
        EXPECT_EQ(leftovers(), std::vector<std::string>{});
        host().allocator.clearFaults();
    }
}

// An update's worth of requests: erase, a 512-byte write, its eight reads back, the restart.
TEST_F(LoaderChannelTest, AnyFailedRequestEndsTheRequestsAndCloseStillCleansUp)
{
    constexpr uint64_t kRequests = 11;
    for (bool unplug : {false, true}) {
        for (uint64_t failing = 0; failing <= kRequests; ++failing) {
            SCOPED_TRACE(testing::Message() << (unplug ? "unplugged at " : "stall at ") << failing);
            sim::DeviceFaults faults;
            if (failing != 0 && unplug) faults.unplugAtRequest = failing;
            if (failing != 0 && !unplug) faults.stallRequests = {failing};
            sim::LoaderModeDevice& device = plugIn(0x4A10, faults);
            tStatus status = 0;
            LoaderChannel channel;
            openLoaderChannel(channel, &device, 0x4A10, status);
            std::vector<uint8_t> block(512, 0x5A), back(512);
            eraseLoaderPage(channel, 1, status);
            writeLoaderMemory(channel, 0x0200, block.data(), 512, status);
            readLoaderMemory(channel, 0x0200, back.data(), 512, status);
            restartLoader(channel, status);
            tStatus afterRequests = status;
            closeLoaderChannel(channel);

            tStatus expected = failing == 0 ? 0 : unplug ? sim::kHostDeviceGone : sim::kHostTransferStalled;
            EXPECT_EQ(status, expected);
            EXPECT_EQ(status, afterRequests);
            EXPECT_EQ(device.hardware().requestCount(), failing == 0 ? kRequests : failing);
            EXPECT_EQ(device.gone(), failing == 0 || unplug);  // a restart that went through, or pulled out
            EXPECT_EQ(leftovers(), std::vector<std::string>{});
        }
    }
}
