#include "guestMachine.h"

#include <sys/wait.h>

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <stdexcept>

namespace usb_kernel_testing {

namespace {

namespace fs = std::filesystem;

struct CommandResult {
    int exitCode = -1;
    std::string out;
};

CommandResult runCommand(const std::string& command)
{
    CommandResult result;
    FILE* pipe = popen(command.c_str(), "r");
    if (pipe == nullptr) return result;
    char buffer[4096];
    size_t got;
    while ((got = fread(buffer, 1, sizeof buffer, pipe)) > 0) result.out.append(buffer, got);
    int status = pclose(pipe);
    result.exitCode = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    return result;
}

std::string readText(const fs::path& path)
{
    std::ifstream in(path);
    std::stringstream text;
    text << in.rdbuf();
    return text.str();
}

std::string guestFolder()
{
    return std::string(MORVANEK_BINARY_DIR) + "/guest";
}

// The job the guest runs: the gadgets, then morvanek-usb once the devices
// have enumerated, then the gadgets stopped so they write their reports.
// The gadgets of the job, started in the background.
std::string gadgetLines(const GuestJob& plan)
{
    std::ostringstream lines;
    for (size_t i = 0; i < plan.gadgets.size(); ++i) {
        lines << shellQuoted(MORVANEK_USB_GADGET_EXECUTABLE) << " " << shellQuoted(plan.scenarioFile) << " --device "
              << shellQuoted(plan.gadgets[i].device) << " --udc dummy_udc." << i << " --name device" << i;
        if (!plan.gadgets[i].serial.empty()) lines << " --serial " << shellQuoted(plan.gadgets[i].serial);
        lines << " --report gadget-" << i << ".json --ready ready-" << i << " 2>gadget-" << i << ".err &\n";
        lines << "gadgets+=($!)\n";
    }
    return lines.str();
}

// Waits up to `seconds` for a shell condition.
std::string waitFor(const std::string& condition, int seconds)
{
    return "for i in $(seq " + std::to_string(seconds * 10) + "); do " + condition + " && break; sleep 0.1; done\n";
}

// once: the gadgets, then morvanek-usb once the devices have enumerated.
// watch: morvanek-usb first, then the gadgets arrive; it is stopped with
// SIGTERM once every device came back after its restart. Then the gadgets
// are stopped, so that they write their reports.
std::string jobScript(const GuestJob& plan, const std::string& usbCommand)
{
    std::string count = std::to_string(plan.gadgets.size());
    std::ostringstream job;
    job << "set -u\ncd \"$(dirname \"$0\")\"\ngadgets=()\n" << plan.beforeGadgets << "\n";
    if (plan.watch) {
        job << usbCommand << " >usb.out 2>usb.err &\nusb=$!\nsleep 1\n" << gadgetLines(plan)
            << waitFor("[ \"$(grep -c 'back after its restart' usb.out)\" -ge " + count + " ]", 60)
            << "kill -TERM $usb\nwait $usb\necho $? >usb.exit\n";
    } else {
        job << gadgetLines(plan)
            << waitFor("[ \"$(ls ready-* 2>/dev/null | wc -l)\" -eq " + count + " ] && [ \"$(grep -l '^5c1d$' "
                       "/sys/bus/usb/devices/*/idVendor 2>/dev/null | wc -l)\" -eq " + count + " ]",
                       20)
            << "udevadm settle --timeout=20\n"
            << usbCommand << " >usb.out 2>usb.err\necho $? >usb.exit\n";
    }
    job << plan.afterUsb << "\nkill -TERM \"${gadgets[@]}\"\nwait\n";
    return job.str();
}

}  // namespace

std::string shellQuoted(const std::string& text)
{
    std::string out = "'";
    for (char c : text) out += c == '\'' ? std::string("'\\''") : std::string(1, c);
    return out + "'";
}

std::vector<nlohmann::json> GuestRun::eventsOf(const std::string& kind) const
{
    std::vector<nlohmann::json> found;
    for (const auto& event : events) {
        if (event.value("event", "") == kind) found.push_back(event);
    }
    return found;
}

std::string GuestRun::file(const std::string& name) const
{
    return readText(fs::path(folder) / name);
}

std::vector<nlohmann::json> GuestRun::updates() const
{
    std::vector<nlohmann::json> found;
    for (const auto& event : eventsOf("update")) {
        if (event.value("outcome", "") != "ignored") found.push_back(event);
    }
    return found;
}

std::string GuestMachine::prepare()
{
    static const std::string verdict = [] {
        CommandResult prepared = runCommand(shellQuoted(std::string(MORVANEK_GUEST_SCRIPTS) + "/prepareGuest") + " " +
                                            shellQuoted(guestFolder()) + " 2>&1");
        if (prepared.exitCode == 0) return std::string();
        if (prepared.exitCode == 77) return prepared.out.empty() ? std::string("skipped") : prepared.out;
        throw std::runtime_error("the guest could not be prepared: " + prepared.out);
    }();
    return verdict;
}

GuestRun GuestMachine::run(const std::string& jobName, const GuestJob& job)
{
    const std::string& scenarioFile = job.scenarioFile;
    const std::vector<GadgetPlan>& gadgets = job.gadgets;
    fs::path folder = fs::path(MORVANEK_BINARY_DIR) / "usbKernel" / jobName;
    fs::remove_all(folder);
    fs::create_directories(folder);

    CommandResult exported = runCommand(shellQuoted(MORVANEK_LAB_EXECUTABLE) + " export " + shellQuoted(scenarioFile) + " " +
                                        shellQuoted((folder / "world").string()) + " 2>/dev/null");
    if (exported.exitCode != 0) throw std::runtime_error("the lab could not export " + scenarioFile);
    std::string worldArguments = exported.out.substr(0, exported.out.find('\n'));

    std::string usbCommand =
        job.usbPrefix + " " + shellQuoted(MORVANEK_USB_EXECUTABLE) + (job.watch ? " watch" : " once") +
        " --json --no-progress " + worldArguments;
    for (const std::string& argument : job.usbArguments) usbCommand += " " + shellQuoted(argument);
    std::ofstream(folder / "job.sh") << jobScript(job, usbCommand);

    CommandResult guest = runCommand(shellQuoted(std::string(MORVANEK_GUEST_SCRIPTS) + "/runGuest") + " " +
                                     shellQuoted(guestFolder()) + " " + shellQuoted(folder.string()) + " " +
                                     shellQuoted((folder / "job.sh").string()) + " " + std::to_string(gadgets.size()) +
                                     " 2>&1");
    GuestRun run;
    run.folder = folder.string();
    run.log = guest.out + readText(folder / "job.log") + readText(folder / "usb.err");
    for (size_t i = 0; i < gadgets.size(); ++i) run.log += readText(folder / ("gadget-" + std::to_string(i) + ".err"));
    if (guest.exitCode != 0) throw std::runtime_error("the guest did not run the job:\n" + run.log);

    std::string exitText = readText(folder / "usb.exit");
    run.usbExitCode = exitText.empty() ? -1 : std::stoi(exitText);
    run.usbErrors = readText(folder / "usb.err");
    std::istringstream lines(readText(folder / "usb.out"));
    for (std::string line; std::getline(lines, line);) {
        if (!line.empty()) run.events.push_back(nlohmann::json::parse(line, nullptr, false));
    }
    for (size_t i = 0; i < gadgets.size(); ++i) {
        std::string report = readText(folder / ("gadget-" + std::to_string(i) + ".json"));
        run.gadgets[gadgets[i].device] = nlohmann::json::parse(report, nullptr, false);
    }
    return run;
}

std::map<std::string, nlohmann::json> GuestMachine::labDevices(const std::string& scenarioFile)
{
    CommandResult lab =
        runCommand(shellQuoted(MORVANEK_LAB_EXECUTABLE) + " run --trace --json " + shellQuoted(scenarioFile) + " 2>/dev/null");
    nlohmann::json report = nlohmann::json::parse(lab.out, nullptr, false);
    std::map<std::string, nlohmann::json> traces;
    if (report.is_discarded()) return traces;
    for (const auto& device : report["scenarios"][0]["devices"]) traces[device["name"]] = device;
    return traces;
}

std::vector<std::string> GuestMachine::deviceNames(const std::string& scenarioFile)
{
    nlohmann::json scenario = nlohmann::json::parse(readText(scenarioFile), nullptr, false);
    std::vector<std::string> names;
    if (scenario.is_discarded()) return names;
    for (const auto& device : scenario.value("devices", nlohmann::json::array())) names.push_back(device["name"]);
    return names;
}

std::string traceDifference(const nlohmann::json& expected, const nlohmann::json& seen)
{
    auto summary = [](const nlohmann::json& request) {
        return request.value("text", "?") + " outcome " + std::to_string(request.value("outcome", 0));
    };
    size_t count = std::max(expected.size(), seen.size());
    for (size_t i = 0; i < count; ++i) {
        if (i >= expected.size()) return "an extra request: " + summary(seen[i]);
        if (i >= seen.size()) return "missing request: " + summary(expected[i]);
        for (const char* field : {"bmRequestType", "bRequest", "wValue", "wIndex", "length", "outcome", "data"}) {
            if (expected[i].value(field, nlohmann::json()) != seen[i].value(field, nlohmann::json()))
                return "request " + std::to_string(i + 1) + ": expected " + summary(expected[i]) + ", saw " +
                       summary(seen[i]) + " (" + field + " differs)";
        }
    }
    return "";
}

}  // namespace usb_kernel_testing
