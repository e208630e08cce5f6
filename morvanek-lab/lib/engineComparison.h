// Runs of one scenario on the two engines, compared: the same reports must
// come out of the Linux module and of morvanek.sys under Wine.
#pragma once

#include <cstdio>
#include <string>
#include <vector>

#include "lab.h"

namespace lab {

// Where the two runs differ, one line each (at most a screenful); empty when
// they agree on everything the reports show, and on every kernel call.
std::vector<std::string> compareEngineRuns(const ScenarioResult& linuxRun, const ScenarioResult& windowsRun,
                                           const RunOptions& options);

// The comparison's lines for the text report; nothing when one engine ran.
void printEngineComparison(std::FILE* out, const ScenarioResult& result);

}  // namespace lab
