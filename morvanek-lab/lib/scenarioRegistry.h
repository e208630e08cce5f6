// The registry a scenario describes: its .reg imports, then its keys and
// values. The World arms the scenario's registry faults on top; an export
// writes this out for a real machine.
#pragma once

#include "scenario.h"
#include "sim/kernel/registrySim.h"

namespace lab {

// Throws std::runtime_error when an import cannot be read.
void fillRegistry(sim::kernel::Registry& registry, const RegistryPlan& plan);

}  // namespace lab
