#include "scenarioDevice.h"

namespace lab {

std::shared_ptr<sim::PhysicalDevice> makeScenarioDevice(const DevicePlan& plan)
{
    sim::EmulatedDeviceOptions options = plan.options;
    options.trace = true;
    options.identity.reset();
    options.memory.clear();
    if (!plan.flashDump.empty()) options.memory.push_back({0, plan.flashDump});
    auto device = sim::makeEmulatedDevice(options);
    if (plan.identity) device->setIdentity(*plan.identity);
    for (const sim::MemoryBytes& bytes : plan.memory) device->flash.load(bytes.address, bytes.bytes);
    return device;
}

}  // namespace lab
