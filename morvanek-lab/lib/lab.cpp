#include "lab.h"

#include <algorithm>
#include <cstdlib>

#include <fmt/format.h>
#include <iostream>

#include "findings.h"
#include "runner.h"
#include "scenarioError.h"
#include "scenarioParser.h"
#include "world.h"

namespace lab {

int ScenarioResult::exitCode() const
{
    if (!labError.empty()) return kExitLabError;
    if (!invalid.empty()) return kExitScenarioInvalid;
    return expectations.failures.empty() ? kExitSuccess : kExitExpectationFailed;
}

ScenarioResult runScenario(const Scenario& scenario, const RunOptions& options)
{
    ScenarioResult result;
    result.file = scenario.file;
    result.scenario = scenario;
    Progress progress(stderr, Progress::styleFor(std::getenv("TERM")));
    std::string prefix;
    if (options.scenarioCount > 1) prefix = fmt::format("[{}/{}] {}", options.scenarioNumber, options.scenarioCount, result.file);
    try {
        Progress* display = options.progressDisplay != nullptr ? options.progressDisplay : &progress;
        World world(*result.scenario, options.modulePath, options.progress ? display : nullptr, prefix);
        std::vector<StepRecord> steps = runSteps(*result.scenario, world);
        result.record = takeRecord(*result.scenario, world, std::move(steps));
        result.record.findings = findFindings(result.record);
        result.expectations = checkExpectations(*result.scenario, result.record, world);
    } catch (const ScenarioError& error) {
        result.invalid = error.what();
    } catch (const LabError& error) {
        result.labError = error.what();
    } catch (const std::exception& error) {
        // Whatever went wrong stays this scenario's: the others still run and report.
        result.labError = std::string("the lab failed: ") + error.what();
    }
    progress.clear();
    return result;
}

ScenarioResult runScenarioFile(const std::filesystem::path& path, const RunOptions& options)
{
    ScenarioResult result;
    result.file = path.string();
    try {
        if (path == kStandardInput) {
            result.file = "(standard input)";
            return runScenario(loadScenarioStream(std::cin, result.file, std::filesystem::current_path()), options);
        }
        return runScenario(loadScenarioFile(path), options);
    } catch (const ScenarioError& error) {
        result.invalid = error.what();
    } catch (const std::exception& error) {
        result.labError = std::string("the lab failed: ") + error.what();
    }
    return result;
}

int combinedExitCode(const std::vector<ScenarioResult>& results)
{
    int worst = kExitSuccess;
    auto rank = [](int code) { return code == kExitLabError ? 3 : code == kExitScenarioInvalid ? 2 : code; };
    for (const ScenarioResult& result : results) {
        if (rank(result.exitCode()) > rank(worst)) worst = result.exitCode();
    }
    return worst;
}

}  // namespace lab
