#include "worldTest.h"

namespace testing_support {

void WorldTest::SetUp()
{
    sim::Host::get().reset();
    sim::kernel::reset();
}

void WorldTest::TearDown()
{
    module_.reset();
    EXPECT_EQ(leftovers(), std::vector<std::string>{});
    EXPECT_EQ(sim::Host::get().misuse, std::vector<std::string>{});
    EXPECT_EQ(sim::kernel::misuseReports(), std::vector<std::string>{});
    sim::Host::get().reset();
    sim::kernel::reset();
}

sim::ModuleImage& WorldTest::loadModule()
{
    module_ = std::make_unique<sim::ModuleImage>();
    return *module_;
}

std::vector<std::string> WorldTest::leftovers()
{
    std::vector<std::string> result = sim::Host::get().leftovers();
    for (const std::string& handle : sim::kernel::openHandleDescriptions()) result.push_back("open handle: " + handle);
    return result;
}

}  // namespace testing_support
