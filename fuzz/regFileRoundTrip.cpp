// The .reg importer on any bytes: a file it refuses changes nothing; a file it
// takes, exported and read back, gives the same keys, values, types and data,
// and the same text again.
#include <cstddef>
#include <cstdint>
#include <stdexcept>
#include <string>

#include "brokenPromise.h"
#include "regfile/registryText.h"
#include "sim/kernel/registrySim.h"

namespace {

// Something a refused file must leave as it was.
constexpr const char* kStandingKey = "\\Registry\\Machine\\Software\\Standing";

// The hive as keys and values, for comparing two registries exactly.
std::string describe(const sim::kernel::Registry& registry)
{
    std::string text;
    for (const sim::kernel::RegistryKeyContent& key : registry.contents()) {
        text += "[" + key.path + "]\n";
        for (const sim::kernel::RegistryValue& value : key.values) {
            text += "\"" + value.name + "\" type " + std::to_string(value.type) + ":";
            for (uint8_t byte : value.data) text += " " + std::to_string(byte);
            text += "\n";
        }
    }
    return text;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size)
{
    const std::string text(reinterpret_cast<const char*>(data), size);
    sim::kernel::Registry registry;
    registry.setString(kStandingKey, "Kept", "before the import");
    const std::string before = sim::regfile::exportRegistryText(registry);
    try {
        sim::regfile::importRegistryText(registry, text, "fuzz.reg");
    } catch (const std::runtime_error&) {
        fuzzing::require(sim::regfile::exportRegistryText(registry) == before, "a refused file changed the registry");
        return 0;
    }

    const std::string exported = sim::regfile::exportRegistryText(registry);
    sim::kernel::Registry again;
    try {
        sim::regfile::importRegistryText(again, exported, "exported.reg");
    } catch (const std::runtime_error& error) {
        fuzzing::brokenPromise(std::string("the export of an imported file is refused: ") + error.what() + "\n" +
                               exported);
    }
    const std::string imported = describe(registry);
    const std::string readBack = describe(again);
    fuzzing::require(readBack == imported, "the export read back is another hive:\n" + imported + "----\n" + readBack);
    const std::string reexported = sim::regfile::exportRegistryText(again);
    fuzzing::require(reexported == exported,
                     "export, import and export again differ:\n" + exported + "----\n" + reexported);
    return 0;
}
