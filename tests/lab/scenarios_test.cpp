// Scenarios run through the real module: what the lab reports, that an
// expectation that does not hold fails with what was seen, and the findings
// the lab raises about what the module cannot see (beside those the shipped
// scenarios expect).
#include <gtest/gtest.h>

#include <filesystem>
#include <regex>

#include "morvanek-lab/lib/deviceStory.h"
#include "morvanek-lab/lib/lab.h"
#include "morvanek-lab/lib/reports.h"
#include "morvanek-lab/lib/scenarioParser.h"

namespace {

// One device on loader 0x4A10 and a default image of product 4B01; DEVICE,
// IMAGE and EXPECT are filled in per case.
const char* const kWorld = R"({
  "registry": { "keys": {
    "HKLM\\Software\\Microsoft\\Windows NT\\CurrentVersion": { "SystemRoot": "C:\\WINDOWS" },
    "HKLM\\System\\CurrentControlSet\\Control\\Class\\{6D2F4B10-93A7-11CF-B4E8-00C05D7A3F21}": { "FVTPID": "4B01" } } },
  "drives": { "C": { "files": { "WINDOWS\\system32\\drivers\\QVUSB4B01.bin": IMAGE } } },
  "devices": [ DEVICE ],
  "expect": EXPECT
})";
const char* const kSound =
    R"({"name": "d", "identity": {"productId": "0x4B01", "serialNumber": "0x0001E240"}, "timing": "fullSpeed"})";
const char* const kImage = R"({"generate": {"size": 1000}})";

lab::ScenarioResult run(const std::string& expect, const std::string& device = kSound,
                        const std::string& image = kImage, const lab::RunOptions& options = {})
{
    std::string text = std::regex_replace(kWorld, std::regex("DEVICE"), device);
    text = std::regex_replace(text, std::regex("IMAGE"), image);
    text = std::regex_replace(text, std::regex("EXPECT"), expect);
    return lab::runScenario(lab::parseScenarioText(text, "one.json", "."), options);
}

std::string textReport(const lab::ScenarioResult& result)
{
    std::FILE* file = std::tmpfile();
    lab::printTextReport(file, result, {});
    std::rewind(file);
    std::string text;
    for (int c; (c = std::fgetc(file)) != EOF;) text += static_cast<char>(c);
    std::fclose(file);
    return text;
}

TEST(LabRun, ProgramsADeviceAndTellsItsStoryInTextAndJson)
{
    lab::RunOptions options;
    options.memoryRanges.push_back({0x0200, 8});
    std::vector<lab::ScenarioResult> results{run(R"({"devices": {"d": {"mode": "product", "enumeratesAs": "0x4B01"}},
                                                     "eventLog": {"count": 0}, "nothingLeft": true})",
                                                 kSound, kImage, options)};
    const lab::ScenarioResult& result = results[0];
    ASSERT_EQ(result.exitCode(), lab::kExitSuccess) << textReport(result);
    EXPECT_EQ(result.expectations.checked, 4u);
    EXPECT_TRUE(result.record.findings.empty());

    std::vector<lab::UpdateStory> stories = lab::tellDeviceStory(result.record, 0);
    ASSERT_EQ(stories.size(), 1u);
    EXPECT_EQ(stories[0].imagesOpened, (std::vector<std::string>{"C:\\WINDOWS\\system32\\drivers\\QVUSB4B01.bin"}));
    // Both bus speeds, whichever the device ran with; the device's own clock agrees with its model.
    EXPECT_EQ(stories[0].fullSpeed, result.record.devices[0].elapsed);
    EXPECT_LT(stories[0].highSpeed, stories[0].fullSpeed);

    std::string report = textReport(result);
    EXPECT_NE(report.find("erased pages 1-2; 2 block(s) written, 2 verified; marker at 0x0206; restarted"),
              std::string::npos)
        << report;
    EXPECT_NE(report.find("runs its firmware as 5C1D:4B01"), std::string::npos) << report;
    EXPECT_EQ(lab::pageRanges({1, 2, 3, 5, 7, 8}), "1-3, 5, 7-8");

    nlohmann::json json = lab::jsonReport(results, options);
    const nlohmann::json& scenario = json["scenarios"][0];
    EXPECT_EQ(json["exitCode"], 0);
    EXPECT_EQ(scenario["devices"][0]["trace"].size(), 25u);
    EXPECT_EQ(scenario["devices"][0]["trace"][24]["kind"], "restart");
    EXPECT_EQ(scenario["devices"][0]["memory"]["ranges"][0]["hex"], "01 08 0F 16 1D 24 AA 55");
    EXPECT_EQ(scenario["allocator"]["liveBlocks"], 0);
    EXPECT_EQ(scenario["handles"]["open"], 0);
    EXPECT_EQ(scenario["devices"][0]["updates"][0]["microseconds"]["fullSpeed"],
              result.record.devices[0].elapsed.count());
    EXPECT_EQ(lab::fnv1a64({}), 0xcbf29ce484222325ull);
    EXPECT_EQ(lab::fnv1a64({'a'}), 0xaf63dc4c8601ec8cull);

    // The drive's temporary folder is gone after the run.
    ASSERT_FALSE(result.record.fileOpens.empty());
    const std::filesystem::path drive = result.record.fileOpens[0].open.hostPath;
    EXPECT_NE(drive.string().find("morvanek-lab-C-"), std::string::npos);
    EXPECT_FALSE(std::filesystem::exists(drive));
}

