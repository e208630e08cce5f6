// The lab's commands as a library: run scenarios and say what happened.
#pragma once

#include <cstdint>
#include <filesystem>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "expectations.h"
#include "progress.h"
#include "runRecord.h"
#include "scenario.h"

namespace lab {

enum ExitCode : int {
    kExitSuccess = 0,
    kExitExpectationFailed = 1,
    kExitScenarioInvalid = 2,  // also a command line the lab cannot use
    kExitLabError = 3,
};

struct MemoryRange {
    uint16_t address = 0;
    size_t length = 0;
};

struct RunOptions {
    std::string modulePath;  // empty: the module built beside the lab
    bool progress = false;   // a progress line on standard error (a terminal)
    size_t scenarioNumber = 1;  // of scenarioCount, for the progress line
    size_t scenarioCount = 1;
    Progress* progressDisplay = nullptr;  // where progress goes instead of standard error (tests)
    bool trace = false;      // the request trace, for people
    std::vector<MemoryRange> memoryRanges;  // shown per device in the report
};

struct ScenarioResult {
    std::string file;
    std::optional<Scenario> scenario;
    std::string invalid;   // the scenario could not be used
    std::string labError;  // the lab could not run it
    RunRecord record;
    ExpectationOutcome expectations;

    int exitCode() const;
};

ScenarioResult runScenario(const Scenario& scenario, const RunOptions& options);
// "-" reads the scenario from standard input; files it names are then found
// relative to the current folder.
constexpr const char* kStandardInput = "-";
ScenarioResult runScenarioFile(const std::filesystem::path& path, const RunOptions& options);
// The worst of the results: a lab error, then an invalid scenario, then a failed expectation.
int combinedExitCode(const std::vector<ScenarioResult>& results);

}  // namespace lab
