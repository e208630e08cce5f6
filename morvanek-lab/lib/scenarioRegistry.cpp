#include "scenarioRegistry.h"

#include "regfile/registryText.h"

namespace lab {

void fillRegistry(sim::kernel::Registry& registry, const RegistryPlan& plan)
{
    for (const auto& path : plan.imports) sim::regfile::importRegistryFile(registry, path.string());
    for (const RegistryKeyPlan& key : plan.keys) {
        registry.createKey(key.path);
        for (const RegistryValuePlan& value : key.values) registry.setValue(key.path, value.name, value.type, value.data);
    }
}

}  // namespace lab
