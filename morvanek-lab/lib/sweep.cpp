#include "sweep.h"

#include <algorithm>
#include <chrono>
#include <cstdlib>
#include <fstream>
#include <map>
#include <sstream>

#include <fmt/format.h>

#include "faultExpectation.h"
#include "progress.h"
#include "reproducerScenario.h"
#include "scenarioError.h"
#include "scenarioParser.h"
#include "sweepPlan.h"

namespace lab {

namespace {

std::string readText(const std::filesystem::path& path)
{
    std::ifstream in(path, std::ios::binary);
    std::ostringstream text;
    text << in.rdbuf();
    return text.str();
}

std::filesystem::path folderOf(const std::filesystem::path& path)
{
    std::filesystem::path folder = path.parent_path();
    return folder.empty() ? std::filesystem::path(".") : folder;
}

std::vector<InvariantViolation> checkRun(const ScenarioResult& result, const FaultExpectation* expected)
{
    std::vector<InvariantViolation> violations = checkResultInvariants(result);
    if (expected != nullptr && result.labError.empty() && result.invalid.empty()) {
        for (InvariantViolation& violation : checkFaultExpectation(result.record, *expected))
            violations.push_back(std::move(violation));
    }
    return violations;
}

class Sweeper {
public:
    Sweeper(const std::filesystem::path& path, const SweepOptions& options)
        : path_(path), folder_(folderOf(path)), options_(options),
          progress_(stderr, Progress::styleFor(std::getenv("TERM")))
    {
        runOptions_.modulePath = options.modulePath;
    }

    SweepResult run()
    {
        auto started = std::chrono::steady_clock::now();
        result_.file = path_.string();
        try {
            Scenario scenario = loadScenarioFile(path_);
            ScenarioDocument document = ScenarioDocument::parse(readText(path_));
            result_.clean = runScenario(scenario, runOptions_);
            ++result_.runs;
            if (!result_.clean.invalid.empty()) result_.invalid = result_.clean.invalid;
            if (!result_.clean.labError.empty()) result_.labError = result_.clean.labError;
            for (InvariantViolation& violation : checkRun(result_.clean, nullptr))
                result_.violations.push_back({std::nullopt, "clean run", std::move(violation), ""});
            if (result_.exitCode() < kExitScenarioInvalid) faultRuns(document);
        } catch (const ScenarioError& error) {
            result_.invalid = error.what();
        } catch (const LabError& error) {
            result_.labError = error.what();
        } catch (const nlohmann::json::exception& error) {
            result_.invalid = path_.string() + ": " + error.what();
        }
        progress_.clear();
        result_.seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - started).count();
        return std::move(result_);
    }

private:
    void faultRuns(const ScenarioDocument& document)
    {
        std::vector<FaultRun> runs = planFaultRuns(document, result_.clean.record, options_.kinds);
        std::map<SweepKind, size_t> totals;
        for (const FaultRun& run : runs) ++totals[run.kind];
        for (SweepKind kind : options_.kinds) {
            if (std::none_of(result_.kinds.begin(), result_.kinds.end(), [&](const KindSummary& k) { return k.kind == kind; }))
                result_.kinds.push_back(KindSummary{kind, 0, 0, {}});
        }
        for (const FaultRun& run : runs) {
            KindSummary& summary = summaryOf(run.kind);
            if (options_.progress && progress_.due())
                progress_.show(fmt::format("  sweeping {}: {} {} of {}", path_.filename().string(),
                                           sweepKindName(run.kind), summary.runs + 1, totals[run.kind]));
            faultRun(run, summary);
        }
    }

    KindSummary& summaryOf(SweepKind kind)
    {
        for (KindSummary& summary : result_.kinds) {
            if (summary.kind == kind) return summary;
        }
        result_.kinds.push_back(KindSummary{kind, 0, 0, {}});
        return result_.kinds.back();
    }

