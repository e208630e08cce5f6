// The lab's end of the Windows engine, fed the messages karvelk.sys sends,
// without Wine: the module's records reach the stand-in's checks with their
// links intact, blocks keep their count, and a transfer carries the data stage
// into the emulated device's buffer and back.
#include <gtest/gtest.h>

#include <functional>
#include <vector>

#include "morvanek-lab/lib/bridgeServer.h"
#include "sim/device/enumeratedDevice.h"
#include "sim/kernel/simKernel.h"

namespace {

using Write = std::function<void(bridge::Writer&)>;

class BridgeServerTest : public testing::Test {
protected:
    void SetUp() override
    {
        sim::Host::get().reset();
        sim::kernel::reset();
    }
    void TearDown() override
    {
        sim::Host::get().reset();
        sim::kernel::reset();
    }

    // One host call as the Windows side sends it; the reply's reader.
    bridge::Reader call(uint32_t kind, const Write& write)
    {
        std::vector<uint8_t> message(4096);
        bridge::Writer out(message.data(), static_cast<uint32_t>(message.size()));
        write(out);
        bridge::Reader in(message.data(), out.size());
        reply_ = server_.serve(kind, in);
        return bridge::Reader(reply_.data(), static_cast<uint32_t>(reply_.size()));
    }

