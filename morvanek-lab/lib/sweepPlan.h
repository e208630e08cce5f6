// The runs of a sweep. The clean run shows where faults can strike: each
// device's requests and blocks, the host's allocations, the registry and file
// calls. For every such place and every kind asked for, the scenario is
// copied with that one fault written into it, together with what the fault
// must lead to.
#pragma once

#include <string>
#include <vector>

#include <nlohmann/json.hpp>

#include "faultExpectation.h"
#include "runRecord.h"
#include "sweepKinds.h"

namespace lab {

// A scenario file as JSON, its fields in the order they were written.
using ScenarioDocument = nlohmann::ordered_json;

struct FaultRun {
    SweepKind kind = SweepKind::failedRequest;
    std::string position;       // where the fault strikes, for people: "bench request 12 (write 0x0200 512)"
    ScenarioDocument scenario;  // the scenario with the fault, without its own expectations
    FaultExpectation expected;
};

std::vector<FaultRun> planFaultRuns(const ScenarioDocument& document, const RunRecord& clean,
                                    const std::vector<SweepKind>& kinds);

}  // namespace lab
