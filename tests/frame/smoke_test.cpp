#include "tests/support/WorldTest.h"

using testing_support::WorldTest;

TEST_F(WorldTest, LoadsStartsStopsAndUnloads)
{
    sim::ModuleImage& module = loadModule();
    EXPECT_EQ(module.initialize("\\Registry\\Machine\\System\\CurrentControlSet\\Services\\morvanek"), 0);
    EXPECT_EQ(host().callModuleMain(0), 0);
    EXPECT_EQ(host().callModuleMain(1), 0);
    EXPECT_EQ(module.dllUnload(), 0);
}
