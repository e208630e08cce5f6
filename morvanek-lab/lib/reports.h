// The two ways the lab tells what happened: text for people, JSON for programs.
#pragma once

#include <cstdio>
#include <vector>

#include <nlohmann/json.hpp>

#include "lab.h"

namespace lab {

void printTextReport(std::FILE* out, const ScenarioResult& result, const RunOptions& options);
void printSummary(std::FILE* out, const std::vector<ScenarioResult>& results);

// One document for all scenarios of a run.
nlohmann::json jsonReport(const std::vector<ScenarioResult>& results, const RunOptions& options);

// FNV-1a, 64 bits: enough to tell two flash contents apart at a glance.
uint64_t fnv1a64(const std::vector<uint8_t>& bytes);

}  // namespace lab
