// Reads the text of a scenario into a JSON value, refusing what would make the
// lab guess or stall: syntax errors (with their reason and place), keys given
// twice, integers too large to hold, binary or empty files, and input past the
// lab's limits. Linear in the size of the text.
#pragma once

#include <cstddef>
#include <string>

#include <nlohmann/json.hpp>

namespace lab {

// Past these the lab refuses a scenario rather than spend minutes on it.
constexpr size_t kMaxScenarioBytes = 64 * 1024 * 1024;
constexpr size_t kMaxStringBytes = 4 * 1024 * 1024;
constexpr size_t kMaxNesting = 64;

// Throws ScenarioError naming the file and the place (a JSON pointer, or a
// line and column for a syntax error).
nlohmann::json readJsonText(const std::string& text, const std::string& fileName);

}  // namespace lab
