// How the lab shows a run at a glance: the requests on one bus clock, the
// summary of several scenarios, and the SVG pictures, which must be
// well-formed and render (with xmllint and rsvg-convert, where installed).
#include <gtest/gtest.h>

#include <sys/wait.h>

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <sstream>

#include "morvanek-lab/lib/busTimeline.h"
#include "morvanek-lab/lib/deviceStory.h"
#include "morvanek-lab/lib/pictures.h"
#include "morvanek-lab/lib/reports.h"
#include "morvanek-lab/lib/scenarioParser.h"
#include "morvanek-lab/lib/svgCanvas.h"

namespace {

// Two devices present at the start, one per loader, each with the image of
// product 4B01; the first's read-back of 0x0811 is corrupted when CORRUPT is
// set, the second has a zeroed identity when ZEROED is set.
lab::ScenarioResult runTwo(bool corrupt, bool zeroed)
{
    std::string text = R"({
      "registry": { "keys": {
        "HKLM\\Software\\Microsoft\\Windows NT\\CurrentVersion": { "SystemRoot": "C:\\WINDOWS" },
        "HKLM\\System\\CurrentControlSet\\Control\\Class\\{6D2F4B10-93A7-11CF-B4E8-00C05D7A3F21}": { "FVTPID": "4B01" } } },
      "drives": { "C": { "files": { "WINDOWS\\system32\\drivers\\QVUSB4B01.bin": { "generate": { "size": 2000 } } } } },
      "devices": [
        { "name": "first", "identity": { "productId": "0x4B01" }, "timing": "highSpeed")" +
                       std::string(corrupt ? R"(, "faults": {"readCorruptions": [{"address": "0x0611", "replaceWith": 0}]})" : "") +
                       R"( },
        { "name": "second <&>", "loaderProductId": "0x4A20", "identity": )" +
                       (zeroed ? R"("zeroed")" : R"({ "productId": "0x4B01" })") + R"( }
      ] })";
    return lab::runScenario(lab::parseScenarioText(text, "two.json", "."), {});
}

std::string phasesText(const lab::DeviceRecord& device)
{
    // Runs of one phase collapse into one word, so the shape of an update reads at a glance.
    std::string text;
    std::string last;
    for (lab::BusPhase phase : lab::requestPhases(device)) {
        if (phase == lab::BusPhase::verify && last == "verify") continue;
        if (phase != lab::BusPhase::program && phase != lab::BusPhase::verify && last == lab::busPhaseName(phase)) continue;
        last = lab::busPhaseName(phase);
        text += (text.empty() ? "" : " ") + last;
    }
    return text;
}

TEST(LabBusTimeline, ServesDevicesOneAfterAnotherOnTheirOwnBusModels)
{
    lab::ScenarioResult result = runTwo(false, false);
    ASSERT_EQ(result.exitCode(), lab::kExitSuccess) << result.invalid << result.labError;
    const lab::RunRecord& record = result.record;
    ASSERT_EQ(record.devices.size(), 2u);
    // Three whole blocks and a partial one, each written and read back.
    EXPECT_EQ(phasesText(record.devices[0]),
              "identity erase program verify program verify program verify program verify marker restart");

    lab::BusTimeline timeline = lab::layOutBusTimeline(record);
    ASSERT_EQ(timeline.requests.size(), record.devices[0].trace.size() + record.devices[1].trace.size());
    // The first device is served completely before the second, and nothing overlaps.
    auto firstOfSecond = std::find_if(timeline.requests.begin(), timeline.requests.end(),
                                      [](const lab::TimedRequest& request) { return request.device == 1; });
    ASSERT_EQ(static_cast<size_t>(firstOfSecond - timeline.requests.begin()), record.devices[0].trace.size());
    std::chrono::microseconds first{0}, second{0};
    for (size_t i = 0; i < timeline.requests.size(); ++i) {
        const lab::TimedRequest& request = timeline.requests[i];
        if (i != 0) {
            EXPECT_EQ(request.start, timeline.requests[i - 1].start + timeline.requests[i - 1].duration);
        }
        (request.device == 0 ? first : second) += request.duration;
    }
    // The device with a timing model agrees with its own clock; the other is modelled at full speed.
    EXPECT_EQ(first, record.devices[0].elapsed);
    std::vector<lab::UpdateStory> stories = lab::tellDeviceStory(record, 1);
    ASSERT_EQ(stories.size(), 1u);
    EXPECT_EQ(second, stories[0].fullSpeed);
    EXPECT_EQ(timeline.total, first + second);
    EXPECT_EQ(std::string(lab::busModelName(record.devices[1])), "full-speed bus, assumed");
}

