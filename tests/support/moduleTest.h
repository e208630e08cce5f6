// A test with a freshly loaded module, and helpers to drive it as the kernel
// and the host would.
#pragma once

#include <string>

#include "worldTest.h"

namespace testing_support {

constexpr NTSTATUS kUnableToLoad = static_cast<NTSTATUS>(0xC000026Cu);
constexpr const char* kServiceKey = "\\Registry\\Machine\\System\\CurrentControlSet\\Services\\morvanek";

class ModuleTest : public WorldTest {
protected:
    void SetUp() override
    {
        WorldTest::SetUp();
        module = &loadModule();
    }

    // DllInitialize with the service key, expected to succeed.
    void load() { ASSERT_EQ(module->initialize(kServiceKey), 0); }

    // Through the host's wrapper export, then the device events it caused.
    tStatus callSsMain(uint32_t reason)
    {
        tStatus result = module->callSsMain(reason);
        tree().deliverPendingEvents();
        return result;
    }

    sim::UsbDeviceSim& addDevice(uint32_t vendorId, uint32_t productId, uint32_t attribute21 = 0)
    {
        auto device = std::make_unique<sim::UsbDeviceSim>(vendorId, productId, attribute21);
        sim::UsbDeviceSim& added = *device;
        tree().adopt(std::move(device));
        added.present = true;
        return added;
    }

    const ModulePackageRecord& packageRecord() { return *host().registeredModule->packageRecord; }

    sim::ModuleImage* module = nullptr;
};

}  // namespace testing_support
