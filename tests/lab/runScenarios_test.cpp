// Scenarios run through the real module: what the lab reports, and that an
// expectation that does not hold fails with what was seen.
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <regex>
#include <sstream>

#include "morvanek-lab/lib/DeviceStory.h"
#include "morvanek-lab/lib/Lab.h"
#include "morvanek-lab/lib/Reports.h"
#include "morvanek-lab/lib/ScenarioParser.h"

namespace {

const char* const kOneDevice = R"({
  "registry": { "keys": { "HKLM\\Software\\Microsoft\\Windows NT\\CurrentVersion": { "SystemRoot": "C:\\WINDOWS" } } },
  "drives": { "C": { "files": { "WINDOWS\\system32\\drivers\\QVUSB4B01.bin": { "generate": { "size": 1000 } } } } },
  "devices": [{ "name": "d", "identity": { "productId": "0x4B01", "serialNumber": "0x0001E240" }, "timing": "fullSpeed" }],
  "expect": EXPECT
})";

lab::ScenarioResult runText(const std::string& expect)
{
    std::string text = std::regex_replace(kOneDevice, std::regex("EXPECT"), expect);
    return lab::runScenario(lab::parseScenarioText(text, "one.json", "."), {});
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

TEST(LabRun, ProgramsADeviceAndTellsItsStory)
{
    lab::ScenarioResult result = runText(R"({"devices": {"d": {"mode": "product", "enumeratesAs": "0x4B01"}},
                                            "eventLog": {"count": 0}, "nothingLeft": true})");
    ASSERT_EQ(result.exitCode(), lab::kExitSuccess) << textReport(result);
    EXPECT_EQ(result.expectations.checked, 4u);

    std::vector<lab::UpdateStory> stories = lab::tellDeviceStory(result.record, 0);
    ASSERT_EQ(stories.size(), 1u);
    EXPECT_EQ(stories[0].pagesErased, (std::vector<uint16_t>{1, 2}));
    EXPECT_EQ(stories[0].blocksWritten, 2u);
    EXPECT_EQ(stories[0].blocksVerified, 2u);
    EXPECT_TRUE(stories[0].markerWritten && stories[0].markerTook && stories[0].restarted);
    EXPECT_EQ(stories[0].imagesOpened, (std::vector<std::string>{"C:\\WINDOWS\\system32\\drivers\\QVUSB4B01.bin"}));
    // Both bus speeds, whichever the device ran with; the device's own clock agrees with its model.
    EXPECT_EQ(stories[0].fullSpeed, result.record.devices[0].elapsed);
    EXPECT_LT(stories[0].highSpeed, stories[0].fullSpeed);

    std::string report = textReport(result);
    EXPECT_NE(report.find("erased pages 1-2; 2 block(s) written, 2 verified; marker at 0x0206; restarted"),
              std::string::npos)
        << report;
    EXPECT_NE(report.find("runs its firmware as 5C1D:4B01"), std::string::npos) << report;
}

struct WrongExpectation {
    const char* expect;
    const char* place;
    const char* seen;
};

const WrongExpectation kWrongExpectations[] = {
    {R"({"devices": {"d": {"mode": "loader"}}})", "/expect/devices/d/mode", "it is in product (enumerated as 5C1D:4B01)"},
    {R"({"devices": {"d": {"enumeratesAs": "0x4B02"}}})", "/expect/devices/d/enumeratesAs", "enumerates as 5C1D:4B01"},
    {R"({"devices": {"d": {"requests": {"erase": 3}}}})", "/expect/devices/d/requests/erase",
     "should have received 3 erase request(s); it received 2"},
    {R"({"devices": {"d": {"requests": {"endsWith": ["restart", "write 0x0206 2"]}}}})",
     "/expect/devices/d/requests/endsWith", "they end [write 0x0206 2, restart]"},
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

class FailingExpectation : public ::testing::TestWithParam<WrongExpectation> {};

TEST_P(FailingExpectation, SaysWhereAndWhatWasSeen)
{
    lab::ScenarioResult result = runText(GetParam().expect);
    EXPECT_EQ(result.exitCode(), lab::kExitExpectationFailed);
    ASSERT_EQ(result.expectations.failures.size(), 1u) << textReport(result);
    EXPECT_EQ(result.expectations.failures[0].place, GetParam().place);
    EXPECT_NE(result.expectations.failures[0].what.find(GetParam().seen), std::string::npos)
        << result.expectations.failures[0].what;
    EXPECT_NE(textReport(result).find(std::string("FAIL  one.json: 1 of")), std::string::npos);
}

INSTANTIATE_TEST_SUITE_P(Lab, FailingExpectation, ::testing::ValuesIn(kWrongExpectations));

TEST(LabRun, StepResultsAreChecked)
{
    std::string text = R"({"host": {"ready": false},
        "steps": [{"do": "load", "expect": {"result": 0}}, {"do": "getCurrentVersion", "expect": {"result": "0x0143C001"}}]})";
    lab::ScenarioResult result = lab::runScenario(lab::parseScenarioText(text, "steps.json", "."), {});
    ASSERT_EQ(result.expectations.failures.size(), 2u);
    EXPECT_EQ(result.expectations.failures[0].place, "/steps/0/expect/result");
    EXPECT_NE(result.expectations.failures[0].what.find("should return 0x00000000, returned 0xC000026C"), std::string::npos)
        << result.expectations.failures[0].what;
    EXPECT_EQ(result.expectations.failures[1].place, "/steps/1/expect/result");
}

