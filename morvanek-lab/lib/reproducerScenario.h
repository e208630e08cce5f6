// A scenario that reproduces one run of a sweep, written out as a file of its
// own: the files it names are made absolute, so that it runs from anywhere.
#pragma once

#include <filesystem>
#include <string>

#include "sweepPlan.h"

namespace lab {

// Writes `scenario` (whose relative paths are relative to `scenarioFolder`)
// into `folder` as `name`.json with the description given; returns its path.
// Throws LabError when it cannot be written.
std::filesystem::path writeReproducer(ScenarioDocument scenario, const std::filesystem::path& scenarioFolder,
                                      const std::filesystem::path& folder, const std::string& name,
                                      const std::string& description);

}  // namespace lab
