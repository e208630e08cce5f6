// Loading, registering, starting, stopping and unloading the module.
#include <cstring>

#include "tests/support/moduleTest.h"

namespace {

using testing_support::kServiceKey;
using testing_support::kUnableToLoad;

class Lifecycle : public testing_support::ModuleTest {};

TEST_F(Lifecycle, RefusesToLoadWhenTheHostIsNotReady)
{
    host().ready = false;
    EXPECT_EQ(module->initialize(kServiceKey), kUnableToLoad);
    EXPECT_TRUE(host().packageEvents.empty());
    EXPECT_EQ(host().registrations, 0);
    EXPECT_EQ(host().allocator.totalAllocations(), 0u);
}

TEST_F(Lifecycle, AFailedRegistrationLeavesNothingBehind)
{
    host().registrationFailure = -52000;
    EXPECT_EQ(module->initialize(kServiceKey), kUnableToLoad);
    ASSERT_EQ(host().packageEvents.size(), 1u);
    EXPECT_EQ(host().packageEvents[0].event, 0u);
    EXPECT_EQ(host().registeredModule, nullptr);
    // The static start was undone: no stop-list node stays in the allocator.
    EXPECT_EQ(host().allocator.liveBlocks(), 0u);
}

TEST_F(Lifecycle, RegistersItsRecordsWithTheHost)
{
    load();
    ASSERT_NE(host().registeredModule, nullptr);
    EXPECT_EQ(host().registrationProblems, std::vector<std::string>{});
    const _tLibModuleInfo& info = *host().registeredModule;
    EXPECT_STREQ(info.moduleName, "morvanek");
    EXPECT_STREQ(info.firstName, "");
    EXPECT_STREQ(info.secondName, "");
    ASSERT_NE(info.moduleMain, nullptr);

    const ModulePackageRecord& record = packageRecord();
    EXPECT_EQ(record.version, 1u);
    EXPECT_EQ(record.descriptor->value, 5u);
    EXPECT_EQ(record.unused0, 0u);
    EXPECT_EQ(record.registryPath.MaximumLength, 520);
    EXPECT_EQ(reinterpret_cast<const uint8_t*>(record.registryPath.Buffer),
              reinterpret_cast<const uint8_t*>(&record) + 40);
    EXPECT_EQ(sim::utf16ToUtf8(record.registryPath.Buffer, record.registryPath.Length / 2), kServiceKey);

    ASSERT_EQ(host().packageEvents.size(), 1u);
    const sim::PackageEvent& event = host().packageEvents[0];
    EXPECT_EQ(event.event, 0u);
    EXPECT_EQ(event.firstName, "");
    EXPECT_EQ(event.secondName, "");
    EXPECT_EQ(event.mainName, "ssMain");
    EXPECT_EQ(event.moduleMain, info.moduleMain);
    EXPECT_EQ(module->dllUnload(), 0);
    ASSERT_EQ(host().packageEvents.size(), 2u);
    EXPECT_EQ(host().packageEvents[1].event, 1u);
    EXPECT_EQ(host().packageEvents[1].liveBlocks, 0u) << "the unload's event comes after the static stop";
}

TEST_F(Lifecycle, CutsALongRegistryPathTo520Bytes)
{
    std::string longPath = std::string(kServiceKey) + "\\" + std::string(400, 'x');
    ASSERT_EQ(module->initialize(longPath), 0);
    const ModulePackageRecord& record = packageRecord();
    EXPECT_EQ(record.registryPath.Length, 520);
    EXPECT_EQ(sim::utf16ToUtf8(record.registryPath.Buffer, 260), longPath.substr(0, 260));
    EXPECT_EQ(module->dllUnload(), 0);
}

// Reasons in turn, through the host's wrapper export and then through the
// registered record: 0 starts (a second start keeps the running table, an empty
// tree still gets both listeners), 1 stops (without a table, only the statics),
// any other reason does nothing.
TEST_F(Lifecycle, StartsStopsAndIgnoresOtherReasonsThenUnloads)
{
    struct Step {
        uint32_t reason;
        bool table;  // running afterwards
        int removedListeners;
    };
    const Step steps[] = {
        {1, false, 0},  {0, true, 0},          {0, true, 0},  {2, true, 0}, {3, true, 0},
        {255, true, 0}, {0xFFFFFFFF, true, 0}, {1, false, 2}, {0, true, 0}, {1, false, 2},
    };
    load();
    for (bool throughTheRecord : {false, true}) {
        for (const Step& step : steps) {
            SCOPED_TRACE(std::string(throughTheRecord ? "record, " : "wrapper, ") + std::to_string(step.reason));
            const int removalsBefore = tree().removeListenerCalls();
            EXPECT_EQ(throughTheRecord ? host().callModuleMain(step.reason) : callSsMain(step.reason), 0);
            EXPECT_EQ(tree().liveListeners(), step.table ? 2u : 0u);
            EXPECT_EQ(tree().liveQueries(), step.table ? 1u : 0u);
            EXPECT_EQ(host().allocator.liveBlocks(), step.table ? 4u : 0u) << "the table, its records, a stop node";
            EXPECT_EQ(tree().removeListenerCalls() - removalsBefore, step.removedListeners);
        }
    }
    // The wrapper passes each reason on to the host's package events; the record does not.
    std::vector<uint32_t> events;
    for (const sim::PackageEvent& event : host().packageEvents) events.push_back(event.event);
    EXPECT_EQ(events, (std::vector<uint32_t>{0, 1, 0, 0, 2, 3, 255, 0xFFFFFFFF, 1, 0, 1}));

    EXPECT_EQ(module->dllUnload(), 0);
    EXPECT_EQ(host().unregistrations, 1);
    EXPECT_EQ(host().registeredModule, nullptr);
    EXPECT_EQ(host().packageEvents.back().event, 1u);
    EXPECT_TRUE(host().eventLog.empty());
}

// A host that unloads without stopping the module first: the unload stops the
// device work itself, so that no listener is left calling into code that is
// gone, and then the statics, so that nothing stays allocated.
TEST_F(Lifecycle, UnloadWithoutAStopEndsTheDeviceWorkFirst)
{
    addDevice(0x5C1D, 0x4A10, 0xFFFFFFFF);
    load();
    EXPECT_EQ(callSsMain(0), 0);
    ASSERT_EQ(tree().liveListeners(), 2u);
    EXPECT_EQ(module->dllUnload(), 0);
    EXPECT_EQ(tree().liveListeners(), 0u);
    EXPECT_EQ(tree().liveQueries(), 0u);
    EXPECT_EQ(tree().removeListenerCalls(), 2);
    EXPECT_EQ(host().allocator.liveBlocks(), 0u);
    EXPECT_EQ(host().unregistrations, 1);
    EXPECT_EQ(host().packageEvents.back().event, 1u);
    EXPECT_EQ(host().packageEvents.back().liveBlocks, 0u);
}

// A stop node that cannot be allocated is skipped and the start still counts:
// the next start is only counted, it does not try for a node again, and the
// stops pair with the starts.
TEST_F(Lifecycle, AStaticStartWhoseStopNodeIsNotObtainedStillCounts)
{
    host().allocator.failNth(1);  // DllInitialize's stop node
    load();
    EXPECT_EQ(host().allocator.liveBlocks(), 0u);
    EXPECT_EQ(callSsMain(0), 0);
    EXPECT_EQ(host().allocator.liveBlocks(), 3u) << "the table and its two records, and no stop node";
    EXPECT_EQ(callSsMain(1), 0);
    EXPECT_EQ(module->dllUnload(), 0);
}

TEST_F(Lifecycle, AFailedStartThroughTheWrapperIsLoggedAndReturned)
{
    load();
    host().setTreePresent(false);
    EXPECT_EQ(callSsMain(0), -50150);
    ASSERT_EQ(host().eventLog.size(), 1u);
    const sim::LogEntry& entry = host().eventLog[0];
    EXPECT_EQ(entry.component, "ssKernelExportDriver");
    EXPECT_EQ(entry.location, ".\\source\\package\\windows\\clientPkgExportDriver:97 - ");
    EXPECT_EQ(entry.level, 10u);
    EXPECT_EQ(entry.tag, "");
    EXPECT_EQ(entry.message, "ssMain(0) of morvanek failed with status -50150\n");
    EXPECT_EQ(callSsMain(1), 0);
    // Through the record the same failure is the host's to report.
    EXPECT_EQ(host().callModuleMain(0), -50150);
    EXPECT_EQ(host().eventLog.size(), 1u);
    EXPECT_EQ(host().callModuleMain(1), 0);
    EXPECT_EQ(module->dllUnload(), 0);
}

TEST_F(Lifecycle, LoadStateWordsAndTheGuid)
{
    load();
    const uint8_t* guid = module->setWdmLoadStateAndGetGuid(7);
    EXPECT_EQ(packageRecord().wdmWrapperLoadState, 7u);
    EXPECT_EQ(module->setWdmLoadStateAndGetGuid(0), guid);
    EXPECT_EQ(packageRecord().wdmWrapperLoadState, 0u);
    const uint8_t expected[16] = {0x92, 0x7A, 0x4C, 0x1F, 0x5E, 0x3B, 0x81, 0x4D,
                                  0x9C, 0x06, 0x72, 0xE8, 0xA1, 0xB5, 0xD3, 0xF4};
    EXPECT_EQ(std::memcmp(guid, expected, 16), 0);
    EXPECT_EQ(guid, packageRecord().descriptor->guid);

    // The host writes the two words after the legacy state; only a zero
    // state clears them.
    auto& record = const_cast<ModulePackageRecord&>(packageRecord());
    record.legacyWord1 = 11;
    record.legacyWord2 = 12;
    module->setLegacyLoadState(3);
    EXPECT_EQ(record.legacyWrapperLoadState, 3u);
    EXPECT_EQ(record.legacyWord1, 11u);
    EXPECT_EQ(record.legacyWord2, 12u);
    module->setLegacyLoadState(0);
    EXPECT_EQ(record.legacyWrapperLoadState, 0u);
    EXPECT_EQ(record.legacyWord1, 0u);
    EXPECT_EQ(record.legacyWord2, 0u);
    EXPECT_EQ(module->dllUnload(), 0);
}

TEST_F(Lifecycle, UnloadIgnoresAFailedUnregistration)
{
    load();
    host().unregistrationFailure = -52000;
    EXPECT_EQ(module->dllUnload(), 0);
    EXPECT_EQ(host().packageEvents.back().event, 1u);
}

TEST_F(Lifecycle, EveryLoadStartsFresh)
{
    load();
    EXPECT_EQ(callSsMain(0), 0);
    // Unloaded without a stop: a fresh copy must not see the old table.
    unloadModule();
    host().reset();
    module = &loadModule();
    load();
    EXPECT_EQ(callSsMain(0), 0);
    EXPECT_EQ(tree().liveListeners(), 2u);
    EXPECT_EQ(callSsMain(1), 0);
    EXPECT_EQ(module->dllUnload(), 0);
}

}  // namespace
