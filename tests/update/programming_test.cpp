// Updates that succeed, end to end through the device table: the requests in
// their order, the flash they leave, and the device coming back as the
// product, whether it was present when the module started or arrived later.
#include "UpdateWorld.h"

#include "sim/kernel/fileStatus.h"

namespace update_tests {
namespace {

using testing_support::makeImage;

struct ProgrammingCase {
    const char* name;
    uint16_t loaderProductId;
    uint32_t imageSize;
    std::vector<std::string> programming;  // between the identity reads and the marker
};

void PrintTo(const ProgrammingCase& c, std::ostream* out)
{
    *out << c.name;
}

uint16_t firmwareBase(uint16_t loaderProductId)
{
    return loaderProductId == 0x4A10 ? 0x0200 : 0x0600;
}

uint16_t identityPage(uint16_t loaderProductId)
{
    return loaderProductId == 0x4A10 ? 0x3600 : 0x7C00;
}

// Every page of the image erased first, then each block written and read back.
std::vector<std::string> wholeImage(uint16_t loaderProductId, uint32_t size)
{
    const uint16_t base = firmwareBase(loaderProductId);
    std::vector<std::string> lines;
    for (uint32_t page = base / 512; page <= (base + size - 1) / 512; ++page) {
        lines.push_back("erase " + std::to_string(page));
    }
    for (uint32_t offset = 0; offset < size; offset += 512) {
        lines = joined({lines, blockRequests(static_cast<uint16_t>(base + offset), std::min(512u, size - offset))});
    }
    return lines;
}

class Programming : public UpdateWorld {
protected:
    // Runs one update of an image of `size` bytes and checks what every successful update leaves.
    void expectInstalled(uint16_t loaderProductId, uint32_t size, Arrival arrival,
                         const std::vector<std::string>& programming)
    {
        const std::vector<uint8_t> image = makeImage(size);
        writeDefaultImage(kProductId, image);
        auto hardware = sim::makeEmulatedDevice(deviceWithIdentity(loaderProductId, kProductId));
        const uint16_t base = firmwareBase(loaderProductId);
        const std::vector<uint8_t> identityBefore = hardware->readMemory(identityPage(loaderProductId), 512);

        sim::LoaderModeDevice& loader = run(hardware, arrival);

        char marker[32];
        std::snprintf(marker, sizeof marker, "write 0x%04X 2", base + 6);
        EXPECT_EQ(requestLines(*hardware), joined({identityReads(loaderProductId), programming, {marker, "restart"}}));
        EXPECT_EQ(logLines(), std::vector<LogLine>{});
        std::vector<uint8_t> expected = image;
        expected[6] = 0xAA;
        expected[7] = 0x55;
        EXPECT_EQ(hardware->readMemory(base, size), expected);
        EXPECT_EQ(hardware->readMemory(identityPage(loaderProductId), 512), identityBefore);

        auto* product = dynamic_cast<sim::ProductDevice*>(hardware->current());
        ASSERT_NE(product, nullptr) << "the device did not come back as the product";
        EXPECT_EQ(product->getAttribute(1, nullptr), 0x5C1Du);
        EXPECT_EQ(product->getAttribute(2, nullptr), kProductId);
        EXPECT_EQ(loader.openStreamCalls, 1);
        EXPECT_EQ(loader.closeStreamCalls, 1);
        EXPECT_EQ(host().allocator.liveBlocks(), 4u) << "only the stop node, the table and its two records";
        EXPECT_EQ(sim::kernel::files().openFileCount(), 0u);
    }
};

class RequestSequence : public Programming,
                        public ::testing::WithParamInterface<std::tuple<ProgrammingCase, Arrival>> {};

TEST_P(RequestSequence, ErasesProgramsVerifiesMarksAndRestarts)
{
    const auto& [c, arrival] = GetParam();
    expectInstalled(c.loaderProductId, c.imageSize, arrival, c.programming);
}

const ProgrammingCase kProgrammingCases[] = {
    {"WholeAndPartialBlockOnTheSmallLoader", 0x4A10, 1000,
     {"erase 1", "erase 2",
      "write 0x0200 512", "read 0x0200 64", "read 0x0240 64", "read 0x0280 64", "read 0x02C0 64",
      "read 0x0300 64", "read 0x0340 64", "read 0x0380 64", "read 0x03C0 64",
      "write 0x0400 488", "read 0x0400 64", "read 0x0440 64", "read 0x0480 64", "read 0x04C0 64",
      "read 0x0500 64", "read 0x0540 64", "read 0x0580 64", "read 0x05C0 40"}},
    {"TwoWholeBlocksOnTheLargeLoader", 0x4A20, 1024,
     joined({{"erase 3", "erase 4"}, blockRequests(0x0600, 512), blockRequests(0x0800, 512)})},
    {"OnlyAPartialBlock", 0x4A10, 100, {"erase 1", "write 0x0200 100", "read 0x0200 64", "read 0x0240 36"}},
};

INSTANTIATE_TEST_SUITE_P(Images, RequestSequence,
                         ::testing::Combine(::testing::ValuesIn(kProgrammingCases),
                                            ::testing::Values(Arrival::PresentAtStart, Arrival::PluggedInLater)),
                         [](const auto& info) {
                             return std::string(std::get<0>(info.param).name) + "_" +
                                    arrivalName(std::get<1>(info.param));
                         });

// The images that fill the room below the identity page exactly.
class LargestImage : public Programming, public ::testing::WithParamInterface<std::tuple<uint16_t, Arrival>> {};

TEST_P(LargestImage, FillsTheFlashUpToTheIdentityPage)
{
    const auto [loaderProductId, arrival] = GetParam();
    const uint32_t size = identityPage(loaderProductId) - firmwareBase(loaderProductId);
    expectInstalled(loaderProductId, size, arrival, wholeImage(loaderProductId, size));
}

INSTANTIATE_TEST_SUITE_P(Loaders, LargestImage,
                         ::testing::Combine(::testing::Values(uint16_t{0x4A10}, uint16_t{0x4A20}),
                                            ::testing::Values(Arrival::PresentAtStart, Arrival::PluggedInLater)),
                         [](const auto& info) {
                             char name[32];
                             std::snprintf(name, sizeof name, "Loader%04X_", std::get<0>(info.param));
                             return name + arrivalName(std::get<1>(info.param));
                         });

// The image's size was checked before the erase: a read that meets the end of
// the file early must not program what the block buffer happened to hold.
TEST_F(Programming, AReadThatMeetsTheEndOfTheFileEarlyFailsTheUpdate)
{
    writeDefaultImage(kProductId, makeImage(1000));
    sim::kernel::files().failReadNumber(3, sim::kernel::fileStatus::endOfFile);  // read 3: the partial block
    auto hardware = sim::makeEmulatedDevice(deviceWithIdentity(0x4A10, kProductId));
    run(hardware, Arrival::PresentAtStart);
    EXPECT_EQ(requestLines(*hardware),
              joined({identityReads(0x4A10), {"erase 1", "erase 2"}, blockRequests(0x0200, 512)}));
    EXPECT_EQ(logLines(), std::vector<LogLine>{updateFailed(-50207)});
}

}  // namespace
}  // namespace update_tests