// A second update starts over with the identity check, and the failed
// request of the first shows in its lane.
TEST(LabBusTimeline, EachUpdateStartsOverWithTheIdentityCheck)
{
    lab::ScenarioResult result =
        lab::runScenarioFile(MORVANEK_LAB_SCENARIOS "/unplug-during-programming.json", lab::RunOptions{});
    ASSERT_EQ(result.exitCode(), lab::kExitSuccess) << result.invalid << result.labError;
    const lab::DeviceRecord& device = result.record.devices.at(0);
    EXPECT_EQ(phasesText(device), "identity erase program verify program verify "
                                  "identity erase program verify program verify program verify program verify marker restart");
    lab::BusTimeline timeline = lab::layOutBusTimeline(result.record);
    ASSERT_EQ(timeline.requests.size(), 20u + 45u);  // 3 identity reads, 4 erases, 4 blocks of 9, marker, restart
    EXPECT_TRUE(timeline.requests[19].failed);
    EXPECT_EQ(timeline.requests[19].phase, lab::BusPhase::verify);
    EXPECT_EQ(timeline.requests[20].update, 1);
    EXPECT_EQ(timeline.total, device.elapsed);

    std::string svg = lab::timelineSvg(result.record, timeline, {0}, "wobbly");
    EXPECT_NE(svg.find(">update 2</text>"), std::string::npos);
    EXPECT_NE(svg.find("wobbly verify: read 0x0480 64 failed;"), std::string::npos);
    EXPECT_NE(svg.find("update 1 (0.0 ms to "), std::string::npos);
}

TEST(LabSummary, CountsEachVerdictAndGivesEachScenarioItsBusTime)
{
    std::vector<lab::ScenarioResult> results;
    results.push_back(runTwo(false, false));
    results.push_back(runTwo(true, false));
    results.back().expectations.failures.push_back({"/expect", "made to fail"});
    lab::ScenarioResult invalid;
    invalid.file = "bad.json";
    invalid.invalid = "bad.json: line 1, column 1: JSON syntax error";
    results.push_back(invalid);

    std::FILE* file = std::tmpfile();
    lab::printSummary(file, results);
    std::rewind(file);
    std::string text;
    for (int c; (c = std::fgetc(file)) != EOF;) text += static_cast<char>(c);
    std::fclose(file);

    std::string bus = lab::durationText(lab::layOutBusTimeline(results[0].record).total);
    EXPECT_NE(text.find("3 scenarios: 1 passed, 1 failed, 1 invalid\n"), std::string::npos) << text;
    EXPECT_NE(text.find("  PASS      two.json  bus time " + bus + " (2 device(s), "), std::string::npos) << text;
    EXPECT_NE(text.find("  FAIL      two.json  bus time "), std::string::npos) << text;
    EXPECT_NE(text.find("  INVALID   bad.json\n"), std::string::npos) << text;
    EXPECT_EQ(lab::jsonReport(results, {})["scenarios"][0]["busMicroseconds"],
              lab::layOutBusTimeline(results[0].record).total.count());
}

TEST(LabSvg, TextIsEscapedSoThatAnyNameGivesWellFormedXml)
{
    const std::pair<std::string, std::string> cases[] = {
        {"plain", "plain"},
        {"a<b>&\"c'", "a&lt;b&gt;&amp;&quot;c&apos;"},
        {"tab\there\x01", "tab?here?"},
        {"caf\xC3\xA9 \xE2\x86\x92", "caf\xC3\xA9 \xE2\x86\x92"},  // UTF-8 kept
        {"broken \xC3 \xFF \xC0\xAF", "broken ? ? ??"},              // not UTF-8, or overlong
        {"cut short \xE2\x86", "cut short ??"},
    };
    for (const auto& [text, escaped] : cases) EXPECT_EQ(lab::xmlEscaped(text), escaped) << text;
}

// A byte that read back wrong and an identity write that did not take show
// where they happened, in the picture and in its hover text.
TEST(LabSvg, FlashMapMarksWhatDidNotTakeWhereItHappened)
{
    lab::ScenarioResult result = runTwo(true, true);
    ASSERT_TRUE(result.invalid.empty() && result.labError.empty()) << result.invalid << result.labError;
    std::string corrupt = lab::flashMapSvg(result.record, 0, "first");
    EXPECT_NE(corrupt.find("page 3 (firmware area), 0x0600 to 0x07FF: 511 byte(s) written and verified, 1 byte(s) did "
                           "not take / read back wrong"),
              std::string::npos);
    EXPECT_NE(corrupt.find("logged: Flash write failed verification on page 2."), std::string::npos);

    std::string zeroed = lab::flashMapSvg(result.record, 1, "second <&>");
    EXPECT_NE(zeroed.find("<title>second &lt;&amp;&gt;</title>"), std::string::npos);
    EXPECT_NE(zeroed.find("0x7DF8: 00 before, 00 after (did not take / read back wrong); 5C was written"),
              std::string::npos);
    EXPECT_NE(zeroed.find("did not take: wrote 4B 01 at 0x7DF0, the flash holds 00 00"), std::string::npos);

    std::string timeline = lab::timelineSvg(result.record, lab::layOutBusTimeline(result.record), {0, 1}, "both");
    EXPECT_NE(timeline.find("update 1 (0.0 ms to "), std::string::npos);
    EXPECT_NE(timeline.find("failed: Flash write failed verification on page 2."), std::string::npos);
    EXPECT_NE(timeline.find("but the identity repair did not take"), std::string::npos);
}

