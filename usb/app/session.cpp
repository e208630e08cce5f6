#include "session.h"

#include <csignal>
#include <filesystem>
#include <memory>

#include <fmt/format.h>

#include "../../regfile/registryText.h"
#include "../../sim/kernel/simKernel.h"
#include "../../sim/loader/moduleImage.h"

namespace usbapp {

namespace {

volatile std::sig_atomic_t gStopSignals = 0;

void onStopSignal(int)
{
    if (gStopSignals < 2) gStopSignals = gStopSignals + 1;
}

constexpr int kPumpMs = 100;

// Acts on the signals received so far; true once a stop was asked for.
bool followStopSignals(Reporter& reporter, int& seen)
{
    int now = gStopSignals;
    if (now == seen) return now != 0;
    seen = now;
    if (now == 1) {
        usbhost::stopDeliveringArrivals();
        size_t running = usbhost::updatesRunning();
        if (running != 0) {
            reporter.note(fmt::format("stopping: waiting for {} running update(s) to finish; "
                                      "send the signal again to abandon them",
                                      running));
        }
    } else {
        usbhost::abandonUpdates();
        reporter.note("abandoning the running updates after their current request; "
                      "those devices stay in loader mode");
    }
    return true;
}

bool configureKernel(const ProgramOptions& options, Reporter& reporter)
{
    sim::kernel::reset();
    for (const std::string& file : options.registryFiles) {
        try {
            sim::regfile::importRegistryFile(sim::kernel::registry(), file);
        } catch (const std::exception& problem) {
            reporter.error(problem.what());
            return false;
        }
    }
    for (const auto& [letter, folder] : options.drives) {
        std::error_code error;
        if (!std::filesystem::is_directory(folder, error)) {
            reporter.error(fmt::format("drive {}: {} is not a folder", letter, folder));
            return false;
        }
        sim::kernel::files().mapDrive(letter, folder);
    }
    return true;
}

// The module built beside this program, or, installed, the one in
// lib/morvanek next to the program's folder.
std::string defaultModulePath()
{
    std::error_code error;
    if (std::filesystem::exists(sim::ModuleImage::defaultPath(), error)) return sim::ModuleImage::defaultPath();
    std::filesystem::path program = std::filesystem::read_symlink("/proc/self/exe", error);
    return (program.parent_path().parent_path() / "lib" / "morvanek" / "libmorvanek.so").string();
}

int onceExitCode(const std::vector<usbhost::UpdateRecord>& updates, const std::vector<usbhost::Comeback>& comebacks)
{
    bool anyLoader = false;
    bool anyFailure = false;
    for (const auto& update : updates) {
        if (update.outcome != usbhost::Outcome::ignored) anyLoader = true;
        if (update.outcome == usbhost::Outcome::failed || update.outcome == usbhost::Outcome::abandoned)
            anyFailure = true;
    }
    for (const auto& comeback : comebacks) anyFailure = anyFailure || comeback.inLoaderMode;
    if (anyFailure) return kExitUpdateFailed;
    return anyLoader ? kExitSuccess : kExitNothingFound;
}

}  // namespace

void installStopSignals()
{
    struct sigaction action {};
    action.sa_handler = onStopSignal;
    sigemptyset(&action.sa_mask);
    sigaction(SIGINT, &action, nullptr);
    sigaction(SIGTERM, &action, nullptr);
}

int runSession(const ProgramOptions& options, Reporter& reporter)
{
    if (!configureKernel(options, reporter)) return kExitInvalid;

    usbhost::HostOptions host;
    host.transferTimeoutMs = options.timeoutMs;
    host.busPaths = options.busPaths;
    host.serials = options.serials;
    host.observer = [&reporter](const usbhost::HostEvent& event) { reporter.event(event); };
    std::string problem;
    if (!usbhost::start(host, problem)) {
        reporter.error(problem);
        return kExitCannotRun;
    }

    std::unique_ptr<sim::ModuleImage> module;
    try {
        module =
            std::make_unique<sim::ModuleImage>(options.modulePath.empty() ? defaultModulePath() : options.modulePath);
    } catch (const std::exception& failure) {
        reporter.error(failure.what());
        usbhost::shutdown();
        return kExitCannotRun;
    }
    NTSTATUS loaded = module->initialize(options.serviceKey);
    if (loaded != 0) {
        reporter.error(fmt::format("the module refused to load (status 0x{:08X})", static_cast<uint32_t>(loaded)));
        usbhost::shutdown();
        return kExitCannotRun;
    }
    usbhost::setDeliverNewLoaderArrivals(options.mode == Mode::watch);
    tStatus started = usbhost::callModuleMain(0);
    if (started < 0) {
        reporter.error(fmt::format("the module did not start (status {})", started));
        module->dllUnload();
        usbhost::shutdown();
        return kExitCannotRun;
    }

    int signalsSeen = 0;
    size_t delivered = usbhost::announcePresentDevices();
    if (options.mode == Mode::once) {
        if (delivered == 0) reporter.note("no device of the selection is on the bus");
        while (usbhost::updatesRunning() != 0) {
            usbhost::pumpEvents(kPumpMs);
            followStopSignals(reporter, signalsSeen);
        }
        // A restarted device leaves and comes back; wait to see as what.
        auto waiting = [] {
            for (const auto& comeback : usbhost::comebacks()) {
                if (!comeback.seen) return true;
            }
            return false;
        };
        auto deadline = std::chrono::steady_clock::now() + std::chrono::milliseconds(options.settleMs);
        while (waiting() && std::chrono::steady_clock::now() < deadline && !followStopSignals(reporter, signalsSeen))
            usbhost::pumpEvents(kPumpMs);
        usbhost::pumpEvents(0);
    } else {
        reporter.note("watching for loader-mode devices; stop with SIGINT or SIGTERM");
        while (!followStopSignals(reporter, signalsSeen)) usbhost::pumpEvents(kPumpMs);
    }

    usbhost::stopDeliveringArrivals();
    while (usbhost::updatesRunning() != 0) {
        usbhost::pumpEvents(kPumpMs);
        followStopSignals(reporter, signalsSeen);
    }
    usbhost::callModuleMain(1);
    module->dllUnload();
    module.reset();

    std::vector<usbhost::UpdateRecord> updates = usbhost::finishedUpdates();
    std::vector<usbhost::Comeback> comebacks = usbhost::comebacks();
    for (const auto& comeback : comebacks) {
        if (comeback.inLoaderMode) {
            reporter.note(comeback.busPath +
                          ": came back in loader mode after its restart: the new firmware did not take");
        } else if (!comeback.seen && options.mode == Mode::once) {
            reporter.note(comeback.busPath + ": restarted, and not seen back on the bus within the settle time");
        }
    }
    std::vector<std::string> left = usbhost::leftovers();
    for (const std::string& handle : sim::kernel::openHandleDescriptions())
        left.push_back("open kernel handle: " + handle);
    for (const std::string& misuse : sim::kernel::misuseReports())
        reporter.error("misuse of the kernel by the module: " + misuse);
    usbhost::shutdown();

    int code = options.mode == Mode::once ? onceExitCode(updates, comebacks) : kExitSuccess;
    if (!left.empty() || usbhost::misuseCount() != 0 || !sim::kernel::misuseReports().empty()) code = kExitCannotRun;
    reporter.summary(code, updates, comebacks, left);
    return code;
}

}  // namespace usbapp
