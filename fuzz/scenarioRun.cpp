// The scenario parser followed by a full run of what it accepts: whatever the
// scenario, the lab reports on it and never fails itself (exit 3) or crashes.
#include <cstddef>
#include <cstdint>
#include <string>

#include "brokenPromise.h"
#include "lib/lab.h"
#include "lib/scenarioError.h"
#include "lib/scenarioParser.h"

namespace {

// Runs that would only be slow, not different: keep the fuzzer's pace.
constexpr size_t kMostFileBytes = 1 << 20;
constexpr size_t kMostDevices = 8;
constexpr size_t kMostSteps = 64;

bool worthRunning(const lab::Scenario& scenario)
{
    size_t fileBytes = 0;
    for (const lab::DrivePlan& drive : scenario.drives) {
        // A real folder is the user's; the fuzzer stays in temporary ones.
        if (drive.folder) return false;
        for (const lab::FilePlan& file : drive.files) fileBytes += file.bytes.size();
    }
    return fileBytes <= kMostFileBytes && scenario.devices.size() <= kMostDevices &&
           scenario.steps.size() <= kMostSteps;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size)
{
    const std::string text(reinterpret_cast<const char*>(data), size);
    lab::Scenario scenario;
    try {
        scenario = lab::parseScenarioText(text, "fuzz.json", MORVANEK_SCENARIO_FOLDER);
    } catch (const lab::ScenarioError&) {
        return 0;
    }
    if (!worthRunning(scenario)) return -1;
    lab::ScenarioResult result = lab::runScenario(scenario, lab::RunOptions{});
    fuzzing::require(result.labError.empty(), "the lab failed on a scenario it accepted: " + result.labError);
    return 0;
}