    void faultRun(const FaultRun& run, KindSummary& summary)
    {
        ScenarioResult outcome;
        try {
            Scenario scenario = parseScenarioText(run.scenario.dump(), path_.string(), folder_);
            outcome = runScenario(scenario, runOptions_);
        } catch (const ScenarioError& error) {
            outcome.file = path_.string();
            outcome.invalid = error.what();
        }
        ++summary.runs;
        ++result_.runs;
        std::string ending = !outcome.labError.empty()  ? "lab error"
                             : !outcome.invalid.empty() ? "refused by the scenario reader"
                                                        : describeOutcome(outcome.record);
        auto known = std::find_if(summary.outcomes.begin(), summary.outcomes.end(),
                                  [&](const auto& entry) { return entry.first == ending; });
        if (known == summary.outcomes.end()) {
            summary.outcomes.emplace_back(ending, 1);
        } else {
            ++known->second;
        }

        std::vector<InvariantViolation> violations = checkRun(outcome, &run.expected);
        if (violations.empty()) return;
        ++summary.violatingRuns;
        if (!outcome.labError.empty() && result_.labError.empty()) result_.labError = outcome.labError;
        std::string reproducer;
        if (summary.violatingRuns <= options_.reproducersPerKind) reproducer = writeFor(run, summary, violations.front());
        for (InvariantViolation& violation : violations)
            result_.violations.push_back({run.kind, run.position, std::move(violation), reproducer});
    }

    std::string writeFor(const FaultRun& run, const KindSummary& summary, const InvariantViolation& violation)
    {
        std::string name = fmt::format("{}.{}.{}", path_.stem().string(), sweepKindName(run.kind), summary.violatingRuns);
        std::string description =
            fmt::format("reproduces a sweep of {}: {} at {}: {}{}: {}. Run it with: morvanek-lab sweep FILE --faults none",
                        path_.filename().string(), sweepKindName(run.kind), run.position, violation.rule,
                        violation.device.empty() ? "" : " (" + violation.device + ")", violation.what);
        try {
            return writeReproducer(run.scenario, folder_, options_.reproducerFolder, name, description).string();
        } catch (const LabError& error) {
            return std::string("not written: ") + error.what();
        }
    }

    std::filesystem::path path_;
    std::filesystem::path folder_;
    const SweepOptions& options_;
    RunOptions runOptions_;
    Progress progress_;
    SweepResult result_;
};

}  // namespace

int SweepResult::exitCode() const
{
    if (!labError.empty()) return kExitLabError;
    if (!invalid.empty()) return kExitScenarioInvalid;
    bool refused = std::any_of(violations.begin(), violations.end(),
                               [](const SweepViolation& v) { return v.violation.rule == "scenario refused"; });
    if (refused) return kExitLabError;  // the sweep wrote a scenario its own reader refuses
    if (!violations.empty() || !clean.expectations.failures.empty()) return kExitExpectationFailed;
    return kExitSuccess;
}

SweepResult sweepScenarioFile(const std::filesystem::path& path, const SweepOptions& options)
{
    return Sweeper(path, options).run();
}

std::string describeOutcome(const RunRecord& record)
{
    std::vector<std::string> devices;
    for (size_t d = 0; d < record.devices.size(); ++d) {
        const DeviceRecord& device = record.devices[d];
        if (device.layout == nullptr) continue;
        std::vector<std::string> lines;
        for (const LogRecord& line : record.eventLog) {
            if (line.owner.device != static_cast<int>(d)) continue;
            std::string text = std::to_string(logLineNumber(line.entry.location));
            if (std::optional<int32_t> status = loggedStatus(line.entry.message)) text += fmt::format(" ({})", *status);
            lines.push_back(text);
        }
        std::string text = fmt::format("{}: {}", device.name, device.mode);
        if (device.updates > 1) text += fmt::format(" after {} updates", device.updates);
        if (device.updates == 0) text += ", not updated";
        if (!lines.empty()) text += fmt::format(", logged {}", fmt::join(lines, ", "));
        devices.push_back(text);
    }
    if (devices.empty()) return "no device";
    return fmt::format("{}", fmt::join(devices, "; "));
}

}  // namespace lab
