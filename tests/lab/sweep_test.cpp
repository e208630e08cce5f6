// The sweep's own checks: each invariant catches the fault it is for in a run
// record broken on purpose, a fault's expectation catches a wrong ending, and
// the command catches a deliberately broken build of the module (one that
// takes every block as verified) and writes a scenario that reproduces it.
#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <functional>
#include <ostream>
#include <set>
#include <string>
#include <vector>

#include <nlohmann/json.hpp>

#include "morvanek-lab/lib/faultExpectation.h"
#include "morvanek-lab/lib/lab.h"
#include "morvanek-lab/lib/runInvariants.h"
#include "tests/lab/labProcess.h"

namespace {

using lab_tests::Outcome;
using lab_tests::runLab;

const std::string kScenarios = MORVANEK_LAB_SCENARIOS;

// loader-4a20.json: one device, a 1024-byte image from 0x0600. Its 25
// requests: 3 identity reads, erase 3 and 4, block 0 written at index 5 and
// read back at 6 to 13, block 1 at 14 and 15 to 22, the marker at 23, the
// restart at 24.
const lab::ScenarioResult& cleanRun()
{
    static const lab::ScenarioResult result = lab::runScenarioFile(kScenarios + "/loader-4a20.json", {});
    return result;
}

constexpr size_t kBlock1 = 14;
constexpr size_t kMarker = 23;
constexpr int32_t kStalled = -52002;

lab::DeviceRecord& wide(lab::RunRecord& record)
{
    return record.devices.at(0);
}

void insertRequest(lab::RunRecord& record, size_t at, sim::RequestRecord request)
{
    lab::DeviceRecord& device = wide(record);
    device.trace.insert(device.trace.begin() + static_cast<std::ptrdiff_t>(at), request);
    device.updateOf.insert(device.updateOf.begin() + static_cast<std::ptrdiff_t>(at), 0);
    device.stepOf.insert(device.stepOf.begin() + static_cast<std::ptrdiff_t>(at), 1);
}

// Keeps the requests before `from` and after `to` (exclusive).
void dropRequests(lab::RunRecord& record, size_t from, size_t to)
{
    lab::DeviceRecord& device = wide(record);
    auto erase = [&](auto& list) {
        list.erase(list.begin() + static_cast<std::ptrdiff_t>(from),
                   list.begin() + static_cast<std::ptrdiff_t>(std::min(to, list.size())));
    };
    erase(device.trace);
    erase(device.updateOf);
    erase(device.stepOf);
}

void logLine(lab::RunRecord& record, int line, int32_t status)
{
    sim::LogEntry entry;
    entry.component = "morvanek";
    entry.location = "source\\DeviceTable:" + std::to_string(line) + " - ";
    entry.message = "The firmware update failed.  Leaving device 5C1D 4B02 0001E240 in loader mode  Status = " +
                    std::to_string(status);
    record.eventLog.push_back({entry, lab::Owner{0, 0}});
}

// Block 1 fails to write: the update stops there, in loader mode.
void failBlock1(lab::RunRecord& record)
{
    wide(record).trace[kBlock1].outcome = kStalled;
    dropRequests(record, kBlock1 + 1, wide(record).trace.size());
    wide(record).mode = "loader";
}

std::vector<std::string> rulesOf(const std::vector<lab::InvariantViolation>& violations)
{
    std::vector<std::string> rules;
    for (const auto& violation : violations) rules.push_back(violation.rule + " -- " + violation.what);
    return rules;
}

bool hasRule(const std::vector<lab::InvariantViolation>& violations, const std::string& rule)
{
    return std::any_of(violations.begin(), violations.end(), [&](const auto& v) { return v.rule == rule; });
}

struct BrokenRun {
    const char* name;
    std::function<void(lab::RunRecord&)> breakIt;
    const char* rule;  // the invariant that must catch it
};

void PrintTo(const BrokenRun& run, std::ostream* out)
{
    *out << run.name;
}

class RunInvariants : public testing::TestWithParam<BrokenRun> {};

TEST(RunInvariantsOfACleanRun, HoldEveryOne)
{
    ASSERT_EQ(cleanRun().exitCode(), 0) << cleanRun().labError << cleanRun().invalid;
    ASSERT_EQ(wide(const_cast<lab::RunRecord&>(cleanRun().record)).trace.size(), 25u);
    EXPECT_TRUE(lab::checkResultInvariants(cleanRun()).empty())
        << testing::PrintToString(rulesOf(lab::checkResultInvariants(cleanRun())));
}

TEST_P(RunInvariants, CatchTheirFault)
{
    lab::RunRecord record = cleanRun().record;
    GetParam().breakIt(record);
    std::vector<lab::InvariantViolation> violations = lab::checkRunInvariants(record, true);
    EXPECT_TRUE(hasRule(violations, GetParam().rule)) << testing::PrintToString(rulesOf(violations));
}

const BrokenRun kBrokenRuns[] = {
    {"AHostBlockLeftBehind", [](lab::RunRecord& r) { r.leftovers.push_back("1 host allocation(s) live (512 bytes)"); },
     "left behind"},
    {"MisuseOfTheHost", [](lab::RunRecord& r) { r.misuse.push_back("freeBuffer of a buffer that ..."); }, "misuse"},
    {"TheIdentityPageErased",
     [](lab::RunRecord& r) {
         sim::RequestRecord erase = wide(r).trace[4];
         erase.wValue = 0x7C00 / 512;
         insertRequest(r, 5, erase);
     },
     "identity page"},
    {"ABlockWrittenOverTheIdentityPage", [](lab::RunRecord& r) { wide(r).trace[kBlock1].wIndex = 0x7C00; },
     "identity page"},
    {"AWriteBesideTheIdentityBlockBeforeProgramming",
     [](lab::RunRecord& r) {
         sim::RequestRecord write = wide(r).trace[kBlock1];
         write.wIndex = 0x7C00;
         write.length = 2;
         write.data = {0, 0};
         insertRequest(r, 3, write);
     },
     "identity page"},
    {"APageBelowTheFirmwareErased",
     [](lab::RunRecord& r) {
         sim::RequestRecord erase = wide(r).trace[4];
         erase.wValue = 0;
         insertRequest(r, 5, erase);
     },
     "flash outside the firmware area"},
    {"ABlockNeverReadBack", [](lab::RunRecord& r) { dropRequests(r, kBlock1 + 1, kMarker); },
     "marker before verification"},
    {"AReadBackThatDiffered", [](lab::RunRecord& r) { wide(r).trace[10].data[3] ^= 0x01; },
     "marker before verification"},
    {"ABlockProgrammedAsOtherBytesThanTheFileHolds",
     [](lab::RunRecord& r) {
         wide(r).trace[5].data[100] ^= 0x10;
         wide(r).trace[6 + 100 / 64].data[100 % 64] ^= 0x10;
     },
     "image not programmed as read"},
    {"ARestartWithoutTheMarker", [](lab::RunRecord& r) { dropRequests(r, kMarker, kMarker + 1); },
     "restart before the marker"},
    {"ARunningDeviceWithOtherFirmware", [](lab::RunRecord& r) { wide(r).flashAfter[0x0700] ^= 0x01; },
     "firmware not as programmed"},
    {"ASuccessThatLogged", [](lab::RunRecord& r) { logLine(r, 451, 0); }, "success with a message"},
    {"AFailedBlockNotLogged", failBlock1, "failure message"},
    {"AFailedBlockLoggedWithAnotherStatus",
     [](lab::RunRecord& r) {
         failBlock1(r);
         logLine(r, 451, -50207);
     },
     "failure message"},
    {"AFailedIdentityReadThatLogged",
     [](lab::RunRecord& r) {
         wide(r).trace[1].outcome = kStalled;
         dropRequests(r, 2, wide(r).trace.size());
         wide(r).mode = "loader";
         logLine(r, 451, kStalled);
     },
     "failure message"},
    {"ARequestAfterAFailedOne", [](lab::RunRecord& r) { wide(r).trace[10].outcome = kStalled; },
     "request after a failure"},
};

INSTANTIATE_TEST_SUITE_P(BrokenOnPurpose, RunInvariants, testing::ValuesIn(kBrokenRuns),
                         [](const testing::TestParamInfo<BrokenRun>& info) { return std::string(info.param.name); });

TEST(RunInvariantsOfAResult, SayWhenTheLabItselfFailed)
{
    lab::ScenarioResult failed;
    failed.labError = "cannot load the module";
    EXPECT_TRUE(hasRule(lab::checkResultInvariants(failed), "lab error"));
}

TEST(FaultExpectation, CatchesAnEndingTheFaultDoesNotCallFor)
{
    using Ending = lab::FaultExpectation::Ending;
    lab::RunRecord failedAtBlock1 = cleanRun().record;
    failBlock1(failedAtBlock1);
    logLine(failedAtBlock1, 451, -50207);

    struct Case {
        const char* name;
        const lab::RunRecord& record;
        lab::FaultExpectation expected;
        const char* rule;  // empty: nothing to find
    };
    auto expectation = [](Ending ending, std::optional<int32_t> status, int line, std::optional<std::string> mode) {
        lab::FaultExpectation expected;
        expected.device = 0;
        expected.ending = ending;
        expected.status = status;
        expected.verificationLine = line;
        expected.verificationBlock = 1;
        expected.finalMode = mode;
        return expected;
    };
    const Case cases[] = {
        {"a clean success where a failure was due", cleanRun().record,
         expectation(Ending::failsSilently, std::nullopt, 0, std::nullopt), "fault not reported"},
        {"product mode where the loader was due", cleanRun().record,
         expectation(Ending::any, std::nullopt, 0, std::string("loader")), "did not recover"},
        {"the status it was due", failedAtBlock1, expectation(Ending::failsLogged, -50207, 0, std::string("loader")), ""},
        {"another status", failedAtBlock1, expectation(Ending::failsLogged, kStalled, 0, std::nullopt), "failure message"},
        {"no verification line", failedAtBlock1, expectation(Ending::failsLogged, -50207, 421, std::nullopt),
         "failure message"},
        {"a message where none was due", failedAtBlock1, expectation(Ending::failsSilently, std::nullopt, 0, std::nullopt),
         "failure message"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        std::vector<lab::InvariantViolation> violations = lab::checkFaultExpectation(c.record, c.expected);
        if (std::string(c.rule).empty()) {
            EXPECT_TRUE(violations.empty()) << testing::PrintToString(rulesOf(violations));
        } else {
            EXPECT_TRUE(hasRule(violations, c.rule)) << testing::PrintToString(rulesOf(violations));
        }
    }
}

std::string freshFolder(const std::string& name)
{
    // Runs of this program side by side (and of other builds) each get their own.
    std::filesystem::path folder =
        std::filesystem::path(testing::TempDir()) / (name + "-" + std::to_string(::getpid()));
    std::filesystem::remove_all(folder);
    return folder.string();
}

TEST(SweepCommand, RunsEveryFaultPositionOfTheScenarioAndFindsNoViolation)
{
    Outcome sweep = runLab("sweep --json --reproducers " + freshFolder("sweep-clean") + " " + kScenarios +
                           "/loader-4a20.json");
    ASSERT_EQ(sweep.exitCode, 0) << sweep.output;
    nlohmann::json report = nlohmann::json::parse(sweep.output);
    EXPECT_EQ(report["clean"]["devices"][0]["requests"], 25);
    EXPECT_TRUE(report["violations"].empty());
    // One run per request, per block and per erased page of the clean run.
    const std::pair<const char*, int> expectedRuns[] = {
        {"failedRequest", 25}, {"unplug", 25}, {"lostStatus", 25}, {"readCorruption", 2},
        {"stuckBits", 2},      {"deadErase", 2}, {"releaseFailure", 2},
    };
    for (const auto& expected : expectedRuns) {
        const std::string kind = expected.first;
        auto entry = std::find_if(report["kinds"].begin(), report["kinds"].end(),
                                  [&](const nlohmann::json& k) { return k["kind"] == kind; });
        ASSERT_NE(entry, report["kinds"].end()) << kind;
        EXPECT_EQ((*entry)["runs"], expected.second) << kind;
        EXPECT_EQ((*entry)["violatingRuns"], 0) << kind;
    }
}

TEST(SweepCommand, CatchesAModuleThatTakesEveryBlockAsVerifiedAndWritesAReproducer)
{
    const std::string folder = freshFolder("sweep-unverified");
    const std::string unverified = std::string("--module ") + MORVANEK_UNVERIFIED_MODULE;
    // Clean, the broken module looks as good as the real one.
    EXPECT_EQ(runLab("sweep --faults none " + unverified + " " + kScenarios + "/loader-4a20.json").exitCode, 0);

    Outcome sweep = runLab("sweep --json --faults readCorruption --reproducers " + folder + " " + unverified + " " +
                           kScenarios + "/loader-4a20.json");
    ASSERT_EQ(sweep.exitCode, 1) << sweep.output;
    nlohmann::json report = nlohmann::json::parse(sweep.output);
    ASSERT_FALSE(report["violations"].empty());
    std::set<std::string> rules;
    for (const nlohmann::json& violation : report["violations"]) rules.insert(violation["rule"]);
    EXPECT_EQ(rules, (std::set<std::string>{"marker before verification", "fault not reported"}));
    EXPECT_EQ(report["kinds"][0]["violatingRuns"], 2);

    // The reproducer shows the same with the broken module, and nothing with the real one.
    std::string reproducer = report["violations"][0]["reproducer"];
    ASSERT_TRUE(std::filesystem::exists(reproducer)) << reproducer;
    Outcome again = runLab("sweep --faults none " + unverified + " " + reproducer);
    EXPECT_EQ(again.exitCode, 1) << again.output;
    EXPECT_NE(again.output.find("marker before verification"), std::string::npos) << again.output;
    EXPECT_EQ(runLab("sweep --faults none " + reproducer).exitCode, 0);
}

TEST(SweepCommand, RefusesAnUnknownKindOfFault)
{
    EXPECT_EQ(runLab("sweep --faults failedRequest,meteorStrike " + kScenarios + "/loader-4a20.json").exitCode, 2);
}

}  // namespace
