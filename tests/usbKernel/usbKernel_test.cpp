// morvanek-usb against a real kernel USB stack: Debian's kernel in qemu, the
// lab's emulated devices behind FunctionFS gadgets on dummy_hcd, the program
// on the controller's host side through libusb, usbfs and udev as on a
// workstation. Each device must be asked exactly what the lab's host asks it
// for the same scenario.
#include <gtest/gtest.h>

#include <algorithm>
#include <cctype>

#include "guestMachine.h"

namespace usb_kernel_testing {
namespace {

const std::string kScenarios = std::string(MORVANEK_SOURCE_DIR) + "/tests/usbKernel/scenarios/";
const std::string kLabScenarios = std::string(MORVANEK_SOURCE_DIR) + "/morvanek-lab/scenarios/";

class KernelUsb : public testing::Test {
  protected:
    void SetUp() override
    {
        std::string why = GuestMachine::prepare();
        if (!why.empty()) GTEST_SKIP() << why;
    }

    static std::string jobName()
    {
        const testing::TestInfo* test = testing::UnitTest::GetInstance()->current_test_info();
        std::string name = std::string(test->test_suite_name()) + "-" + test->name();
        std::replace(name.begin(), name.end(), '/', '-');
        return name;
    }

    // Every served device's requests agree with the lab's run of the scenario.
    static void expectLabTraces(const std::string& scenario, const GuestRun& run)
    {
        std::map<std::string, nlohmann::json> lab = GuestMachine::labDevices(scenario);
        for (const auto& [device, report] : run.gadgets) {
            ASSERT_FALSE(report.is_discarded()) << device << " wrote no report\n" << run.log;
            ASSERT_TRUE(lab.count(device)) << "the lab ran no device " << device;
            EXPECT_EQ(traceDifference(lab[device]["trace"], report["trace"]), "") << device << "\n" << run.log;
        }
    }

    // Every transfer the module made reached the device, and only those: the
    // updates' request counts (by USB serial number) are the device's traces.
    static void expectEveryTransferReachedTheDevice(const GuestRun& run, const std::vector<GadgetPlan>& gadgets)
    {
        for (const GadgetPlan& gadget : gadgets) {
            size_t made = 0;
            for (const auto& update : run.updates()) {
                if (gadgets.size() == 1 || update["device"].value("serial", "") == gadget.serial)
                    made += update.value("requests", size_t{0});
            }
            EXPECT_EQ(made, run.gadgets.at(gadget.device)["trace"].size()) << gadget.device << "\n" << run.log;
        }
    }

