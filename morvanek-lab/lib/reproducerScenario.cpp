#include "reproducerScenario.h"

#include <fstream>

#include "scenarioError.h"

namespace lab {

namespace {

void makeAbsolute(ScenarioDocument& value, const std::filesystem::path& folder)
{
    if (!value.is_string()) return;
    std::filesystem::path path = value.get<std::string>();
    if (path.is_relative()) value = (std::filesystem::absolute(folder) / path).lexically_normal().string();
}

// Applies to a value, or to each value of a list.
template <typename Apply>
void eachOf(ScenarioDocument& value, Apply apply)
{
    if (value.is_array()) {
        for (ScenarioDocument& item : value) apply(item);
    } else {
        apply(value);
    }
}

// Every place of the scenario format that names a file beside the scenario.
void makePathsAbsolute(ScenarioDocument& scenario, const std::filesystem::path& folder)
{
    auto field = [](ScenarioDocument& object, const char* name) -> ScenarioDocument* {
        if (!object.is_object() || !object.contains(name)) return nullptr;
        return &object[name];
    };
    auto absolute = [&](ScenarioDocument& value) { makeAbsolute(value, folder); };
    auto copyOf = [&](ScenarioDocument& object) {
        if (ScenarioDocument* path = field(object, "copyOf")) absolute(*path);
    };
    if (ScenarioDocument* registry = field(scenario, "registry")) {
        if (ScenarioDocument* imports = field(*registry, "import")) eachOf(*imports, absolute);
    }
    if (ScenarioDocument* drives = field(scenario, "drives"); drives && drives->is_object()) {
        for (auto& [letter, drive] : drives->items()) {
            if (ScenarioDocument* folderField = field(drive, "folder")) absolute(*folderField);
            if (ScenarioDocument* files = field(drive, "files"); files && files->is_object()) {
                for (auto& [name, file] : files->items()) copyOf(file);
            }
        }
    }
    if (ScenarioDocument* devices = field(scenario, "devices"); devices && devices->is_array()) {
        for (ScenarioDocument& device : *devices) {
            if (ScenarioDocument* dump = field(device, "flashDump")) absolute(*dump);
            if (ScenarioDocument* memory = field(device, "memory")) eachOf(*memory, copyOf);
        }
    }
    if (ScenarioDocument* fileFaults = field(scenario, "fileFaults")) {
        if (ScenarioDocument* changes = field(*fileFaults, "changeContent")) eachOf(*changes, copyOf);
    }
}

}  // namespace

std::filesystem::path writeReproducer(ScenarioDocument scenario, const std::filesystem::path& scenarioFolder,
                                      const std::filesystem::path& folder, const std::string& name,
                                      const std::string& description)
{
    makePathsAbsolute(scenario, scenarioFolder);
    ScenarioDocument described = {{"description", description}};
    for (auto& [key, value] : scenario.items()) {
        if (key != "description") described[key] = value;
    }
    std::error_code error;
    std::filesystem::create_directories(folder, error);
    std::filesystem::path path = folder / (name + ".json");
    std::ofstream out(path);
    out << described.dump(2) << "\n";
    if (!out) throw LabError("cannot write " + path.string());
    return path;
}

}  // namespace lab
