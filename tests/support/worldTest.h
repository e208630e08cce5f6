// A test in a fresh world: host and kernel stand-ins reset before, and checked
// after, so that every test ends with nothing allocated, open or registered.
#pragma once

#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <vector>

#include "sim/host/simHost.h"
#include "sim/kernel/simKernel.h"
#include "sim/loader/moduleImage.h"

namespace testing_support {

class WorldTest : public ::testing::Test {
protected:
    void SetUp() override;
    void TearDown() override;

    sim::Host& host() { return sim::Host::get(); }
    sim::DeviceTreeSim& tree() { return *sim::Host::get().tree(); }

    // Loads a fresh copy of the module; unloaded at the end of the test.
    sim::ModuleImage& loadModule();
    void unloadModule() { module_.reset(); }

    // Everything still allocated, open or registered, described.
    static std::vector<std::string> leftovers();

private:
    std::unique_ptr<sim::ModuleImage> module_;
};

}  // namespace testing_support
