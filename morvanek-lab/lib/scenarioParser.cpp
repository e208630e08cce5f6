#include "scenarioParser.h"

#include <fstream>
#include <istream>

#include <fmt/format.h>

#include "jsonText.h"
#include "parseParts.h"

namespace lab {

namespace {

// A stream's text, stopping one byte past what the lab takes so that the
// limit can be told apart from a file that fits it.
std::string readAtMost(std::istream& in, size_t limit)
{
    std::string text;
    char buffer[65536];
    while (text.size() < limit && in.read(buffer, sizeof buffer).gcount() > 0) {
        text.append(buffer, static_cast<size_t>(in.gcount()));
    }
    if (text.size() > limit) text.resize(limit);
    return text;
}

}  // namespace

Scenario parseScenarioText(const std::string& text, const std::string& fileName, const std::filesystem::path& directory)
{
    nlohmann::json document = readJsonText(text, fileName);
    JsonNode root(document, fileName);
    root.allowOnly({"description", "host", "registry", "drives", "fileFaults", "devices", "steps", "expect"});

    Scenario scenario;
    scenario.file = fileName;
    scenario.directory = directory;
    if (auto node = root.optionalField("description")) scenario.description = node->text();
    if (auto node = root.optionalField("host")) scenario.host = parseHost(*node);
    if (auto node = root.optionalField("registry")) scenario.registry = parseRegistry(*node, directory);
    if (auto node = root.optionalField("drives")) scenario.drives = parseDrives(*node, directory);
    if (auto node = root.optionalField("fileFaults")) scenario.fileFaults = parseFileFaults(*node);
    if (auto node = root.optionalField("devices")) scenario.devices = parseDevices(*node, directory);
    if (auto node = root.optionalField("steps")) {
        scenario.steps = parseSteps(*node, scenario.devices);
    } else {
        // The usual life of the module: loaded, started, stopped, unloaded.
        nlohmann::json usual = {"load", "start", "stop", "unload"};
        scenario.steps = parseSteps(JsonNode(usual, fileName), scenario.devices);
        for (StepPlan& step : scenario.steps) step.pointer = "(default step " + step.pointer.substr(1) + ")";
    }
    if (auto node = root.optionalField("expect")) scenario.expect = parseExpectations(*node, scenario.devices);
    return scenario;
}

Scenario loadScenarioFile(const std::filesystem::path& path)
{
    std::error_code error;
    if (std::filesystem::is_directory(path, error)) throw ScenarioError(path.string(), "", "is a directory, not a scenario file");
    std::ifstream in(path, std::ios::binary);
    if (!in) {
        bool exists = std::filesystem::exists(path, error);
        throw ScenarioError(path.string(), "", exists ? "cannot be read" : "no such file");
    }
    // Refused before it is read: a file past the limit could take all memory.
    uintmax_t size = std::filesystem::file_size(path, error);
    if (!error && size > kMaxScenarioBytes)
        throw ScenarioError(path.string(), "",
                            fmt::format("{} bytes; the lab takes scenarios of at most {} MiB", size,
                                        kMaxScenarioBytes / (1024 * 1024)));
    std::string text = readAtMost(in, kMaxScenarioBytes + 1);
    std::filesystem::path directory = path.parent_path();
    if (directory.empty()) directory = ".";
    return parseScenarioText(text, path.string(), directory);
}

Scenario loadScenarioStream(std::istream& in, const std::string& name, const std::filesystem::path& directory)
{
    return parseScenarioText(readAtMost(in, kMaxScenarioBytes + 1), name, directory);
}

}  // namespace lab
