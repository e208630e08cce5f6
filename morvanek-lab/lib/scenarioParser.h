// Reads a scenario file into a Scenario, or throws ScenarioError naming the
// file, the place in it and what is wrong.
#pragma once

#include <filesystem>
#include <iosfwd>
#include <string>

#include "scenario.h"

namespace lab {

Scenario loadScenarioFile(const std::filesystem::path& path);
// A scenario read from a stream such as standard input, named `name` in
// messages; files it names are found relative to `directory`.
Scenario loadScenarioStream(std::istream& in, const std::string& name, const std::filesystem::path& directory);
// The text of a scenario; files it names are found relative to `directory`.
Scenario parseScenarioText(const std::string& text, const std::string& fileName,
                           const std::filesystem::path& directory);

}  // namespace lab
