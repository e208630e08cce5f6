// What the lab sees that the module cannot: each story that should raise a
// finding does, and a clean update raises none.
#include <gtest/gtest.h>

#include <regex>
#include <string>
#include <vector>

#include "morvanek-lab/lib/DeviceStory.h"
#include "morvanek-lab/lib/Lab.h"
#include "morvanek-lab/lib/ScenarioParser.h"

namespace {

// One device on loader 0x4A10 with a default image of product 4B01; DEVICE and
// IMAGE are filled in per case.
const char* const kWorld = R"({
  "registry": { "keys": {
    "HKLM\\Software\\Microsoft\\Windows NT\\CurrentVersion": { "SystemRoot": "C:\\WINDOWS" },
    "HKLM\\System\\CurrentControlSet\\Control\\Class\\{6D2F4B10-93A7-11CF-B4E8-00C05D7A3F21}": { "FVTPID": "4B01" } } },
  "drives": { "C": { "files": { "WINDOWS\\system32\\drivers\\QVUSB4B01.bin": IMAGE } } },
  "devices": [ DEVICE ]
})";

lab::ScenarioResult run(const std::string& device, const std::string& image)
{
    std::string text = std::regex_replace(kWorld, std::regex("DEVICE"), device);
    text = std::regex_replace(text, std::regex("IMAGE"), image);
    return lab::runScenario(lab::parseScenarioText(text, "findings.json", "."), {});
}

std::vector<std::string> findingTexts(const lab::RunRecord& record)
{
    std::vector<std::string> texts;
    for (const lab::Finding& finding : record.findings) texts.push_back(finding.text);
    return texts;
}

struct FindingCase {
    const char* name;
    const char* device;
    const char* image;
    std::vector<const char*> findings;  // each must appear in one finding, in this order
};

const char* const kSound = R"({"name": "d", "identity": {"productId": "0x4B01", "serialNumber": 7}})";
const char* const kImage = R"({"generate": {"size": 1000}})";

const FindingCase kCases[] = {
    {"clean update", kSound, kImage, {}},
    {"zeroed identity",
     R"({"name": "d", "identity": "zeroed"})",
     kImage,
     {"wrote 5C 1D at 0x37F8, but the flash holds 00 00", "wrote 4B 01 at 0x37F0, but the flash holds 00 00",
      "every update will read the same damaged block"}},
    {"marker over image bytes",
     kSound,
     R"({"generate": {"size": 700, "markerRoom": false}})",
     {"wrote AA 55 at 0x0206, but the flash holds", "came back in loader mode (1 in a row)"}},
    {"image held open elsewhere",
     kSound,
     R"({"generate": {"size": 700}, "heldOpenElsewhere": true})",
     {"update 1 ended after 3 request(s) without a restart and without any event-log message; the image could not "
      "be opened"}},
    {"foreign identity",
     R"({"name": "d", "identity": {"vendorId": "0x1234", "productId": "0x4B01"}})",
     kImage,
     {"it stopped after reading the identity block"}},
    {"unplugged",
     R"({"name": "d", "identity": {"productId": "0x4B01"}, "faults": {"unplugAtRequest": 6}})",
     kImage,
     {"stopped answering at request 6"}},
};

class LabFindings : public ::testing::TestWithParam<FindingCase> {};

TEST_P(LabFindings, AreRaisedForWhatTheModuleCannotSee)
{
    const FindingCase& c = GetParam();
    lab::ScenarioResult result = run(c.device, c.image);
    ASSERT_TRUE(result.invalid.empty() && result.labError.empty()) << result.invalid << result.labError;
    std::vector<std::string> texts = findingTexts(result.record);
    if (c.findings.empty()) {
        EXPECT_EQ(texts, std::vector<std::string>{});
    }
    size_t from = 0;
    for (const char* wanted : c.findings) {
        auto it = std::find_if(texts.begin() + static_cast<std::ptrdiff_t>(from), texts.end(),
                               [&](const std::string& text) { return text.find(wanted) != std::string::npos; });
        ASSERT_NE(it, texts.end()) << "no finding \"" << wanted << "\" after #" << from << " in:\n"
                                   << ::testing::PrintToString(texts);
        from = static_cast<size_t>(it - texts.begin()) + 1;
    }
    for (const lab::Finding& finding : result.record.findings) EXPECT_EQ(finding.device, "d");
}

INSTANTIATE_TEST_SUITE_P(Lab, LabFindings, ::testing::ValuesIn(kCases),
                         [](const ::testing::TestParamInfo<FindingCase>& info) {
                             std::string name;
                             for (const char* c = info.param.name; *c != 0; ++c) name += std::isalnum(*c) ? *c : '_';
                             return name;
                         });

TEST(LabStory, AVerificationFailureNamesTheBlockAndTheCell)
{
    lab::ScenarioResult result =
        run(R"({"name": "d", "identity": {"productId": "0x4B01"}, "faults": {"readCorruptions": [{"address": "0x0411", "replaceWith": 0}]}})",
            kImage);
    std::vector<lab::UpdateStory> stories = lab::tellDeviceStory(result.record, 0);
    ASSERT_EQ(stories.size(), 1u);
    EXPECT_EQ(stories[0].blocksWritten, 2u);
    EXPECT_EQ(stories[0].blocksVerified, 1u);
    ASSERT_EQ(stories[0].readBackDifferences.size(), 1u);
    EXPECT_NE(stories[0].readBackDifferences[0].find("block 1 read back 0x00 at 0x0411"), std::string::npos)
        << stories[0].readBackDifferences[0];
    EXPECT_FALSE(stories[0].markerWritten);
    EXPECT_FALSE(stories[0].restarted);
    ASSERT_EQ(stories[0].logLines.size(), 2u);
    EXPECT_NE(stories[0].logLines[0].find("verification on page 1"), std::string::npos);
}

TEST(LabStory, EachComebackInLoaderModeIsAnUpdateOfItsOwn)
{
    lab::ScenarioResult result = run(kSound, R"({"generate": {"size": 700, "markerRoom": false}})");
    std::vector<lab::UpdateStory> stories = lab::tellDeviceStory(result.record, 0);
    ASSERT_EQ(stories.size(), 4u);  // the first, then three comebacks the host still announces
    for (const lab::UpdateStory& story : stories) {
        EXPECT_EQ(story.pagesErased, (std::vector<uint16_t>{1, 2}));
        EXPECT_TRUE(story.markerWritten && !story.markerTook && story.restarted);
    }
    EXPECT_EQ(result.record.devices[0].mode, "loader");
}

TEST(LabStory, RequestsAreWrittenAsScenariosExpectThem)
{
    sim::RequestRecord request;
    request.kind = sim::RequestKind::Read;
    request.wIndex = 0x37F8;
    request.length = 2;
    EXPECT_EQ(lab::requestText(request), "read 0x37F8 2");
    request.kind = sim::RequestKind::Erase;
    request.wValue = 27;
    request.outcome = -52002;
    EXPECT_EQ(lab::requestText(request), "erase 27 failed");
    request.kind = sim::RequestKind::Restart;
    request.outcome = 0;
    EXPECT_EQ(lab::requestText(request), "restart");
}

TEST(LabStory, PageRangesAreCompressed)
{
    EXPECT_EQ(lab::pageRanges({1, 2, 3, 5, 7, 8}), "1-3, 5, 7-8");
    EXPECT_EQ(lab::pageRanges({}), "");
}

}  // namespace