    static std::vector<std::string> bus(const GuestRun& run, const std::string& device)
    {
        return run.gadgets.at(device)["bus"].get<std::vector<std::string>>();
    }
};

struct UpdateCase {
    const char* name;
    const char* scenario;  // in the lab's shipped scenarios
    const char* device;
    const char* loaderIds;
    const char* productIds;
};

class KernelUsbUpdate : public KernelUsb, public testing::WithParamInterface<UpdateCase> {};

// A whole update, and the restart seen as the kernel reports it: the loader
// leaves the bus and the product enumerates in its place.
TEST_P(KernelUsbUpdate, ProgramsTheDeviceAndSeesItComeBackAsTheProduct)
{
    const UpdateCase& param = GetParam();
    std::string scenario = kLabScenarios + param.scenario;
    GuestRun run = GuestMachine::run(jobName(), GuestJob(scenario, {{param.device, "MV0001"}}));

    EXPECT_EQ(run.usbExitCode, 0) << run.log;
    ASSERT_EQ(run.updates().size(), 1u) << run.log;
    EXPECT_EQ(run.updates()[0]["outcome"], "updated");
    EXPECT_EQ(run.eventsOf("left").size(), 1u) << run.log;
    EXPECT_EQ(bus(run, param.device), (std::vector<std::string>{std::string("connected ") + param.loaderIds,
                                                                "disconnected (restart)",
                                                                std::string("connected ") + param.productIds}));
    const nlohmann::json& gadget = run.gadgets.at(param.device);
    EXPECT_EQ(gadget["mode"], "product");
    EXPECT_EQ(gadget["markerInPlace"], true);
    EXPECT_EQ(run.eventsOf("summary").at(0)["leftovers"], nlohmann::json::array());
    expectLabTraces(scenario, run);
    expectEveryTransferReachedTheDevice(run, {{param.device, "MV0001"}});
}

INSTANTIATE_TEST_SUITE_P(BothLoaders, KernelUsbUpdate,
                         testing::Values(UpdateCase{"FirstLoader", "demo.json", "bench-left", "5C1D:4A10", "5C1D:4B01"},
                                         UpdateCase{"SecondLoaderRepairingItsIdentity", "demo.json", "bench-right",
                                                    "5C1D:4A20", "5C1D:4B02"}),
                         [](const testing::TestParamInfo<UpdateCase>& info) { return std::string(info.param.name); });

struct FaultCase {
    const char* name;
    const char* device;  // in faults-while-programming.json
    bool staysOnTheBus;
};

class KernelUsbFault : public KernelUsb, public testing::WithParamInterface<FaultCase> {};

// A stall or a disconnect in the middle of programming: the update fails,
// the device is left in its loader (or gone), nothing is left allocated, and
// the device saw the same requests as in the lab, up to and including the one
// that failed.
TEST_P(KernelUsbFault, FailsTheUpdateAndLeavesTheDeviceInItsLoader)
{
    const FaultCase& param = GetParam();
    std::string scenario = kScenarios + "faults-while-programming.json";
    GuestRun run = GuestMachine::run(jobName(), GuestJob(scenario, {{param.device, ""}}));

    EXPECT_EQ(run.usbExitCode, 1) << run.log;
    ASSERT_EQ(run.updates().size(), 1u) << run.log;
    EXPECT_EQ(run.updates()[0]["outcome"], "failed");
    EXPECT_EQ(run.eventsOf("summary").at(0)["leftovers"], nlohmann::json::array());
    const nlohmann::json& gadget = run.gadgets.at(param.device);
    EXPECT_EQ(gadget["markerInPlace"], false);
    EXPECT_EQ(gadget["mode"], param.staysOnTheBus ? "loader" : "unplugged");
    std::vector<std::string> expectedBus = {"connected 5C1D:4A10"};
    if (!param.staysOnTheBus) expectedBus.push_back("disconnected");
    EXPECT_EQ(bus(run, param.device), expectedBus);
    EXPECT_EQ(gadget["notes"].size(), param.staysOnTheBus ? 0u : 1u) << gadget["notes"].dump();
    expectLabTraces(scenario, run);
    expectEveryTransferReachedTheDevice(run, {{param.device, ""}});
}

INSTANTIATE_TEST_SUITE_P(WhileProgramming, KernelUsbFault,
                         testing::Values(FaultCase{"StallOnAWrite", "stalled-write", true},
                                         FaultCase{"StallOnAnErase", "stalled-erase", true},
                                         FaultCase{"DisconnectOnARead", "gone-at-read", false},
                                         FaultCase{"DisconnectOnAWrite", "gone-at-write", false}),
                         [](const testing::TestParamInfo<FaultCase>& info) { return std::string(info.param.name); });

// Two devices of one product at once, each on a bus of its own: both are
// updated side by side from the one image file.
TEST_F(KernelUsb, UpdatesTwoDevicesOfOneProductAtOnce)
{
    std::string scenario = kScenarios + "two-of-one-product.json";
    std::vector<GadgetPlan> gadgets = {{"left", "MV0111"}, {"right", "MV0222"}};
    GuestRun run = GuestMachine::run(jobName(), GuestJob(scenario, gadgets));

    EXPECT_EQ(run.usbExitCode, 0) << run.log;
    auto updates = run.updates();
    ASSERT_EQ(updates.size(), 2u) << run.log;
    for (const auto& update : updates) EXPECT_EQ(update["outcome"], "updated") << update.dump();
    for (const char* device : {"left", "right"}) {
        EXPECT_EQ(run.gadgets.at(device)["mode"], "product") << device;
        EXPECT_EQ(bus(run, device).back(), "connected 5C1D:4B01") << device;
    }
    expectLabTraces(scenario, run);
    expectEveryTransferReachedTheDevice(run, gadgets);
}

// Selection by USB serial number: only the device named is asked anything.
TEST_F(KernelUsb, UpdatesOnlyTheDeviceWithTheSerialNumberGiven)
{
    std::string scenario = kScenarios + "two-of-one-product.json";
    GuestRun run =
        GuestMachine::run(jobName(), GuestJob(scenario, {{"left", "MV0111"}, {"right", "MV0222"}}, {"--serial", "MV0222"}));

    EXPECT_EQ(run.usbExitCode, 0) << run.log;
    auto updates = run.updates();
    ASSERT_EQ(updates.size(), 1u) << run.log;
    EXPECT_EQ(updates[0]["device"]["serial"], "MV0222");
    EXPECT_EQ(run.gadgets.at("left")["trace"], nlohmann::json::array());
    EXPECT_EQ(run.gadgets.at("left")["mode"], "loader");
    EXPECT_EQ(run.gadgets.at("right")["mode"], "product");
    std::map<std::string, nlohmann::json> lab = GuestMachine::labDevices(scenario);
    EXPECT_EQ(traceDifference(lab["right"]["trace"], run.gadgets.at("right")["trace"]), "") << run.log;
}

// The lab's shipped scenarios whose world a real machine can be given (no
// host, registry or file faults, plain start and stop, IDs a USB device can
// have): every device of one served at once, each on a bus of its own.
class KernelUsbParity : public KernelUsb, public testing::WithParamInterface<const char*> {};

TEST_P(KernelUsbParity, AsksEachDeviceWhatTheLabAsksIt)
{
    std::string scenario = kLabScenarios + GetParam() + ".json";
    std::vector<GadgetPlan> gadgets;
    for (const std::string& device : GuestMachine::deviceNames(scenario))
        gadgets.push_back({device, "MV" + std::to_string(1000 + gadgets.size())});
    ASSERT_FALSE(gadgets.empty());
    GuestRun run = GuestMachine::run(jobName(), GuestJob(scenario, gadgets));

    std::map<std::string, nlohmann::json> lab = GuestMachine::labDevices(scenario);
    for (const GadgetPlan& gadget : gadgets) {
        const nlohmann::json& served = run.gadgets.at(gadget.device);
        ASSERT_FALSE(served.is_discarded()) << gadget.device << " wrote no report\n" << run.log;
        EXPECT_EQ(traceDifference(lab[gadget.device]["trace"], served["trace"]), "") << gadget.device << "\n" << run.log;
        EXPECT_EQ(served["mode"], lab[gadget.device]["mode"]) << gadget.device;
        EXPECT_EQ(served["markerInPlace"], lab[gadget.device]["markerInPlace"]) << gadget.device;
    }
    ASSERT_EQ(run.eventsOf("summary").size(), 1u) << run.log;
    EXPECT_EQ(run.eventsOf("summary")[0]["leftovers"], nlohmann::json::array());
    expectEveryTransferReachedTheDevice(run, gadgets);
}

INSTANTIATE_TEST_SUITE_P(ShippedScenarios, KernelUsbParity,
                         testing::Values("blank-identity-fvtpid", "erased-product-id", "erased-product-id-fix-list",
                                         "firmware-value", "fresh-device", "largest-image-4a10", "largest-image-4a20",
                                         "loader-4a20", "missing-image", "path-unknown",
                                         "verification-failure", "zeroed-identity"),
                         [](const testing::TestParamInfo<const char*>& info) {
                             std::string name;
                             bool upper = true;
                             for (const char* c = info.param; *c != '\0'; ++c) {
                                 if (*c == '-') {
                                     upper = true;
                                     continue;
                                 }
                                 name += upper ? static_cast<char>(std::toupper(static_cast<unsigned char>(*c))) : *c;
                                 upper = false;
                             }
                             return name;
                         });

// An image whose marker cannot take: the restarted device comes back in its
// loader. once updates it one time (the lab's host goes on announcing it, so
// the lab's later updates are not part of this run) and must not call that a
// success.
TEST_F(KernelUsb, ADeviceThatComesBackInItsLoaderIsNotReportedAsUpdated)
{
    std::string scenario = kLabScenarios + "marker-over-image-bytes.json";
    GuestRun run = GuestMachine::run(jobName(), GuestJob(scenario, {{"stubborn", "MV0099"}}));

    EXPECT_EQ(run.usbExitCode, 1) << run.log;
    ASSERT_EQ(run.eventsOf("summary").size(), 1u) << run.log;
    EXPECT_EQ(run.eventsOf("summary")[0]["backInLoaderMode"], 1);
    EXPECT_EQ(bus(run, "stubborn"),
              (std::vector<std::string>{"connected 5C1D:4A10", "disconnected (restart)", "connected 5C1D:4A10"}));
    nlohmann::json firstUpdate = nlohmann::json::array();
    std::map<std::string, nlohmann::json> lab = GuestMachine::labDevices(scenario);
    for (const auto& request : lab["stubborn"]["trace"]) {
        if (request["update"] == 1) firstUpdate.push_back(request);
    }
    EXPECT_EQ(traceDifference(firstUpdate, run.gadgets.at("stubborn")["trace"]), "") << run.log;
}

// watch on the real stack: devices that arrive after the start are seen
// through udev's hotplug events, updated side by side, seen coming back as
// the product, and SIGTERM stops the program cleanly.
TEST_F(KernelUsb, WatchUpdatesDevicesThatArriveAndStopsOnSigterm)
{
    std::string scenario = kScenarios + "two-of-one-product.json";
    GuestJob job(scenario, {{"left", "MV0111"}, {"right", "MV0222"}});
    job.watch = true;
    GuestRun run = GuestMachine::run(jobName(), job);

    EXPECT_EQ(run.usbExitCode, 0) << run.log;
    auto updates = run.updates();
    ASSERT_EQ(updates.size(), 2u) << run.log;
    for (const auto& update : updates) EXPECT_EQ(update["outcome"], "updated") << update.dump();
    auto arrivals = run.eventsOf("arrived");
    EXPECT_EQ(std::count_if(arrivals.begin(), arrivals.end(), [](const auto& e) { return e["text"] == "arrived"; }), 2)
        << run.log;
    EXPECT_EQ(run.eventsOf("summary").at(0)["leftovers"], nlohmann::json::array());
    expectLabTraces(scenario, run);
    expectEveryTransferReachedTheDevice(run, job.gadgets);
}

// Without root and without the udev rule the device node cannot be opened:
// the program says which rule to install, updates nothing and leaves the
// device as it was. The rule, installed, tags the loader for the logged-in
// user's access.
TEST_F(KernelUsb, WithoutAccessToTheDeviceNodeNamesTheRuleThatGivesIt)
{
    GuestJob job;
    job.scenarioFile = kScenarios + "two-of-one-product.json";
    job.gadgets = {{"left", "MV0111"}};
    job.beforeGadgets = "mkdir -p /run/udev/rules.d && cp " + shellQuoted(std::string(MORVANEK_SOURCE_DIR) +
                                                                     "/usb/udev/70-morvanek.rules") +
                        " /run/udev/rules.d/ && udevadm control --reload";
    job.usbPrefix = "setpriv --reuid=65534 --regid=65534 --clear-groups";
    job.afterUsb = "for node in /sys/bus/usb/devices/*/idVendor; do udevadm info -q property \"${node%/idVendor}\"; "
                   "done >udev-properties";
    GuestRun run = GuestMachine::run(jobName(), job);

    EXPECT_EQ(run.usbExitCode, 1) << run.log;
    ASSERT_EQ(run.eventsOf("problem").size(), 1u) << run.log;
    EXPECT_NE(run.eventsOf("problem")[0].value("text", "").find("Install the udev rule 70-morvanek.rules"),
              std::string::npos);
    ASSERT_EQ(run.updates().size(), 1u) << run.log;
    EXPECT_EQ(run.updates()[0]["firstFailure"], -53006);
    EXPECT_EQ(run.gadgets.at("left")["trace"], nlohmann::json::array());
    std::string properties = run.file("udev-properties");
    EXPECT_NE(properties.find("ID_MODEL_ID=4a10"), std::string::npos) << properties;
    EXPECT_NE(properties.find("uaccess"), std::string::npos) << properties;
}

}  // namespace
}  // namespace usb_kernel_testing