TEST(LabRun, AWrongExpectationFailsSayingWhereAndWhatWasSeen)
{
    struct Wrong {
        const char* expect;
        const char* place;
        const char* seen;
    };
    const Wrong cases[] = {
        {R"({"devices": {"d": {"mode": "loader"}}})", "/expect/devices/d/mode",
         "it is in product (enumerated as 5C1D:4B01)"},
        {R"({"devices": {"d": {"enumeratesAs": "0x4B02"}}})", "/expect/devices/d/enumeratesAs",
         "enumerates as 5C1D:4B01"},
        {R"({"devices": {"d": {"requests": {"erase": 3}}}})", "/expect/devices/d/requests/erase",
         "should have received 3 erase request(s); it received 2"},
        {R"({"devices": {"d": {"requests": {"endsWith": ["restart", "write 0x0206 2"]}}}})",
         "/expect/devices/d/requests/endsWith", "they end [write 0x0206 2, restart]"},
        {R"({"devices": {"d": {"requests": {"startsWith": ["READ 0x37f8  2", "erase 9"]}}}})",
         "/expect/devices/d/requests/startsWith", "they start [read 0x37F8 2, read 0x37F0 2]"},
        {R"({"devices": {"d": {"requests": {"sequence": ["restart"]}}}})", "/expect/devices/d/requests/sequence",
         "they were [read 0x37F8 2, read 0x37F0 2, read 0x37FC 4, erase 1, erase 2, write 0x0200 512,"},
        {R"({"devices": {"d": {"requests": {"contains": ["erase 2", "erase 7"]}}}})",
         "/expect/devices/d/requests/contains/1", "should have received \"erase 7\"; it received [read 0x37F8 2,"},
        {R"({"devices": {"d": {"requests": {"absent": ["erase 7", "  ERASE   1 "]}}}})",
         "/expect/devices/d/requests/absent/1", "should not have received \"  ERASE   1 \", but did"},
        {R"({"devices": {"d": {"memory": [{"address": "0x0206", "hex": "55 AA"}]}}})", "/expect/devices/d/memory/0",
         "should hold 55 AA; it holds AA 55"},
        {R"({"devices": {"d": {"identity": {"productId": "0x4B02"}}}})", "/expect/devices/d/identity/productId",
         "should hold productId 4B02; it holds 4B01"},
        {R"({"devices": {"d": {"programmedWith": "C:\\nowhere.bin"}}})", "/expect/devices/d/programmedWith",
         "is not a file of this world's drives"},
        {R"({"eventLog": {"contains": ["verification"]}})", "/expect/eventLog/contains/0", "it has no lines at all"},
        {R"({"nothingLeft": false})", "/expect/nothingLeft", "something should be left"},
        {R"({"findings": {"count": 1}})", "/expect/findings/count", "should have 1 line(s); it has no lines at all"},
    };
    for (const Wrong& c : cases) {
        SCOPED_TRACE(c.place);
        lab::ScenarioResult result = run(c.expect);
        EXPECT_EQ(result.exitCode(), lab::kExitExpectationFailed);
        ASSERT_EQ(result.expectations.failures.size(), 1u) << textReport(result);
        EXPECT_EQ(result.expectations.failures[0].place, c.place);
        EXPECT_NE(result.expectations.failures[0].what.find(c.seen), std::string::npos)
            << result.expectations.failures[0].what;
        EXPECT_NE(textReport(result).find("FAIL  one.json: 1 of"), std::string::npos);
    }
}

