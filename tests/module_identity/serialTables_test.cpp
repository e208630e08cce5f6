// The serial tables are data shipped with the devices; a typo in them would
// silently give a device the wrong product.
#include <gtest/gtest.h>

#include <vector>

#include "source/deviceTable.h"
#include "source/serialTables.h"

namespace {

struct SerialRun {
    uint32_t first;
    uint32_t last;
    uint32_t entries;
    bool operator==(const SerialRun& o) const { return first == o.first && last == o.last && entries == o.entries; }
};

void PrintTo(const SerialRun& run, std::ostream* out)
{
    *out << std::hex << run.first << ".." << run.last << std::dec << " (" << run.entries << ")";
}

const std::vector<SerialRun> kFixListRuns = {
    {0x00E08820, 0x00E08833, 20},  {0x00E08A99, 0x00E08AD9, 65},  {0x00E0962E, 0x00E096DC, 175},
    {0x00E09B18, 0x00E09B2B, 20},  {0x00E09E4C, 0x00E09E5F, 20},  {0x00E09FE0, 0x00E0A01B, 60},
    {0x00E0A7CC, 0x00E0A7E9, 30},  {0x00E0B404, 0x00E0B46C, 105}, {0x00E0BC13, 0x00E0BC30, 30},
    {0x00E0BC4B, 0x00E0BC86, 60},  {0x00E0C47B, 0x00E0C5CE, 340}, {0x00E0CA95, 0x00E0CAF8, 100},
    {0x00E0D00B, 0x00E0D028, 30},  {0x00E0D5A8, 0x00E0D606, 95},  {0x00E0D9B2, 0x00E0D9CA, 25},
    {0x00E0DD3D, 0x00E0DECC, 400},
};

// Tested in this order; not ascending.
const SerialRange kRanges[] = {
    {0x00E0CBAA, 0x00E0CC29}, {0x00E0FBF1, 0x00E0FC13}, {0x00E101AC, 0x00E10216},
    {0x00E10F22, 0x00E111AE}, {0x00E11228, 0x00E11307}, {0x00E008CB, 0x00E008CB},
    {0x00E07FC5, 0x00E07FC5}, {0x00E07F11, 0x00E07F11}, {0x00E07E41, 0x00E07E41},
};

bool inRanges(uint32_t serialNumber)
{
    return DeviceTable::isSerialInRanges(serialNumber);
}

}  // namespace

// A listed serial is one of the small product's; the ranges name the other.
TEST(SerialTables, FixListHoldsItsRunsAscendingOutsideTheRangesAndEndsWithZero)
{
    std::vector<SerialRun> runs;
    uint32_t count = 0;
    for (; count < kSerialFixListEntries && kSerialFixList[count] != 0; ++count) {
        uint32_t serial = kSerialFixList[count];
        if (count > 0) {
            ASSERT_GT(serial, kSerialFixList[count - 1]) << "entry " << count;
        }
        EXPECT_FALSE(inRanges(serial)) << std::hex << serial;
        if (!runs.empty() && serial == runs.back().last + 1) {
            runs.back().last = serial;
            ++runs.back().entries;
        } else {
            runs.push_back({serial, serial, 1});
        }
    }
    EXPECT_EQ(count, 1575u);
    EXPECT_EQ(kSerialFixList[1575], 0u);
    EXPECT_EQ(runs, kFixListRuns);
}

TEST(SerialTables, RangeRowsInOrderCountTheirBoundsAndNothingAround)
{
    ASSERT_EQ(kSerialRangeRows, 9u);
    for (uint32_t row = 0; row < kSerialRangeRows; ++row) {
        const SerialRange& range = kRanges[row];
        SCOPED_TRACE(row + 1);
        EXPECT_EQ(kSerialRangeTable[row].low, range.low);
        EXPECT_EQ(kSerialRangeTable[row].high, range.high);
        EXPECT_TRUE(inRanges(range.low));
        EXPECT_TRUE(inRanges(range.high));
        EXPECT_FALSE(inRanges(range.low - 1));
        EXPECT_FALSE(inRanges(range.high + 1));
    }
    for (uint32_t outside : {0x00000000u, 0xFFFFFFFFu}) EXPECT_FALSE(inRanges(outside)) << std::hex << outside;
}
