// The Windows engine's messages: what one side writes the other reads back,
// a short or overfull message is caught rather than read or written past, and
// a log line's arguments sent over print as the same line.
#include <gtest/gtest.h>

#include <cstdarg>
#include <functional>
#include <string>
#include <vector>

#include "driver/wineHost/bridgeWire.h"
#include "morvanek-lab/lib/wireArguments.h"

namespace {

std::vector<uint8_t> sample()
{
    std::vector<uint8_t> buffer(256);
    bridge::Writer out(buffer.data(), static_cast<uint32_t>(buffer.size()));
    out.u32(0xC000026Cu);
    out.u64(0x0123456789ABCDEFull);
    out.text("morvanek");
    out.text(nullptr);
    out.text("");
    const uint16_t path[] = {'C', ':', '\\', 0x00E9, 0};
    out.text16(path);
    const uint8_t guid[4] = {0x92, 0x7A, 0x4C, 0x1F};
    out.bytes(guid, sizeof(guid));
    buffer.resize(out.size());
    return buffer;
}

TEST(BridgeWire, ReadsBackWhatWasWritten)
{
    const std::vector<uint8_t> message = sample();
    bridge::Reader in(message.data(), static_cast<uint32_t>(message.size()));
    EXPECT_EQ(in.u32(), 0xC000026Cu);
    EXPECT_EQ(in.u64(), 0x0123456789ABCDEFull);
    const uint8_t* start = nullptr;
    ASSERT_EQ(in.span(&start), 8u);
    EXPECT_EQ(std::string(reinterpret_cast<const char*>(start), 8), "morvanek");
    EXPECT_EQ(in.span(&start), bridge::kNullText) << "null and empty must stay apart";
    EXPECT_EQ(start, nullptr);
    EXPECT_EQ(in.span(&start), 0u);
    EXPECT_NE(start, nullptr);
    ASSERT_EQ(in.span(&start, 2), 4u);
    EXPECT_EQ(start[6] | start[7] << 8, 0x00E9);
    uint8_t guid[2] = {};
    EXPECT_EQ(in.bytes(guid, sizeof(guid)), 4u) << "the full length, though only two bytes fit";
    EXPECT_EQ(guid[1], 0x7A);
    EXPECT_FALSE(in.broken());
}

TEST(BridgeWire, AMessageCutAnywhereReadsAsZerosAndSaysSo)
{
    const std::vector<uint8_t> message = sample();
    for (size_t cut = 0; cut < message.size(); ++cut) {
        SCOPED_TRACE("cut after " + std::to_string(cut) + " bytes");
        // Only the cut part is allocated, so a read past it shows under the sanitizers.
        std::vector<uint8_t> part(message.begin(), message.begin() + static_cast<std::ptrdiff_t>(cut));
        bridge::Reader in(part.data(), static_cast<uint32_t>(part.size()));
        in.u32();
        in.u64();
        const uint8_t* start = nullptr;
        for (int text = 0; text < 3; ++text) in.span(&start);
        in.span(&start, 2);
        uint8_t guid[4];
        in.bytes(guid, sizeof(guid));
        EXPECT_TRUE(in.broken());
        EXPECT_EQ(in.u32(), 0u);
    }
}

TEST(BridgeWire, AFullWriterStopsAndSaysSo)
{
    uint8_t buffer[10] = {};
    bridge::Writer out(buffer, 8);
    out.u32(1);
    out.text("too long for the rest");
    EXPECT_TRUE(out.overflowed());
    EXPECT_LE(out.size(), 8u);
    EXPECT_EQ(buffer[8], 0) << "nothing written past the capacity";
}

std::string viaVaList(const char* format, ...)
{
    va_list arguments;
    va_start(arguments, format);
    std::string line = sim::formatHostMessage(format, arguments);
    va_end(arguments);
    return line;
}

void tagged(bridge::Writer& out, hostformat::Argument kind, uint64_t value)
{
    out.u32(static_cast<uint32_t>(kind));
    out.u64(value);
}

struct WireCase {
    const char* name;
    const char* format;
    std::function<void(bridge::Writer&)> send;  // as the Windows-side host sends the arguments
    std::string expected;                         // as the stand-in prints them from its own va_list
};

TEST(BridgeWire, ArgumentsSentOverPrintAsTheStandInPrintsThem)
{
    using hostformat::Argument;
    const std::u16string path = u"C:\\WINDOWS\\system32\\drivers\\QVUSB4B01.bin";
    const WireCase cases[] = {
        {"signed and unsigned", "ssMain(%d) failed with status %d, %u left", [](bridge::Writer& out) {
             tagged(out, Argument::signedInt, 0);
             tagged(out, Argument::signedInt, static_cast<uint64_t>(-50150LL));
             tagged(out, Argument::unsignedInt, 7);
         },
         viaVaList("ssMain(%d) failed with status %d, %u left", 0, -50150, 7u)},
        {"device name", "device %04X %04X %08X", [](bridge::Writer& out) {
             tagged(out, Argument::unsignedInt, 0x5C1D);
             tagged(out, Argument::unsignedInt, 0x4B01);
             tagged(out, Argument::unsignedInt, 0x1E240);
         },
         viaVaList("device %04X %04X %08X", 0x5C1Du, 0x4B01u, 0x1E240u)},
        {"texts of both widths", "'%s' from %S", [&](bridge::Writer& out) {
             out.u32(static_cast<uint32_t>(Argument::text));
             out.text("smoke");
             out.u32(static_cast<uint32_t>(Argument::text16));
             out.text16(reinterpret_cast<const uint16_t*>(path.c_str()));
         },
         viaVaList("'%s' from %S", "smoke", path.c_str())},
        {"null texts", "%s %S", [](bridge::Writer& out) {
             out.u32(static_cast<uint32_t>(Argument::text));
             out.text(nullptr);
             out.u32(static_cast<uint32_t>(Argument::text16));
             out.text16(nullptr);
         },
         viaVaList("%s %S", static_cast<const char*>(nullptr), static_cast<const char16_t*>(nullptr))},
        {"long and long long", "%ld %lld %c", [](bridge::Writer& out) {
             tagged(out, Argument::signedLong, static_cast<uint64_t>(-100000LL));
             tagged(out, Argument::signedLongLong, 0x123456789ull);
             tagged(out, Argument::character, 'k');
         },
         viaVaList("%ld %lld %c", -100000L, 0x123456789LL, 'k')},
        {"no arguments", "100%% done, %q as written", [](bridge::Writer&) {}, "100% done, %q as written"},
    };
    for (const WireCase& c : cases) {
        SCOPED_TRACE(c.name);
        std::vector<uint8_t> buffer(1024);
        bridge::Writer out(buffer.data(), static_cast<uint32_t>(buffer.size()));
        c.send(out);
        bridge::Reader in(buffer.data(), out.size());
        lab::WireArguments arguments(in);
        EXPECT_EQ(sim::formatHostMessage(c.format, arguments), c.expected);
        EXPECT_FALSE(arguments.broken());
    }
}

TEST(BridgeWire, AnArgumentOfAnotherKindStopsTheRestInsteadOfMisreadingIt)
{
    std::vector<uint8_t> buffer(64);
    bridge::Writer out(buffer.data(), static_cast<uint32_t>(buffer.size()));
    out.u32(static_cast<uint32_t>(hostformat::Argument::text));
    out.text("not a number");
    tagged(out, hostformat::Argument::signedInt, 5);
    bridge::Reader in(buffer.data(), out.size());
    lab::WireArguments arguments(in);
    EXPECT_EQ(sim::formatHostMessage("%d then %d", arguments), "0 then 0");
    EXPECT_TRUE(arguments.broken());
}

}  // namespace
