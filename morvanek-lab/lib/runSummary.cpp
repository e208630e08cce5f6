// The closing lines of a run of several scenarios: how many passed, failed or
// were invalid, and how long each scenario keeps the bus busy when its devices
// are served one after another.
#include <algorithm>

#include <fmt/format.h>

#include "busTimeline.h"
#include "deviceStory.h"
#include "reports.h"

namespace lab {

namespace {

const char* verdict(const ScenarioResult& result)
{
    switch (result.exitCode()) {
    case kExitSuccess:
        return "PASS";
    case kExitExpectationFailed:
        return "FAIL";
    case kExitScenarioInvalid:
        return "INVALID";
    default:
        return "LAB ERROR";
    }
}

}  // namespace

void printSummary(std::FILE* out, const std::vector<ScenarioResult>& results)
{
    if (results.size() < 2) return;
    size_t passed = 0, failed = 0, invalid = 0, labErrors = 0;
    size_t width = 0;
    for (const ScenarioResult& result : results) {
        int code = result.exitCode();
        passed += code == kExitSuccess;
        failed += code == kExitExpectationFailed;
        invalid += code == kExitScenarioInvalid;
        labErrors += code == kExitLabError;
        width = std::max(width, result.file.size());
    }
    fmt::print(out, "\n{} scenarios: {} passed, {} failed, {} invalid{}\n", results.size(), passed, failed, invalid,
               labErrors == 0 ? "" : fmt::format(", {} lab error(s)", labErrors));
    for (const ScenarioResult& result : results) {
        std::string bus;
        if (result.scenario && result.invalid.empty() && result.labError.empty()) {
            const RunRecord& record = result.record;
            bus = fmt::format("bus time {} ({} device(s), {} request(s))", durationText(layOutBusTimeline(record).total),
                              record.devices.size(), record.requestOrder.size());
        }
        std::string line = fmt::format("  {:<9} {:<{}}  {}", verdict(result), result.file, width, bus);
        while (line.back() == ' ') line.pop_back();
        fmt::print(out, "{}\n", line);
    }
}

}  // namespace lab