TEST(LabRun, StepResultsAreChecked)
{
    std::string text = R"({"host": {"ready": false}, "steps": [{"do": "load", "expect": {"result": 0}},
                           {"do": "getCurrentVersion", "expect": {"result": "0x0143C001"}}]})";
    lab::ScenarioResult result = lab::runScenario(lab::parseScenarioText(text, "steps.json", "."), {});
    ASSERT_EQ(result.expectations.failures.size(), 2u);
    EXPECT_EQ(result.expectations.failures[0].place, "/steps/0/expect/result");
    EXPECT_NE(result.expectations.failures[0].what.find("should return 0x00000000, returned 0xC000026C"),
              std::string::npos)
        << result.expectations.failures[0].what;
    EXPECT_EQ(result.expectations.failures[1].place, "/steps/1/expect/result");
}

// What the report tells of one device, and the findings the lab raises, each
// in order, about what the module cannot see.
TEST(LabRun, TellsWhatTheModuleDidAndWhatItCannotSee)
{
    struct Case {
        const char* name;
        const char* device;
        const char* image;
        const char* report;
        std::vector<const char*> findings;
    };
    const Case cases[] = {
        {"verification failure",
         R"({"name": "d", "faults": {"readCorruptions": [{"address": "0x0411", "replaceWith": 0}]}})", kImage,
         "erased pages 1-2; 2 block(s) written, 1 verified; block 1 read back 0x00 at 0x0411 where 0x31 was written; "
         "no restart",
         {}},
        {"zeroed identity", R"({"name": "d", "identity": "zeroed"})", kImage,
         "repaired from the registry's FVTPID: wrote vendor ID 5C1D at 0x37F8 (did not take)",
         {"wrote 5C 1D at 0x37F8, but the flash holds 00 00", "wrote 4B 01 at 0x37F0, but the flash holds 00 00",
          "every update will read the same damaged block"}},
        {"image held open elsewhere", kSound, R"({"generate": {"size": 700}, "heldOpenElsewhere": true})",
         "in loader mode",
         {"update 1 ended after 3 request(s) without a restart and without any event-log message; the image could "
          "not be opened"}},
        {"foreign identity", R"({"name": "d", "identity": {"vendorId": "0x1234", "productId": "0x4B01"}})", kImage,
         "in loader mode", {"it stopped after reading the identity block"}},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        lab::ScenarioResult result = run("{}", c.device, c.image);
        ASSERT_TRUE(result.invalid.empty() && result.labError.empty()) << result.invalid << result.labError;
        EXPECT_NE(textReport(result).find(c.report), std::string::npos) << textReport(result);
        std::vector<std::string> texts;
        for (const lab::Finding& finding : result.record.findings) {
            texts.push_back(finding.text);
            EXPECT_EQ(finding.device, "d");
        }
        EXPECT_EQ(texts.empty(), c.findings.empty()) << ::testing::PrintToString(texts);
        auto from = texts.begin();
        for (const char* wanted : c.findings) {
            from = std::find_if(from, texts.end(),
                                [&](const std::string& text) { return text.find(wanted) != std::string::npos; });
            ASSERT_NE(from, texts.end()) << "no finding \"" << wanted << "\" in order in:\n"
                                         << ::testing::PrintToString(texts);
            ++from;
        }
    }
}

}  // namespace
