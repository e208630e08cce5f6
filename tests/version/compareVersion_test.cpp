// The version queries and the check of a caller's range against the module's.
#include "tests/support/moduleTest.h"

namespace {

class VersionQueries : public testing_support::ModuleTest {};

TEST_F(VersionQueries, ReportTheInstalledRangeAndLeaveTheStatusAlone)
{
    for (tStatus entry : {0, 5, -7}) {
        tStatus status = entry;
        EXPECT_EQ(module->getCurrentVersion(status).packed(), 0x0143C000u);
        EXPECT_EQ(module->getOldestCompatibleVersion(status).packed(), 0x01004000u);
        EXPECT_EQ(status, entry);
    }
    char text[16];
    EXPECT_STREQ(tSSVersion(0x0143C000).toString(text), "1.4.3f0");
    EXPECT_STREQ(tSSVersion(0x01004000).toString(text), "1.0.0a0");
}

struct RangeCase {
    const char* name;
    uint32_t newest;
    uint32_t oldest;
    tStatus entry;
    tStatus expected;
};

void PrintTo(const RangeCase& c, std::ostream* out)
{
    *out << c.name;
}

class CompareVersion : public testing_support::ModuleTest, public ::testing::WithParamInterface<RangeCase> {};

TEST_P(CompareVersion, MergesTheResultAndPrintsOnFailure)
{
    const RangeCase& c = GetParam();
    tStatus status = c.entry;
    module->compareVersion(tSSVersion(c.newest), tSSVersion(c.oldest), status, "probe");
    EXPECT_EQ(status, c.expected);
    bool printed = c.entry >= 0 && c.expected < 0;
    EXPECT_EQ(host().debugLines.size(), printed ? 1u : 0u);
}

const RangeCase kRangeCases[] = {
    {"WholeInstalledRange", 0x0143C000, 0x01004000, 0, 0},
    {"OneVersionAtTheOldEnd", 0x01004000, 0x01004000, 0, 0},
    {"OneVersionAtTheNewEnd", 0x0143C000, 0x0143C000, 0, 0},
    {"OneVersionInside", 0x01200000, 0x01200000, 0, 0},
    {"PartialOverlapBelow", 0x01100000, 0x01000000, 0, 0},
    {"PartialOverlapAbove", 0x02000000, 0x01400000, 0, 0},
    {"NewestJustBelowTheRange", 0x01003FFF, 0x01000000, 0, -50253},
    {"OldestJustAboveTheRange", 0x0143C001, 0x0143C001, 0, -50252},
    {"InvertedInsideTheRange", 0x01100000, 0x01200000, 0, -50000},
    {"InvertedWinsOverTooOld", 0x01000000, 0x01003FFF, 0, -50000},
    {"PositiveStatusKeptOnSuccess", 0x0143C000, 0x01004000, 12, 12},
    {"PositiveStatusReplacedOnFailure", 0x01003FFF, 0x01000000, 12, -50253},
    {"NegativeStatusUntouched", 0x01100000, 0x01200000, -3, -3},
};

INSTANTIATE_TEST_SUITE_P(Ranges, CompareVersion, ::testing::ValuesIn(kRangeCases),
                         [](const auto& info) { return std::string(info.param.name); });

TEST_F(VersionQueries, PrintsTheCallersNameAndBothRanges)
{
    tStatus status = 0;
    module->compareVersion(tSSVersion(0x0143C001), tSSVersion(0x0143C001), status, "qvDAQ");
    ASSERT_EQ(host().debugLines.size(), 1u);
    EXPECT_EQ(host().debugLines[0],
              "[morvanek] version check failed with status = -50252. Component 'qvDAQ' desires the range 1.4.3f1 - "
              "1.4.3f1 however the installed range is 1.0.0a0 - 1.4.3f0\n");
}

TEST_F(VersionQueries, PrintsTheCallingComponentWhenUnnamed)
{
    tStatus status = 0;
    module->compareVersion(tSSVersion(0x01000000), tSSVersion(0x02000000), status, nullptr);
    ASSERT_EQ(host().debugLines.size(), 1u);
    EXPECT_EQ(host().debugLines[0],
              "[morvanek] version check failed with status = -50000. The calling component desires the range "
              "2.0.0d0 - 1.0.0d0 however the installed range is 1.0.0a0 - 1.4.3f0\n");
}

}  // namespace