TEST(LabRun, AModuleThatCannotBeLoadedIsALabError)
{
    lab::RunOptions options;
    options.modulePath = "/nonexistent/libmorvanek.so";
    lab::ScenarioResult result = lab::runScenario(lab::parseScenarioText("{}", "empty.json", "."), options);
    EXPECT_EQ(result.exitCode(), lab::kExitLabError);
    EXPECT_NE(result.labError.find("cannot load the module"), std::string::npos) << result.labError;
}

TEST(LabRun, TemporaryDrivesAreRemovedAfterTheRun)
{
    lab::ScenarioResult result = runText("{}");
    ASSERT_EQ(result.exitCode(), lab::kExitSuccess);
    ASSERT_FALSE(result.record.fileOpens.empty());
    std::filesystem::path drive = result.record.fileOpens[0].open.hostPath;
    EXPECT_FALSE(std::filesystem::exists(drive));
    EXPECT_NE(drive.string().find("morvanek-lab-C-"), std::string::npos);
}

TEST(LabRun, JsonReportCarriesTraceLogAndCounts)
{
    lab::RunOptions options;
    options.memoryRanges.push_back({0x0200, 8});
    std::string text = std::regex_replace(kOneDevice, std::regex("EXPECT"), "{}");
    std::vector<lab::ScenarioResult> results{lab::runScenario(lab::parseScenarioText(text, "one.json", "."), options)};
    nlohmann::json report = lab::jsonReport(results, options);
    const nlohmann::json& scenario = report["scenarios"][0];
    EXPECT_EQ(report["exitCode"], 0);
    EXPECT_EQ(scenario["devices"][0]["trace"].size(), 25u);
    EXPECT_EQ(scenario["devices"][0]["trace"][24]["kind"], "restart");
    EXPECT_EQ(scenario["devices"][0]["memory"]["ranges"][0]["hex"], "01 08 0F 16 1D 24 AA 55");
    EXPECT_EQ(scenario["allocator"]["liveBlocks"], 0);
    EXPECT_EQ(scenario["handles"]["open"], 0);
    EXPECT_EQ(scenario["devices"][0]["updates"][0]["microseconds"]["fullSpeed"],
              results[0].record.devices[0].elapsed.count());
}

TEST(LabDigest, IsFnv1a64)
{
    EXPECT_EQ(lab::fnv1a64({}), 0xcbf29ce484222325ull);
    EXPECT_EQ(lab::fnv1a64({'a'}), 0xaf63dc4c8601ec8cull);
}

// The example in the format's documentation must stay a scenario that passes.
TEST(LabDocumentation, CompleteExamplePasses)
{
    std::ifstream in(MORVANEK_SOURCE_DIR "/docs/lab.md");
    std::stringstream text;
    text << in.rdbuf();
    std::string doc = text.str();
    size_t start = doc.find("```json\n");
    ASSERT_NE(start, std::string::npos);
    start += 8;
    std::string example = doc.substr(start, doc.find("```", start) - start);

    std::filesystem::path folder = std::filesystem::temp_directory_path() / "morvanek-lab-doc-example";
    std::filesystem::create_directories(folder / "dumps");
    std::ofstream(folder / "machine.reg") << "Windows Registry Editor Version 5.00\n\n"
                                             "[HKEY_LOCAL_MACHINE\\SOFTWARE\\Vendor]\n\"Seen\"=\"yes\"\n";
    std::vector<char> image(2000, '\x11');
    image[6] = image[7] = '\xFF';
    std::ofstream(folder / "dumps" / "field-image.bin", std::ios::binary).write(image.data(), static_cast<std::streamsize>(image.size()));

    lab::ScenarioResult result = lab::runScenario(lab::parseScenarioText(example, "lab.md", folder), {});
    std::filesystem::remove_all(folder);
    EXPECT_EQ(result.exitCode(), lab::kExitSuccess) << result.invalid << textReport(result);
}

}  // namespace
