// morvanek-lab sweep: a scenario run once clean, then once per fault position
// for every kind of fault asked for, each run checked against the loader's
// invariants and against what its fault must lead to.
#pragma once

#include <cstdio>
#include <filesystem>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include <nlohmann/json.hpp>

#include "lab.h"
#include "runInvariants.h"
#include "sweepKinds.h"

namespace lab {

struct SweepOptions {
    std::string modulePath;  // empty: the module built beside the lab
    std::vector<SweepKind> kinds = allSweepKinds();
    bool progress = false;  // a progress line on standard error (a terminal)
    std::filesystem::path reproducerFolder = "sweep-reproducers";
    size_t reproducersPerKind = 5;
};

struct SweepViolation {
    std::optional<SweepKind> kind;  // unset: the clean run
    std::string position;
    InvariantViolation violation;
    std::string reproducer;  // the scenario file written for it, if any
};

struct KindSummary {
    SweepKind kind = SweepKind::failedRequest;
    size_t runs = 0;
    size_t violatingRuns = 0;
    std::vector<std::pair<std::string, size_t>> outcomes;  // how runs ended, in order of first appearance
};

struct SweepResult {
    std::string file;
    std::string invalid;   // the scenario could not be used
    std::string labError;  // a run could not be made
    ScenarioResult clean;
    std::vector<KindSummary> kinds;
    std::vector<SweepViolation> violations;
    size_t runs = 0;  // the clean one included
    double seconds = 0;

    int exitCode() const;
};

SweepResult sweepScenarioFile(const std::filesystem::path& path, const SweepOptions& options);

// How a run ended, device by device, in a few words: "bench: loader, logged 451 (-52002)".
std::string describeOutcome(const RunRecord& record);

void printSweepReport(std::FILE* out, const SweepResult& result);
nlohmann::json sweepJsonReport(const SweepResult& result);

}  // namespace lab
