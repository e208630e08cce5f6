#include "scenarioParser.h"

#include <fstream>
#include <memory>
#include <set>
#include <sstream>

#include <fmt/format.h>

#include "parseParts.h"

namespace lab {

namespace {

// nlohmann reports a byte offset; people want a line and a column.
std::string lineAndColumn(const std::string& text, size_t byte)
{
    size_t line = 1;
    size_t column = 1;
    for (size_t i = 0; i + 1 < byte && i < text.size(); ++i) {
        if (text[i] == '\n') {
            ++line;
            column = 1;
        } else {
            ++column;
        }
    }
    return fmt::format("line {}, column {}", line, column);
}

// The parser's message carries its own position prefix; keep only what is wrong.
std::string syntaxProblem(const nlohmann::json::parse_error& error)
{
    std::string what = error.what();
    size_t colon = what.rfind(": ");
    return colon == std::string::npos ? what : "JSON syntax error: " + what.substr(colon + 2);
}

// Duplicate keys would silently win or lose; a scenario with one is refused,
// at the place of the second one.
class DuplicateKeyCheck {
public:
    bool operator()(nlohmann::json::parse_event_t event, const nlohmann::json& parsed)
    {
        using Event = nlohmann::json::parse_event_t;
        switch (event) {
        case Event::object_start:
        case Event::array_start:
            frames_.push_back({event == Event::array_start, 0, "", {}});
            break;
        case Event::key:
            frames_.back().key = parsed.get<std::string>();
            if (!frames_.back().keys.insert(frames_.back().key).second && duplicate_.empty()) {
                duplicate_ = frames_.back().key;
                place_ = pointer();
            }
            break;
        case Event::object_end:
        case Event::array_end:
            frames_.pop_back();
            elementDone();
            break;
        case Event::value:
            elementDone();
            break;
        }
        return true;
    }

    std::string duplicate_;
    std::string place_;

    // Where the parser stands now, as a JSON pointer.
    std::string pointer() const
    {
        std::string path;
        for (const Frame& frame : frames_) {
            std::string token = frame.isArray ? std::to_string(frame.index) : frame.key;
            std::string escaped;
            for (char c : token) escaped += c == '~' ? std::string("~0") : c == '/' ? std::string("~1") : std::string(1, c);
            path += "/" + escaped;
        }
        return path;
    }

private:
    struct Frame {
        bool isArray;
        size_t index;
        std::string key;
        std::set<std::string> keys;
    };

    void elementDone()
    {
        if (!frames_.empty() && frames_.back().isArray) ++frames_.back().index;
    }

    std::vector<Frame> frames_;
};

}  // namespace

Scenario parseScenarioText(const std::string& text, const std::string& fileName, const std::filesystem::path& directory)
{
    nlohmann::json document;
    auto check = std::make_shared<DuplicateKeyCheck>();
    try {
        document = nlohmann::json::parse(
            text, [check](int, nlohmann::json::parse_event_t event, nlohmann::json& parsed) { return (*check)(event, parsed); });
    } catch (const nlohmann::json::parse_error& error) {
        throw ScenarioError(fileName, lineAndColumn(text, error.byte), syntaxProblem(error));
    } catch (const nlohmann::json::out_of_range&) {
        // Valid JSON, such as 1e999, that no double can hold.
        throw ScenarioError(fileName, check->pointer(), "a number too large to read");
    }
    if (!check->duplicate_.empty())
        throw ScenarioError(fileName, check->place_, fmt::format("the field \"{}\" appears twice in one object", check->duplicate_));

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
    std::ifstream in(path, std::ios::binary);
    if (!in) {
        std::error_code error;
        bool exists = std::filesystem::exists(path, error);
        throw ScenarioError(path.string(), "", exists ? "cannot be read" : "no such file");
    }
    std::ostringstream text;
    text << in.rdbuf();
    std::filesystem::path directory = path.parent_path();
    if (directory.empty()) directory = ".";
    return parseScenarioText(text.str(), path.string(), directory);
}

}  // namespace lab
