// An emulated device made as a scenario plans it, with its flash as the plan
// fills it; not plugged in anywhere yet.
#pragma once

#include <memory>

#include "scenario.h"

namespace lab {

std::shared_ptr<sim::PhysicalDevice> makeScenarioDevice(const DevicePlan& plan);

}  // namespace lab