    std::vector<uint32_t> eventsToWindows;
    lab::BridgeServer server_{[this](uint32_t kind, const std::vector<uint8_t>&) {
                                  eventsToWindows.push_back(kind);
                                  return std::vector<uint8_t>(8, 0);
                              },
                              [](const std::string&) { return std::nullopt; }};
    std::vector<uint8_t> reply_;
};

// The module's records, written field by field as karvelk.sys reads them.
Write registration(bool bufferInRecord, bool nameIsDescriptors)
{
    return [=](bridge::Writer& out) {
        out.u64(0x1000);  // the record's address on the Windows side
        out.u32(0);       // status
        out.u32(1);       // a record is given
        out.u64(0x2000);  // its package record
        out.text("morvanek");
        out.u64(0x3000);  // module main
        out.text("");
        out.text("");
        out.u32(1);
        ModulePackageRecord package{};
        package.version = 1;
        package.registryPath.MaximumLength = 520;
        package.registryPath.Buffer = reinterpret_cast<WCHAR*>(0x4000);
        out.bytes(&package, sizeof(package));
        out.u32(bufferInRecord ? 1 : 0);
        out.u32(1);  // a descriptor
        out.u32(5);
        out.text("morvanek");
        const uint8_t guid[16] = {0x92, 0x7A, 0x4C, 0x1F};
        out.bytes(guid, sizeof(guid));
        out.u32(nameIsDescriptors ? 1 : 0);
    };
}

TEST_F(BridgeServerTest, TheStandInChecksTheRecordsWithTheirLinksAsTheModuleMadeThem)
{
    struct Case {
        const char* name;
        bool bufferInRecord;
        bool nameIsDescriptors;
        std::vector<std::string> problems;
    };
    const Case cases[] = {
        {"as the module makes them", true, true, {}},
        {"registry path outside the record", false, true, {"registry path not in the record"}},
        {"a copy of the name", true, false, {"module name is not the descriptor's"}},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        sim::Host::get().reset();
        bridge::Reader reply = call(bridge::kRegister, registration(c.bufferInRecord, c.nameIsDescriptors));
        EXPECT_EQ(static_cast<int32_t>(reply.u32()), 0);
        EXPECT_EQ(reply.u32(), 1u) << "registered";
        EXPECT_EQ(sim::Host::get().registrationProblems, c.problems);
    }
    // The host calls the module main through the mirrored record: it goes to Windows.
    sim::Host::get().callModuleMain(0);
    EXPECT_EQ(eventsToWindows, std::vector<uint32_t>{bridge::kModuleMain});
}

TEST_F(BridgeServerTest, BlocksAreCountedByTheStandInAndAForeignOneIsMisuse)
{
    bridge::Reader reply = call(bridge::kAllocate, [](bridge::Writer& out) {
        out.u64(24);
        out.u32(4);
        out.u32(0);
        out.u32(0);
    });
    const uint64_t block = reply.u64();
    ASSERT_NE(block, 0u);
    EXPECT_EQ(sim::Host::get().allocator.liveBlocks(), 1u);
    call(bridge::kRelease, [](bridge::Writer& out) {
        out.u64(0);  // not one of the lab's
        out.u64(0x7777);
    });
    EXPECT_EQ(sim::Host::get().misuse.size(), 1u);
    call(bridge::kRelease, [&](bridge::Writer& out) {
        out.u64(block);
        out.u64(0x5000);
    });
    EXPECT_EQ(sim::Host::get().allocator.liveBlocks(), 0u);
    sim::Host::get().misuse.clear();
}

TEST_F(BridgeServerTest, ATransferCarriesTheDataStageBothWays)
{
    sim::EmulatedDeviceOptions options;
    options.memory.push_back({0x0100, {0xDE, 0xAD, 0xBE, 0xEF}});
    sim::LoaderModeDevice& device = sim::plugInLoaderDevice(options);
    const uint64_t deviceId = reinterpret_cast<uintptr_t>(static_cast<sim::UsbDeviceSim*>(&device));
    bridge::Reader opened = call(bridge::kOpenStream, [&](bridge::Writer& out) {
        out.u64(deviceId);
        out.u32(1);
        out.u32(3);
        out.u32(0);
        out.u32(0);
    });
    const uint64_t stream = opened.u64();
    ASSERT_NE(stream, 0u);
    const uint64_t buffer = call(bridge::kAllocateBuffer, [&](bridge::Writer& out) {
                                out.u64(stream);
                                out.u32(512);
                                out.u32(0);
                            }).u64();
    ASSERT_NE(buffer, 0u);

    auto transfer = [&](uint8_t requestType, uint16_t address, uint64_t inBuffer, std::vector<uint8_t> data) {
        return call(bridge::kTransfer, [&](bridge::Writer& out) {
            out.u64(stream);
            out.u32(0);
            out.u32(1);
            out.u32(requestType);
            out.u32(0xB0);
            out.u32(0);
            out.u32(address);
            out.u32(static_cast<uint32_t>(data.size()));
            out.u32(1);
            out.u64(inBuffer);
            out.u32(0);
            out.bytes(data.data(), static_cast<uint32_t>(data.size()));
        });
    };
    // OUT: the module's bytes reach the flash.
    bridge::Reader written = transfer(0x40, 0x0200, buffer, {0x12, 0x34});
    EXPECT_EQ(static_cast<int32_t>(written.u32()), 0);
    EXPECT_EQ(device.hardware().readMemory(0x0200, 2), (std::vector<uint8_t>{0x12, 0x34}));
    // IN: the flash's bytes come back for the module's buffer.
    bridge::Reader read = transfer(0xC0, 0x0100, buffer, std::vector<uint8_t>(4, 0));
    EXPECT_EQ(static_cast<int32_t>(read.u32()), 0);
    uint8_t data[4] = {};
    EXPECT_EQ(read.bytes(data, sizeof(data)), 4u);
    EXPECT_EQ(std::vector<uint8_t>(data, data + 4), (std::vector<uint8_t>{0xDE, 0xAD, 0xBE, 0xEF}));
    // A data stage in none of the stream's buffers stalls, and is misuse.
    bridge::Reader stray = transfer(0xC0, 0x0100, 0, std::vector<uint8_t>(4, 0));
    EXPECT_LT(static_cast<int32_t>(stray.u32()), 0);
    EXPECT_EQ(sim::Host::get().misuse.size(), 1u);
    sim::Host::get().misuse.clear();
}

}  // namespace
