// The scenario parser on any text: a scenario, or a ScenarioError that names
// the place; nothing else may come out of it (the lab would exit 3 or crash).
#include <cstddef>
#include <cstdint>
#include <string>

#include "lib/scenarioError.h"
#include "lib/scenarioParser.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size)
{
    const std::string text(reinterpret_cast<const char*>(data), size);
    try {
        lab::parseScenarioText(text, "fuzz.json", MORVANEK_SCENARIO_FOLDER);
    } catch (const lab::ScenarioError&) {
    }
    return 0;
}
