// The check of a product's 0200 firmware image against the version a caller
// expects, through the module's export, against image files on drive C:.
#include <cstdio>

#include "sim/kernel/fileStatus.h"
#include "tests/support/loaderWorld.h"

namespace {

using testing_support::kDeviceClassKey;
using testing_support::kSystemVersionKey;
using testing_support::makeImage;

constexpr uint16_t kProductId = 0x4B01;
constexpr uint32_t kImageVersion = 0x0143C000;

std::string headerText(uint32_t version, uint32_t revision = 0x0200, uint32_t type = 0x0A)
{
    char text[40];
    std::snprintf(text, sizeof text, "%08X%08X%04X%04X%04X%02X", version, 1u, 2u, 3u, revision, type);
    return text;
}

class CompareFirmwareVersion : public testing_support::LoaderWorld {
protected:
    void writeImage0200(const std::string& header) { writeDefaultImage(kProductId, makeImage(1024, 1, header), true); }

    tStatus check(uint32_t expectedVersion, tStatus entry = 0)
    {
        tStatus status = entry;
        module->compareFirmwareVersion(tSSVersion(expectedVersion), kProductId, status);
        EXPECT_TRUE(host().debugLines.empty()) << "the firmware check prints nothing";
        return status;
    }
};

struct VersionCase {
    const char* name;
    std::string header;
    uint32_t expectedVersion;
    tStatus entry;
    tStatus result;
};

void PrintTo(const VersionCase& c, std::ostream* out)
{
    *out << c.name;
}

class ImageHeaders : public CompareFirmwareVersion, public ::testing::WithParamInterface<VersionCase> {};

TEST_P(ImageHeaders, DecideWhetherAndHowTheVersionIsCompared)
{
    const VersionCase& c = GetParam();
    writeImage0200(c.header);
    EXPECT_EQ(check(c.expectedVersion, c.entry), c.result);
    if (c.entry < 0) {
        EXPECT_TRUE(sim::kernel::registry().calls().empty());
        EXPECT_TRUE(sim::kernel::files().opens().empty());
    }
}

const VersionCase kVersionCases[] = {
    {"Equal", headerText(kImageVersion), kImageVersion, 0, 0},
    {"ImageOlder", headerText(kImageVersion), kImageVersion + 1, 0, -50252},
    {"ImageNewer", headerText(kImageVersion), kImageVersion - 1, 0, -50253},
    {"ComparedUnsigned", headerText(0x80000000), 0x7FFFFFFF, 0, -50253},
    {"PositiveStatusKeptWhenEqual", headerText(kImageVersion), kImageVersion, 5, 5},
    {"PositiveStatusReplacedWhenOlder", headerText(kImageVersion), kImageVersion + 1, 5, -50252},
    {"PositiveStatusReplacedWhenNewer", headerText(kImageVersion), kImageVersion - 1, 5, -50253},
    {"NegativeStatusOnEntry", headerText(kImageVersion), kImageVersion + 1, -9, -9},
    {"Revision0200Compared", headerText(kImageVersion, 0x0200), kImageVersion + 1, 0, -50252},
    {"Revision02FFCompared", headerText(kImageVersion, 0x02FF), kImageVersion - 1, 0, -50253},
    {"Revision0100Accepted", headerText(kImageVersion, 0x0100), kImageVersion + 1, 0, 0},
    {"Revision0300Accepted", headerText(kImageVersion, 0x0300), kImageVersion - 1, 0, 0},
    {"Revision1200Accepted", headerText(kImageVersion, 0x1200), kImageVersion - 1, 0, 0},
    {"TypeF0Accepted", headerText(kImageVersion, 0x0200, 0xF0), kImageVersion + 1, 5, 5},
    {"TypeF1Compared", headerText(kImageVersion, 0x0200, 0xF1), kImageVersion + 1, 0, -50252},
    {"UnreadableHeaderAccepted", "0143C000 " + headerText(kImageVersion).substr(8), kImageVersion + 1, 5, 5},
};

INSTANTIATE_TEST_SUITE_P(Headers, ImageHeaders, ::testing::ValuesIn(kVersionCases),
                         [](const auto& info) { return std::string(info.param.name); });

TEST_F(CompareFirmwareVersion, AnImageThatCannotBeOpenedFails)
{
    EXPECT_EQ(check(kImageVersion, 5), -50150) << "no 0200 image";
    writeDefaultImage(kProductId, makeImage(1024), false);
    EXPECT_EQ(check(kImageVersion), -50150) << "only the image that devices are programmed with";

    sim::kernel::files().holdOpenElsewhere(writeDefaultImage(kProductId, makeImage(1024), true));
    EXPECT_EQ(check(kImageVersion), -50150) << "held open elsewhere";
}

TEST_F(CompareFirmwareVersion, WithoutTheSystemRootNoImageIsOpened)
{
    writeImage0200(headerText(kImageVersion));
    sim::kernel::registry().deleteValue(kSystemVersionKey, "SystemRoot");
    EXPECT_EQ(check(kImageVersion, 5), -50150) << "value missing";
    sim::kernel::registry().deleteKey("\\Registry\\Machine\\Software\\Microsoft\\Windows NT");
    EXPECT_EQ(check(kImageVersion), -100000) << "key missing";
    EXPECT_TRUE(sim::kernel::files().opens().empty());
}

TEST_F(CompareFirmwareVersion, NeverConsultsTheDevicesFirmwareValue)
{
    // A "Firmware" value that names an image which would fail the check.
    const std::string instance = testing_support::instanceKey(0x5C1D, kProductId, 0x0001E240);
    sim::kernel::registry().setString(instance, "Driver", "{6D2F4B10-93A7-11CF-B4E8-00C05D7A3F21}\\0000");
    sim::kernel::registry().setString(std::string(kDeviceClassKey) + "\\0000", "Firmware", "C:\\images\\other.bin");
    writeFile("C:\\images\\other.bin", makeImage(1024, 1, headerText(kImageVersion + 5)));
    writeImage0200(headerText(kImageVersion));

    EXPECT_EQ(check(kImageVersion), 0);
    for (const auto& call : sim::kernel::registry().calls()) {
        EXPECT_NE(call.valueName, "Firmware");
        EXPECT_NE(call.valueName, "Driver");
    }
    ASSERT_EQ(sim::kernel::files().opens().size(), 1u);
    EXPECT_EQ(sim::kernel::files().opens()[0].dosPath, "\\??\\C:\\WINDOWS\\system32\\drivers\\QVUSB4B010200.bin");
}

}  // namespace
