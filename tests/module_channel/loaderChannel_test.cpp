// The loader channel against an emulated loader-mode device: the setup values
// of its requests, how reads are split, and how failures end the requests.
#include <algorithm>
#include <utility>

#include "sim/device/enumeratedDevice.h"
#include "source/loaderChannel.h"
#include "source/statusCodes.h"
#include "tests/support/worldTest.h"

namespace {

using Chunk = std::pair<uint16_t, uint32_t>;  // wIndex, length

class LoaderChannelTest : public testing_support::WorldTest {
protected:
    // A device whose every byte differs from its neighbours, so a misplaced chunk shows.
    sim::LoaderModeDevice& plugIn(uint16_t loaderProductId = 0x4A10, sim::DeviceFaults faults = {})
    {
        sim::EmulatedDeviceOptions options;
        options.loaderProductId = loaderProductId;
        options.memory = {{0x0000, std::vector<uint8_t>(0x10000)}};
        for (size_t i = 0; i < 0x10000; ++i) options.memory[0].bytes[i] = static_cast<uint8_t>(i * 7 + (i >> 8));
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

}  // namespace

TEST_F(LoaderChannelTest, ReadsGoInChunksOfAtMost64Bytes)
{
    struct Case {
        uint16_t address;
        uint32_t count;
        std::vector<Chunk> chunks;
    };
    const Case cases[] = {
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

// Each loader product ID's flash map; the erase names the firmware's first page.
TEST_F(LoaderChannelTest, EraseWriteAndRestartOnEachFlashMap)
{
    struct Case {
        uint16_t loaderProductId;
        uint16_t firmwareBase;
        uint16_t identityPage;
        uint16_t firstImagePage;
    };
    std::vector<uint8_t> block(512);
    for (size_t i = 0; i < block.size(); ++i) block[i] = static_cast<uint8_t>(0xC3 ^ i);
    for (const Case& c : {Case{0x4A10, 0x0200, 0x3600, 1}, Case{0x4A20, 0x0600, 0x7C00, 3}}) {
        SCOPED_TRACE(c.loaderProductId);
        sim::LoaderModeDevice& device = plugIn(c.loaderProductId);
        sim::PhysicalDevice& hardware = device.hardware();
        tStatus status = 0;
        LoaderChannel channel;
        openLoaderChannel(channel, &device, c.loaderProductId, status);
        EXPECT_EQ(channel.firmwareBase, c.firmwareBase);
        EXPECT_EQ(channel.identityPage, c.identityPage);
        eraseLoaderPage(channel, static_cast<uint16_t>(channel.firmwareBase >> 9), status);
        writeLoaderMemory(channel, c.firmwareBase, block.data(), 512, status);
        restartLoader(channel, status);
        closeLoaderChannel(channel);

        EXPECT_EQ(status, 0);
        ASSERT_EQ(hardware.trace.size(), 3u);
        expectSetup(hardware.trace[0], 0x40, 0xB9, c.firstImagePage, 0, 0);
        expectSetup(hardware.trace[1], 0x40, 0xB0, 0, c.firmwareBase, 512);
        expectSetup(hardware.trace[2], 0x40, 0xBA, 0, 0, 0);
        EXPECT_EQ(hardware.trace[1].data, block);
        EXPECT_EQ(hardware.readMemory(c.firmwareBase, 512), block);  // erased first, so it reads back whole
    }
}

TEST_F(LoaderChannelTest, NegativeStatusOnEntryDoesNothing)
{
    sim::LoaderModeDevice& device = plugIn();
    tStatus status = -7, good = 0;
    LoaderChannel refused, channel;
    openLoaderChannel(refused, &device, 0x4A10, status);
    EXPECT_EQ(refused.stream, nullptr);
    openLoaderChannel(channel, &device, 0x4A10, good);
    uint8_t bytes[4] = {};
    readLoaderMemory(channel, 0x0200, bytes, 4, status);
    writeLoaderMemory(channel, 0x0200, bytes, 4, status);
    eraseLoaderPage(channel, 1, status);
    restartLoader(channel, status);
    closeLoaderChannel(channel);
    closeLoaderChannel(refused);

    EXPECT_EQ(status, -7);
    EXPECT_EQ(device.openStreamCalls, 1);
    EXPECT_EQ(device.hardware().requestCount(), 0u);
}

// A failed open (a product ID without a flash map, the stream, its buffer, or the
// allocator), or any failed request of an update's worth (erase, a 512-byte write,
// its eight reads back, the restart): nothing is sent after it, the first failure
// stands, and close leaves nothing behind.
TEST_F(LoaderChannelTest, FailuresEndTheRequestsAndCloseCleansUp)
{
    struct Case {
        const char* what;
        sim::DeviceFaults faults;
        bool failAllocation;
        uint16_t loaderProductId;
        tStatus status;
        uint64_t requests;
    };
    std::vector<Case> cases = {{"no failure", {}, false, 0x4A10, 0, 11},
                               {"stream refused", {}, false, 0x4A10, sim::kHostFailure, 0},
                               {"buffer refused", {}, false, 0x4A10, sim::kHostAllocationFailed, 0},
                               {"allocator out of memory", {}, true, 0x4A10, sim::kHostAllocationFailed, 0},
                               {"product 0x4A11 unmapped", {}, false, 0x4A11, kStatusMissingOrMalformed, 0}};
    cases[1].faults.refuseOpenStream = true;
    cases[2].faults.refuseAllocateBuffer = true;
    for (uint64_t failing = 1; failing <= 11; ++failing) {
        cases.push_back({"stalled", {}, false, 0x4A10, sim::kHostTransferStalled, failing});
        cases.back().faults.stallRequests = {failing};
        cases.push_back({"unplugged", {}, false, 0x4A10, sim::kHostDeviceGone, failing});
        cases.back().faults.unplugAtRequest = failing;
    }
    for (const Case& c : cases) {
        SCOPED_TRACE(testing::Message() << c.what << " " << c.requests);
        sim::LoaderModeDevice& device = plugIn(0x4A10, c.faults);
        if (c.failAllocation) host().allocator.failNth(1);
        tStatus status = 0;
        LoaderChannel channel;
        openLoaderChannel(channel, &device, c.loaderProductId, status);
        std::vector<uint8_t> block(512, 0x5A), back(512);
        eraseLoaderPage(channel, 1, status);
        writeLoaderMemory(channel, 0x0200, block.data(), 512, status);
        readLoaderMemory(channel, 0x0200, back.data(), 512, status);
        restartLoader(channel, status);
        tStatus afterRequests = status;
        closeLoaderChannel(channel);

        EXPECT_EQ(status, c.status);
        EXPECT_EQ(status, afterRequests);
        EXPECT_EQ(device.hardware().requestCount(), c.requests);
        EXPECT_EQ(leftovers(), std::vector<std::string>{});
        host().allocator.clearFaults();
    }
}

// The write's data stage passes through the 512-byte transfer buffer: any
// other count is refused before a request is made.
TEST_F(LoaderChannelTest, WritesOfNoneOrMoreThan512BytesAreRefusedUnsent)
{
    sim::LoaderModeDevice& device = plugIn();
    std::vector<uint8_t> bytes(513, 0x11);
    for (uint32_t count : {0u, 513u, 0x10000u}) {
        SCOPED_TRACE(count);
        tStatus status = 0;
        LoaderChannel channel;
        openLoaderChannel(channel, &device, 0x4A10, status);
        writeLoaderMemory(channel, 0x0200, bytes.data(), count, status);
        closeLoaderChannel(channel);
        EXPECT_EQ(status, kStatusMissingOrMalformed);
    }
    EXPECT_EQ(device.hardware().requestCount(), 0u);
}

// The read-back makes the reads readLoaderMemory makes and names the first
// byte that differs, wherever it lies: in the first chunk, a later one, or
// only in what a short IN data stage did not deliver.
TEST_F(LoaderChannelTest, VerifyNamesTheFirstDifferenceOrWhatWasNotDelivered)
{
    struct Case {
        const char* what;
        int32_t changed;  // the expected byte made different; -1: none
        sim::ShortRead shortRead;
        int32_t difference;
    };
    const Case cases[] = {
        {"equal", -1, {}, -1},
        {"first byte", 0, {}, 0},
        {"third chunk", 133, {}, 133},
        {"last byte", 199, {}, 199},
        {"nothing delivered", -1, {1, 0}, 0},
        {"second chunk short", -1, {2, 35}, 64 + 35},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        sim::DeviceFaults faults;
        if (c.shortRead.read != 0) faults.shortReads = {c.shortRead};
        sim::LoaderModeDevice& device = plugIn(0x4A10, faults);
        std::vector<uint8_t> expected = device.hardware().readMemory(0x0400, 200);
        if (c.changed >= 0) expected[c.changed] ^= 0x01;
        tStatus status = 0;
        LoaderChannel channel;
        openLoaderChannel(channel, &device, 0x4A10, status);
        // The transfer buffer starts out holding the expected bytes, as it
        // does after the block's own write: that must not help the compare.
        std::copy(expected.begin(), expected.end(), channel.transferBuffer);
        EXPECT_EQ(verifyLoaderMemory(channel, 0x0400, expected.data(), 200, status), c.difference);
        closeLoaderChannel(channel);
        EXPECT_EQ(status, 0);
        ASSERT_EQ(device.hardware().trace.size(), 4u);
        for (uint32_t i = 0; i < 4; ++i)
            expectSetup(device.hardware().trace[i], 0xC0, 0xB0, 0, static_cast<uint16_t>(0x0400 + 64 * i),
                        i < 3 ? 64 : 8);
    }
}
