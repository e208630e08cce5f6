#include "usbWorld.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstring>
#include <fstream>
#include <sstream>

#include "regfile/registryText.h"

namespace usb_testing {

namespace {

std::string readFile(const std::string& path)
{
    std::ifstream in(path);
    std::stringstream text;
    text << in.rdbuf();
    return text.str();
}

// umockdev's test bed sends udev events through libudev, which must see the
// test bed's /sys as the program does: so this test program, too, runs under
// umockdev's preload, as umockdev-wrapper would start it.
struct UnderUmockdev {
    UnderUmockdev()
    {
        const char* preload = std::getenv("LD_PRELOAD");
        if (preload != nullptr && std::strstr(preload, "libumockdev-preload") != nullptr) return;
        std::ifstream commandLine("/proc/self/cmdline", std::ios::binary);
        std::vector<std::string> words;
        for (std::string word; std::getline(commandLine, word, '\0');) words.push_back(word);
        std::vector<char*> argv;
        for (std::string& word : words) argv.push_back(word.data());
        argv.push_back(nullptr);
        std::string preloads = std::string("libumockdev-preload.so.0") + (preload != nullptr ? std::string(":") + preload : "");
        setenv("LD_PRELOAD", preloads.c_str(), 1);
        // The preload comes before the sanitizer's runtime, which must accept that.
        setenv("ASAN_OPTIONS", "verify_asan_link_order=0", 1);
        execv("/proc/self/exe", argv.data());
        // Without the preload only the test bed's udev events are missing; the tests say so.
    }
} underUmockdev;

}  // namespace

std::vector<nlohmann::json> UsbRun::eventsOf(const std::string& kind) const
{
    std::vector<nlohmann::json> result;
    for (const auto& event : events) {
        if (event.value("event", "") == kind) result.push_back(event);
    }
    return result;
}

std::string UsbRun::outcomeOf(const std::string& busPath) const
{
    std::string outcome;
    for (const auto& event : eventsOf("update")) {
        if (event["device"]["busPath"] == busPath) outcome += (outcome.empty() ? "" : ",") + event["outcome"].get<std::string>();
    }
    return outcome;
}

void UsbWorld::SetUp()
{
    LoaderWorld::SetUp();
    bus = std::make_unique<usbtestbed::EmulatedBus>();
    outputFolder = (driveC.parent_path() / (driveC.filename().string() + "-usb")).string();
    std::filesystem::create_directories(outputFolder);
}

void UsbWorld::TearDown()
{
    bus.reset();
    std::error_code ignored;
    std::filesystem::remove_all(outputFolder, ignored);
    LoaderWorld::TearDown();
}

std::shared_ptr<sim::PhysicalDevice> UsbWorld::plugIn(const sim::EmulatedDeviceOptions& options,
                                                     const std::string& serial)
{
    auto device = sim::makeEmulatedDevice(options);
    bus->plugIn(device, serial);
    return device;
}

pid_t UsbWorld::startUsb(const std::vector<std::string>& arguments)
{
    std::string registryFile = outputFolder + "/machine.reg";
    std::ofstream(registryFile) << sim::regfile::exportRegistryText(sim::kernel::registry());
    std::vector<std::string> command = {MORVANEK_USB_EXECUTABLE};
    command.insert(command.end(), arguments.begin(), arguments.end());
    for (const std::string& extra : {std::string("--json"), std::string("--no-progress"), "--registry=" + registryFile,
                                     "--drive=C=" + driveC.string()})
        command.push_back(extra);

    std::string folder = bus->folder();
    std::string out = outputFolder + "/out.jsonl";
    std::string err = outputFolder + "/err.txt";
    pid_t child = fork();
    if (child == 0) {
        setenv("UMOCKDEV_DIR", folder.c_str(), 1);
        int outFd = open(out.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
        int errFd = open(err.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
        dup2(outFd, 1);
        dup2(errFd, 2);
        std::vector<char*> argv;
        for (std::string& word : command) argv.push_back(word.data());
        argv.push_back(nullptr);
        execv(argv[0], argv.data());
        _exit(127);
    }
    return child;
}

UsbRun UsbWorld::finishUsb(pid_t child, int signal)
{
    if (signal != 0) kill(child, signal);
    int status = 0;
    waitpid(child, &status, 0);
    UsbRun run;
    run.exitCode = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
    run.errors = readFile(outputFolder + "/err.txt");
    std::istringstream lines(readFile(outputFolder + "/out.jsonl"));
    for (std::string line; std::getline(lines, line);) {
        if (!line.empty()) run.events.push_back(nlohmann::json::parse(line));
    }
    return run;
}

UsbRun UsbWorld::runUsb(const std::vector<std::string>& arguments)
{
    return finishUsb(startUsb(arguments), 0);
}

std::vector<sim::RequestRecord> UsbWorld::labTrace(const sim::EmulatedDeviceOptions& options)
{
    auto device = sim::makeEmulatedDevice(options);
    device->plugIn(tree());
    EXPECT_GE(startModule(), 0);
    EXPECT_EQ(callSsMain(1), 0);
    module->dllUnload();
    return device->trace;
}

std::string traceDifference(const std::vector<sim::RequestRecord>& expected, const std::vector<sim::RequestRecord>& seen)
{
    for (size_t i = 0; i < std::max(expected.size(), seen.size()); ++i) {
        if (i >= expected.size()) return "an extra request: " + sim::describeRequest(seen[i]);
        if (i >= seen.size()) return "missing request: " + sim::describeRequest(expected[i]);
        const sim::RequestRecord& a = expected[i];
        const sim::RequestRecord& b = seen[i];
        bool same = a.bmRequestType == b.bmRequestType && a.bRequest == b.bRequest && a.wValue == b.wValue &&
                    a.wIndex == b.wIndex && a.length == b.length && a.outcome == b.outcome && a.data == b.data;
        if (!same) return "expected " + sim::describeRequest(a) + ", saw " + sim::describeRequest(b);
    }
    return "";
}

}  // namespace usb_testing
