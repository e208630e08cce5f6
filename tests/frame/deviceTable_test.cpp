// The device table: its construction and every way it can fail part way, the
// walk over present devices, hot-plug, and the arrival filter's decisions.
#include "tests/support/moduleTest.h"

namespace {

class DeviceTable : public testing_support::ModuleTest {
protected:
    void SetUp() override
    {
        ModuleTest::SetUp();
        load();
    }
    void TearDown() override
    {
        if (module != nullptr) {
            EXPECT_EQ(callSsMain(1), 0);
            EXPECT_EQ(module->dllUnload(), 0);
        }
        ModuleTest::TearDown();
    }
};

struct ConstructionFailure {
    const char* name;
    std::function<void(sim::Host&)> arrange;
    tStatus expected;
    int addListenerCalls;
    int removeListenerCalls;
    int queryIdReads;  // one per record obtained, and none for a record that is not
};

void PrintTo(const ConstructionFailure& failure, std::ostream* out)
{
    *out << failure.name;
}

class ConstructionFailures : public DeviceTable, public ::testing::WithParamInterface<ConstructionFailure> {};

// Whatever step fails, the start fails with its status, nothing stays
// registered or allocated, and the module can start again afterwards.
TEST_P(ConstructionFailures, LeaveNothingBehind)
{
    const ConstructionFailure& failure = GetParam();
    addDevice(0x5C1D, 0x4A10);
    failure.arrange(host());
    EXPECT_EQ(callSsMain(0), failure.expected);
    EXPECT_EQ(tree().liveListeners(), 0u);
    EXPECT_EQ(tree().liveQueries(), 0u);
    EXPECT_EQ(tree().addListenerCalls(), failure.addListenerCalls);
    EXPECT_EQ(tree().removeListenerCalls(), failure.removeListenerCalls);
    EXPECT_EQ(tree().queryIdReads(), failure.queryIdReads);
    EXPECT_EQ(host().allocator.liveBlocks(), 1u) << "only the static stop node stays";

    host().allocator.clearFaults();
    host().setTreePresent(true);
    tree().faults = sim::TreeFaults{};
    EXPECT_EQ(callSsMain(1), 0);
    EXPECT_EQ(callSsMain(0), 0);
    EXPECT_EQ(tree().liveListeners(), 2u);
}

// Allocations of a start: 1 the table, 2 the search's array, 3 the arrival
// record, 4 the removal record.
const ConstructionFailure kConstructionFailures[] = {
    {"NoTable", [](sim::Host& h) { h.allocator.failNth(1); }, -50352, 0, 0, 0},
    {"NoDeviceTree", [](sim::Host& h) { h.setTreePresent(false); }, -50150, 0, 0, 0},
    {"NoQuery", [](sim::Host& h) { h.tree()->faults.createQuery.everyCall = sim::kHostFailure; }, -50352, 0, 0, 0},
    {"QueryAttributeFails", [](sim::Host& h) { h.tree()->faults.setAttribute.everyCall = -7; }, -7, 0, 0, 0},
    {"SearchFails", [](sim::Host& h) { h.tree()->faults.findDevices.byNumber[1] = -8; }, -8, 0, 0, 0},
    {"SearchArrayNotAllocated", [](sim::Host& h) { h.allocator.failNth(2); }, sim::kHostAllocationFailed, 0, 0, 0},
    {"NoArrivalRecord", [](sim::Host& h) { h.allocator.failNth(3); }, -50352, 0, 1, 1},
    {"NoRemovalRecord", [](sim::Host& h) { h.allocator.failNth(4); }, -50352, 0, 1, 1},
    {"NoRecords", [](sim::Host& h) {
         h.allocator.failNth(3);
         h.allocator.failNth(4);
     }, -50352, 0, 0, 0},
    {"FirstAddListenerFails", [](sim::Host& h) { h.tree()->faults.addListener.byNumber[1] = -9; }, -9, 2, 2, 2},
    {"SecondAddListenerFails", [](sim::Host& h) { h.tree()->faults.addListener.byNumber[2] = -10; }, -10, 2, 2, 2},
};

INSTANTIATE_TEST_SUITE_P(Steps, ConstructionFailures, ::testing::ValuesIn(kConstructionFailures),
                         [](const auto& info) { return std::string(info.param.name); });

// The host tells the two records apart by their kind: the arrival record
// names the table's primary base, the removal record its second base, both
// for the table's query.
TEST_F(DeviceTable, RegistersAnArrivalAndARemovalRecordForItsQuery)
{
    EXPECT_EQ(callSsMain(0), 0);
    const std::vector<ListenerRecord*>& records = tree().listenerRecords();
    ASSERT_EQ(records.size(), 2u);
    EXPECT_EQ(records[0]->eventKind, kListenerArrival);
    EXPECT_EQ(records[1]->eventKind, kListenerRemoval);
    for (const ListenerRecord* record : records) {
        EXPECT_EQ(record->one, 1u);
        EXPECT_EQ(record->zero, 0u);
        EXPECT_EQ(record->queryId, 0x51u) << "the id of the tree's first query";
    }
    EXPECT_NE(records[0]->callback, records[1]->callback);
    EXPECT_EQ(tree().queryIdReads(), 2);
}

TEST_F(DeviceTable, PresentDevicesAreHandledBeforeAnyListenerExists)
{
    sim::UsbDeviceSim& first = addDevice(0x5C1D, 0x4A10);
    sim::UsbDeviceSim& second = addDevice(0x5C1D, 0x4A20);
    tree().faults.addListener.byNumber[1] = sim::kHostFailure;  // the walk must not depend on the listeners
    EXPECT_EQ(callSsMain(0), sim::kHostFailure);
    EXPECT_EQ(first.streamOpenAttempts, 1);
    EXPECT_EQ(second.streamOpenAttempts, 1);
}

// A device whose vendor ID, product ID or descriptor cannot be read is not
// updated; it neither stops the walk nor the table, and nothing is logged.
TEST_F(DeviceTable, DevicesThatCannotBeReadAreLeftAlone)
{
    sim::UsbDeviceSim& noVendorId = addDevice(0x5C1D, 0x4A10);
    noVendorId.failingAttributes.insert(1);
    sim::UsbDeviceSim& noProductId = addDevice(0x5C1D, 0x4A10);
    noProductId.failingAttributes.insert(2);
    sim::UsbDeviceSim& noDescriptor = addDevice(0x5C1D, 0x4A10);
    noDescriptor.failDescriptor = true;
    sim::UsbDeviceSim& next = addDevice(0x5C1D, 0x4A10);
    EXPECT_EQ(callSsMain(0), 0);
    EXPECT_EQ(tree().liveListeners(), 2u);
    for (sim::UsbDeviceSim* device : {&noVendorId, &noProductId, &noDescriptor}) {
        EXPECT_EQ(device->streamOpenAttempts, 0);
    }
    EXPECT_EQ(noVendorId.attributeReads, 1) << "a failed read ends the device's reads";
    EXPECT_EQ(noProductId.attributeReads, 2);
    EXPECT_EQ(next.streamOpenAttempts, 1);
    EXPECT_TRUE(host().eventLog.empty());
}

struct FilterCase {
    const char* name;
    uint32_t vendorId;
    uint32_t productId;
    uint32_t attribute21;
    bool updated;
    int descriptorReads;
};

void PrintTo(const FilterCase& c, std::ostream* out)
{
    *out << c.name;
}

class ArrivalFilter : public DeviceTable, public ::testing::WithParamInterface<FilterCase> {};

TEST_P(ArrivalFilter, DecidesForPresentAndArrivingDevices)
{
    const FilterCase& c = GetParam();
    sim::UsbDeviceSim& present = addDevice(c.vendorId, c.productId, c.attribute21);
    ASSERT_EQ(callSsMain(0), 0);
    EXPECT_EQ(present.streamOpenAttempts, c.updated ? 1 : 0);
    EXPECT_EQ(present.descriptorReads, c.descriptorReads);

    sim::UsbDeviceSim& arriving =
        tree().plugIn(std::make_unique<sim::UsbDeviceSim>(c.vendorId, c.productId, c.attribute21));
    EXPECT_EQ(arriving.streamOpenAttempts, c.updated ? 1 : 0);
    EXPECT_EQ(arriving.descriptorReads, c.descriptorReads);
    EXPECT_TRUE(host().eventLog.empty()) << "the filter logs nothing";
}

const FilterCase kFilterCases[] = {
    {"SmallLoader", 0x5C1D, 0x4A10, 0, true, 1},
    {"LargeLoader", 0x5C1D, 0x4A20, 0, true, 1},
    {"VendorUpperBitsIgnored", 0xABCD5C1D, 0x4A10, 0, true, 1},
    {"ProductUpperBitsIgnored", 0x5C1D, 0x00014A20, 0, true, 1},
    {"AlmostBarred", 0x5C1D, 0x4A10, 0xFFFFFFFE, true, 1},
    {"Barred", 0x5C1D, 0x4A10, 0xFFFFFFFF, false, 1},
    {"OtherProductOfTheFamily", 0x5C1D, 0x4B01, 0, false, 0},
    {"NeighbourProductId", 0x5C1D, 0x4A11, 0, false, 0},
    {"OtherVendor", 0x1234, 0x4A10, 0, false, 0},
};

INSTANTIATE_TEST_SUITE_P(Devices, ArrivalFilter, ::testing::ValuesIn(kFilterCases),
                         [](const auto& info) { return std::string(info.param.name); });

TEST_F(DeviceTable, RemovalsChangeNothing)
{
    sim::UsbDeviceSim& device = addDevice(0x5C1D, 0x4A10);
    ASSERT_EQ(callSsMain(0), 0);
    size_t blocks = host().allocator.liveBlocks();
    tree().unplug(device);
    EXPECT_EQ(host().allocator.liveBlocks(), blocks);
    EXPECT_EQ(tree().liveListeners(), 2u);
    EXPECT_TRUE(host().eventLog.empty());
}

TEST_F(DeviceTable, NoCallbackAfterTheStop)
{
    ASSERT_EQ(callSsMain(0), 0);
    ASSERT_EQ(callSsMain(1), 0);
    sim::UsbDeviceSim& late = tree().plugIn(std::make_unique<sim::UsbDeviceSim>(0x5C1D, 0x4A10, 0));
    EXPECT_EQ(late.streamOpenAttempts, 0);
}

}  // namespace
