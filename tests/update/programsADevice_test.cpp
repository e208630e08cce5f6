// One whole update, end to end, through the real module.
#include "tests/support/LoaderWorld.h"

namespace {

using testing_support::LoaderWorld;
using testing_support::makeImage;

class Update : public LoaderWorld {};

TEST_F(Update, ProgramsAPresentDeviceAndRestartsItAsTheProduct)
{
    std::vector<uint8_t> image = makeImage(1000);
    writeDefaultImage(0x4B01, image);
    auto hardware = sim::makeEmulatedDevice(deviceWithIdentity(0x4A10, 0x4B01));
    hardware->plugIn(tree());

    ASSERT_EQ(startModule(), 0);
    EXPECT_TRUE(host().eventLog.empty()) << host().eventLog.front().message;
    std::vector<uint8_t> expected = image;
    expected[6] = 0xAA;
    expected[7] = 0x55;
    EXPECT_EQ(hardware->readMemory(0x0200, image.size()), expected);
    ASSERT_NE(hardware->current(), nullptr);
    EXPECT_EQ(hardware->current()->getAttribute(2, nullptr), 0x4B01u);
    EXPECT_EQ(hardware->trace.size(), 3u /*identity*/ + 2 /*erase*/ + 2 * 9 /*blocks*/ + 1 /*marker*/ + 1);
    EXPECT_EQ(host().allocator.liveBlocks(), 1u + 2 + 1) << "stop node, table, two records";

    EXPECT_EQ(callSsMain(1), 0);
    EXPECT_EQ(module->dllUnload(), 0);
}

}  // namespace
