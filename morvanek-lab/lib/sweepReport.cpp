// What a sweep shows: the clean run's figures, a table per fault kind (runs,
// how they ended, violations), and each violation with the scenario that
// reproduces it; for people and as JSON.
#include <fmt/format.h>

#include "sweep.h"

namespace lab {

namespace {

struct CleanFigures {
    std::vector<std::string> devices;  // "bench-left 69 requests in 1 update"
    size_t allocations = 0;
    size_t registryCalls = 0;
    size_t fileOpens = 0;
    size_t fileReads = 0;
};

CleanFigures cleanFigures(const RunRecord& record)
{
    CleanFigures figures;
    for (const DeviceRecord& device : record.devices) {
        figures.devices.push_back(fmt::format("{} {} requests in {} update(s)", device.name, device.trace.size(),
                                              device.updates));
    }
    figures.allocations = record.allocationAttempts.size();
    figures.registryCalls = record.registryCalls.size();
    figures.fileOpens = record.fileOpens.size();
    figures.fileReads = record.fileReads.size();
    return figures;
}

std::string violationText(const SweepViolation& violation)
{
    const InvariantViolation& v = violation.violation;
    return fmt::format("{}: {}{}", v.rule, v.device.empty() ? "" : v.device + ": ", v.what);
}

std::string kindText(const SweepViolation& violation)
{
    return violation.kind ? sweepKindName(*violation.kind) : "clean run";
}

}  // namespace

void printSweepReport(std::FILE* out, const SweepResult& result)
{
    std::string description = result.clean.scenario ? result.clean.scenario->description : "";
    fmt::print(out, "sweep  {}{}\n", result.file, description.empty() ? "" : ": " + description);
    if (!result.invalid.empty()) fmt::print(out, "  invalid scenario: {}\n", result.invalid);
    if (!result.labError.empty()) fmt::print(out, "  lab error: {}\n", result.labError);
    if (result.clean.scenario) {
        CleanFigures figures = cleanFigures(result.clean.record);
        fmt::print(out, "  clean run: {}; {}; {} host allocation(s), {} registry call(s), {} file open(s), {} file "
                        "read(s)\n",
                   result.clean.expectations.failures.empty() ? "its expectations met" : "EXPECTATIONS NOT MET",
                   fmt::join(figures.devices, ", "), figures.allocations, figures.registryCalls, figures.fileOpens,
                   figures.fileReads);
        for (const ExpectationFailure& failure : result.clean.expectations.failures)
            fmt::print(out, "    {}: {}\n", failure.place, failure.what);
    }
    if (!result.kinds.empty()) fmt::print(out, "  {:<18}{:>6}{:>12}  how the runs ended\n", "fault", "runs", "violations");
    for (const KindSummary& kind : result.kinds) {
        std::string first = kind.outcomes.empty() ? "" : fmt::format("{:>5}  {}", kind.outcomes[0].second, kind.outcomes[0].first);
        fmt::print(out, "  {:<18}{:>6}{:>12}  {}\n", sweepKindName(kind.kind), kind.runs, kind.violatingRuns, first);
        for (size_t i = 1; i < kind.outcomes.size(); ++i)
            fmt::print(out, "  {:<36}  {:>5}  {}\n", "", kind.outcomes[i].second, kind.outcomes[i].first);
    }
    for (const SweepViolation& violation : result.violations) {
        fmt::print(out, "  VIOLATION  {} at {}: {}\n", kindText(violation), violation.position, violationText(violation));
        if (!violation.reproducer.empty())
            fmt::print(out, "    reproduce: morvanek-lab sweep {} --faults none\n", violation.reproducer);
    }
    size_t kinds = result.kinds.size();
    switch (result.exitCode()) {
    case kExitSuccess:
        fmt::print(out, "PASS  {}: {} runs, {} fault kind(s), no violations ({:.1f} s)\n", result.file, result.runs, kinds,
                   result.seconds);
        break;
    case kExitExpectationFailed:
        fmt::print(out, "FAIL  {}: {} violation(s) in {} runs ({:.1f} s)\n", result.file, result.violations.size(),
                   result.runs, result.seconds);
        break;
    case kExitScenarioInvalid:
        fmt::print(out, "INVALID  {}\n", result.file);
        break;
    default:
        fmt::print(out, "ERROR  {}: the lab could not run it\n", result.file);
        break;
    }
}

nlohmann::json sweepJsonReport(const SweepResult& result)
{
    using json = nlohmann::json;
    json report = {{"scenario", result.file}, {"exitCode", result.exitCode()}, {"runs", result.runs},
                   {"seconds", result.seconds}};
    if (!result.invalid.empty()) report["invalid"] = result.invalid;
    if (!result.labError.empty()) report["labError"] = result.labError;
    if (result.clean.scenario) {
        CleanFigures figures = cleanFigures(result.clean.record);
        json failures = json::array();
        for (const ExpectationFailure& failure : result.clean.expectations.failures)
            failures.push_back({{"place", failure.place}, {"what", failure.what}});
        json devices = json::array();
        for (const DeviceRecord& device : result.clean.record.devices)
            devices.push_back({{"name", device.name}, {"requests", device.trace.size()}, {"updates", device.updates},
                               {"mode", device.mode}});
        report["clean"] = {{"expectationsMet", failures.empty()}, {"expectationFailures", failures},
                           {"devices", devices}, {"allocations", figures.allocations},
                           {"registryCalls", figures.registryCalls}, {"fileOpens", figures.fileOpens},
                           {"fileReads", figures.fileReads}};
    }
    json kinds = json::array();
    for (const KindSummary& kind : result.kinds) {
        json outcomes = json::array();
        for (const auto& [ending, runs] : kind.outcomes) outcomes.push_back({{"outcome", ending}, {"runs", runs}});
        kinds.push_back({{"kind", sweepKindName(kind.kind)}, {"runs", kind.runs}, {"violatingRuns", kind.violatingRuns},
                         {"outcomes", outcomes}});
    }
    report["kinds"] = kinds;
    json violations = json::array();
    for (const SweepViolation& violation : result.violations) {
        json entry = {{"kind", kindText(violation)}, {"position", violation.position},
                      {"rule", violation.violation.rule}, {"device", violation.violation.device},
                      {"what", violation.violation.what}};
        if (!violation.reproducer.empty()) entry["reproducer"] = violation.reproducer;
        violations.push_back(entry);
    }
    report["violations"] = violations;
    return report;
}

}  // namespace lab