// A long queue keeps to one row per device, each saying how it ended.
TEST(LabSvg, ManyDevicesShareOneTimelineOneRowEach)
{
    std::string devices;
    for (int i = 0; i < 7; ++i) {
        devices += std::string(i == 0 ? "" : ", ") + "{\"name\": \"d" + std::to_string(i) +
                   "\", \"identity\": {\"productId\": \"0x4B01\"}" +
                   (i == 4 ? ", \"faults\": {\"stallKinds\": [\"restart\"]}" : "") + "}";
    }
    std::string text = R"({
      "registry": { "keys": { "HKLM\\Software\\Microsoft\\Windows NT\\CurrentVersion": { "SystemRoot": "C:\\WINDOWS" } } },
      "drives": { "C": { "files": { "WINDOWS\\system32\\drivers\\QVUSB4B01.bin": { "generate": { "size": 600 } } } } },
      "devices": [ )" + devices + " ] }";
    lab::ScenarioResult result = lab::runScenario(lab::parseScenarioText(text, "seven.json", "."), {});
    ASSERT_TRUE(result.invalid.empty() && result.labError.empty()) << result.invalid << result.labError;
    std::vector<int> all{0, 1, 2, 3, 4, 5, 6};
    std::string svg = lab::timelineSvg(result.record, lab::layOutBusTimeline(result.record), all, "seven");
    EXPECT_NE(svg.find(">7 devices, one row each;"), std::string::npos);
    EXPECT_NE(svg.find("<title>d3: update 1: programmed 2 block(s), all verified, marker written, restarted</title>"),
              std::string::npos);
    EXPECT_NE(svg.find("<title>d4: update 1: failed: The firmware update failed."), std::string::npos);
    // The phases' names only in the legend: no lane per phase.
    EXPECT_EQ(svg.find(">verify</text>"), svg.rfind(">verify</text>"));
}

// A folder that cannot be made is the lab's failure, not the scenario's.
TEST(LabSvg, PicturesThatCannotBeWrittenAreALabError)
{
    lab::ScenarioResult result = runTwo(false, false);
    std::filesystem::path file = std::filesystem::path(::testing::TempDir()) / "morvanek-lab-not-a-folder";
    std::ofstream(file) << "a file where the pictures' folder should go";
    EXPECT_EQ(lab::writePicturesOf(result, file), "");
    EXPECT_EQ(result.exitCode(), lab::kExitLabError);
    EXPECT_NE(result.labError.find("cannot make the folder"), std::string::npos) << result.labError;
    std::filesystem::remove(file);
}

int run(const std::string& command)
{
    int status = std::system((command + " >/dev/null 2>&1").c_str());
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

// The demo's pictures, written by the command as a person would ask for them.
TEST(LabSvg, DemoPicturesAreWellFormedAndRender)
{
    if (run("command -v xmllint") != 0 || run("command -v rsvg-convert") != 0)
        GTEST_SKIP() << "xmllint (libxml2-utils) or rsvg-convert (librsvg2-bin) is not installed";
    std::filesystem::path folder = std::filesystem::path(::testing::TempDir()) / "morvanek-lab-pictures";
    std::filesystem::remove_all(folder);
    ASSERT_EQ(run(std::string(MORVANEK_LAB_EXECUTABLE) + " demo --svg " + folder.string()), 0);
    const char* names[] = {"timeline.svg", "bench-left-flash.svg", "bench-left-timeline.svg", "bench-right-flash.svg",
                           "bench-right-timeline.svg"};
    for (const char* name : names) {
        std::filesystem::path svg = folder / "demo" / name;
        SCOPED_TRACE(svg.string());
        ASSERT_TRUE(std::filesystem::exists(svg));
        EXPECT_EQ(run("xmllint --noout " + svg.string()), 0);
        std::filesystem::path png = svg;
        png.replace_extension(".png");
        EXPECT_EQ(run("rsvg-convert " + svg.string() + " -o " + png.string()), 0);
        std::ifstream in(png, std::ios::binary);
        char signature[8] = {};
        in.read(signature, sizeof signature);
        EXPECT_EQ(std::string(signature + 1, 3), "PNG");
    }
    std::filesystem::remove_all(folder);
}

}  // namespace
