// Runs a scenario's steps in its world and takes the record of what happened.
#pragma once

#include "runRecord.h"
#include "world.h"

namespace lab {

// Takes every step in order; a step that cannot be taken is recorded with its
// problem and the run goes on.
std::vector<StepRecord> runSteps(const Scenario& scenario, World& world);

// What the world shows now; call before the world goes.
RunRecord takeRecord(const Scenario& scenario, World& world, std::vector<StepRecord> steps);

}  // namespace lab
