// Updates that succeed, end to end through the device table: the requests in
// their order, the flash they leave, and the device coming back as the
// product, whether it was present when the module started or arrived later.
#include "updateWorld.h"

namespace update_tests {
namespace {

struct ProgrammingCase {
    const char* name;
    uint16_t loaderProductId;
    uint16_t firmwareBase;
    uint32_t imageSize;
    std::vector<std::string> programming;  // between the identity reads and the marker
};

// Pages first to last erased, then as many whole blocks from the base, each written and read back.
std::vector<std::string> wholeBlocks(uint16_t base, uint32_t firstPage, uint32_t lastPage)
{
    std::vector<std::string> lines;
    for (uint32_t page = firstPage; page <= lastPage; ++page) lines.push_back("erase " + std::to_string(page));
    for (uint32_t block = 0; block <= lastPage - firstPage; ++block) {
        lines = joined({lines, blockRequests(static_cast<uint16_t>(base + 512 * block), 512)});
    }
    return lines;
}

class Programming : public WithArrival<ProgrammingCase> {};

TEST_P(Programming, ErasesProgramsVerifiesMarksAndRestarts)
{
    const auto& [c, arrival] = GetParam();
    const std::vector<uint8_t> image = testing_support::makeImage(c.imageSize);
    writeDefaultImage(kProductId, image);
    auto hardware = sim::makeEmulatedDevice(deviceWithIdentity(c.loaderProductId, kProductId));
    const std::vector<uint8_t> identityBefore = hardware->readMemory(identityPage(c.loaderProductId), 512);

    sim::LoaderModeDevice& loader = run(hardware, arrival);

    EXPECT_EQ(requestLines(*hardware), joined({identityReads(c.loaderProductId), c.programming,
                                               {"write " + hex4(c.firmwareBase + 6) + " 2", "restart"}}));
    EXPECT_EQ(logLines(), std::vector<std::string>{});
    std::vector<uint8_t> expected = image;
    expected[6] = 0xAA;
    expected[7] = 0x55;
    EXPECT_EQ(hardware->readMemory(c.firmwareBase, c.imageSize), expected);
    EXPECT_EQ(hardware->readMemory(identityPage(c.loaderProductId), 512), identityBefore);

    auto* product = dynamic_cast<sim::ProductDevice*>(hardware->current());
    ASSERT_NE(product, nullptr) << "the device did not come back as the product";
    EXPECT_EQ(product->getAttribute(1, nullptr), 0x5C1Du);
    EXPECT_EQ(product->getAttribute(2, nullptr), kProductId);
    EXPECT_EQ(loader.openStreamCalls, 1);
    EXPECT_EQ(loader.closeStreamCalls, 1);
    EXPECT_EQ(host().allocator.liveBlocks(), 4u) << "only the stop node, the table and its two records";
    EXPECT_EQ(sim::kernel::files().openFileCount(), 0u);
}

const ProgrammingCase kProgrammingCases[] = {
    {"WholeAndPartialBlockOnTheSmallLoader", 0x4A10, 0x0200, 1000,
     {"erase 1", "erase 2",
      "write 0x0200 512", "read 0x0200 64", "read 0x0240 64", "read 0x0280 64", "read 0x02C0 64",
      "read 0x0300 64", "read 0x0340 64", "read 0x0380 64", "read 0x03C0 64",
      "write 0x0400 488", "read 0x0400 64", "read 0x0440 64", "read 0x0480 64", "read 0x04C0 64",
      "read 0x0500 64", "read 0x0540 64", "read 0x0580 64", "read 0x05C0 40"}},
    {"TwoWholeBlocksOnTheLargeLoader", 0x4A20, 0x0600, 1024, wholeBlocks(0x0600, 3, 4)},
    {"OnlyAPartialBlock", 0x4A10, 0x0200, 100, {"erase 1", "write 0x0200 100", "read 0x0200 64", "read 0x0240 36"}},
    // The images that fill the room below the identity page exactly.
    {"LargestOnTheSmallLoader", 0x4A10, 0x0200, 0x3600 - 0x0200, wholeBlocks(0x0200, 1, 26)},
    {"LargestOnTheLargeLoader", 0x4A20, 0x0600, 0x7C00 - 0x0600, wholeBlocks(0x0600, 3, 61)},
};

INSTANTIATE_TEST_SUITE_P(Images, Programming, ::testing::Combine(::testing::ValuesIn(kProgrammingCases), kArrivals),
                         CaseAndArrival());

}  // namespace
}  // namespace update_tests
