// morvanek-lab: runs the real loader module against emulated devices and
// shows what it did. The work is in the lab library; this is the command line.
//
// With --json, standard output carries exactly one JSON document whatever
// happens, errors of the command line included; without it, reports go to
// standard output and errors and progress to standard error.
#include <unistd.h>

#include <cstdio>
#include <cstring>
#include <filesystem>
#include <iostream>
#include <string>
#include <vector>

#include <CLI/CLI.hpp>
#include <fmt/format.h>
#include <nlohmann/json.hpp>

#include "lib/examine.h"
#include "lib/jsonNode.h"
#include "lib/lab.h"
#include "lib/pictures.h"
#include "lib/reports.h"
#include "lib/scenarioError.h"
#include "lib/scenarioParser.h"
#include "lib/sweep.h"
#include "lib/worldExport.h"
#include "source/versionServices.h"

namespace {

constexpr const char* kExitCodes =
    "Exit codes: 0 success, 1 an expectation failed, 2 a scenario (or the command line) is invalid, "
    "3 the lab itself failed (for example, the module cannot be loaded).";

const char* const kCommands[] = {"run", "demo", "sweep", "inspect", "export"};
const char* const kInspectCommands[] = {"image", "identity"};

struct CommonOptions {
    bool json = false;
    bool trace = false;
    bool noProgress = false;
    std::string modulePath;
    std::vector<std::string> memory;
    std::string engine = "linux";
    std::string svgFolder;
};

// How the command reports what stopped it: a line on standard error, or the
// one JSON document on standard output.
class Reporter {
public:
    explicit Reporter(bool json) : json_(json) {}

    int fail(int exitCode, const std::string& message) const
    {
        if (json_) {
            nlohmann::json document = {{"exitCode", exitCode}, {"error", message}};
            std::cout << document.dump(2, ' ', false, nlohmann::json::error_handler_t::replace) << "\n";
        } else {
            fmt::print(stderr, "morvanek-lab: {}\n", message);
        }
        return exitCode;
    }

private:
    bool json_;
};

void addCommonOptions(CLI::App& command, CommonOptions& options)
{
    command.add_flag("--json", options.json, "write one machine-readable report, and nothing else, on standard output");
    command.add_flag("--trace", options.trace, "list every request each device received");
    // One value per --memory, so that it never swallows the scenario files after it.
    command.add_option("--memory", options.memory, "show device memory: ADDRESS:LENGTH, such as 0x0200:64 (repeatable)")
        ->allow_extra_args(false);
    command.add_flag("--no-progress", options.noProgress, "no progress line, even on a terminal");
    command.add_option("--module", options.modulePath, "the module to load (default: the one built beside the lab)");
    command
        .add_option("--engine", options.engine,
                     "linux: the Linux module (default); windows: the real morvanek.sys under Wine; both: each "
                     "scenario on both, failing where their reports differ")
        ->check(CLI::IsMember({"linux", "windows", "both"}));
    command.add_option("--svg", options.svgFolder,
                       "write pictures into this folder: per device a flash map and a timeline on the bus model");
}

// "0x0200:64" -> address and length, inside the device's 64 KiB.
lab::MemoryRange parseMemoryRange(const std::string& text)
{
    size_t colon = text.find(':');
    auto address = lab::parseNumberText(text.substr(0, colon));
    auto length = colon == std::string::npos ? std::optional<int64_t>(16) : lab::parseNumberText(text.substr(colon + 1));
    if (!address || !length || *address < 0 || *length <= 0)
        throw lab::CommandError(lab::kExitScenarioInvalid, "--memory \"" + text + "\" is not ADDRESS:LENGTH");
    if (*address > 0xFFFF || *length > 0x10000 - *address) {
        throw lab::CommandError(lab::kExitScenarioInvalid,
                                fmt::format("--memory \"{}\" runs past the end of the device's memory: addresses go "
                                            "from 0x0000 to 0xFFFF",
                                            text));
    }
    return {static_cast<uint16_t>(*address), static_cast<size_t>(*length)};
}

bool progressWanted(const CommonOptions& common)
{
    return !common.noProgress && isatty(fileno(stderr)) != 0;
}

int runScenarios(const std::vector<std::string>& files, const CommonOptions& common)
{
    lab::RunOptions options;
    options.modulePath = common.modulePath;
    options.trace = common.trace;
    options.engine = common.engine == "windows" ? lab::Engine::windowsDriver
                     : common.engine == "both"  ? lab::Engine::both
                                                : lab::Engine::linuxModule;
    options.progress = progressWanted(common);
    for (const std::string& range : common.memory) options.memoryRanges.push_back(parseMemoryRange(range));

    std::vector<lab::ScenarioResult> results;
    for (size_t i = 0; i < files.size(); ++i) {
        options.scenarioNumber = i + 1;
        options.scenarioCount = files.size();
        results.push_back(lab::runScenarioFile(files[i], options));
        std::string pictures = common.svgFolder.empty() ? "" : lab::writePicturesOf(results.back(), common.svgFolder);
        if (common.json) continue;
        // A scenario that could not run is an error: its line goes to standard error.
        const lab::ScenarioResult& result = results.back();
        bool stopped = !result.invalid.empty() || !result.labError.empty();
        if (i != 0 && !stopped) std::fputs("\n", stdout);
        lab::printTextReport(stopped ? stderr : stdout, result, options);
        if (!pictures.empty()) fmt::print("{}\n", pictures);
        std::fflush(stopped ? stderr : stdout);
    }
    if (common.json) {
        std::cout << lab::jsonReport(results, options).dump(2, ' ', false, nlohmann::json::error_handler_t::replace)
                  << "\n";
        // Standard output carries only the report: say what stopped a scenario on standard error too.
        for (const lab::ScenarioResult& result : results) {
            if (!result.invalid.empty()) fmt::print(stderr, "morvanek-lab: invalid scenario: {}\n", result.invalid);
            if (!result.labError.empty()) fmt::print(stderr, "morvanek-lab: {}: {}\n", result.file, result.labError);
        }
    } else {
        lab::printSummary(stdout, results);
    }
    return lab::combinedExitCode(results);
}

struct SweepCommand {
    std::string file;
    std::string faults = "all";
    std::string reproducers = "sweep-reproducers";
};

int sweepScenario(const SweepCommand& command, const CommonOptions& common)
{
    lab::SweepKindChoice choice = lab::chooseSweepKinds(command.faults);
    if (!choice.unknown.empty()) {
        std::vector<std::string> names;
        for (lab::SweepKind kind : lab::allSweepKinds()) names.push_back(lab::sweepKindName(kind));
        throw lab::CommandError(lab::kExitScenarioInvalid,
                                fmt::format("--faults: \"{}\" is not a kind of fault; the kinds are {}, or all or none",
                                            choice.unknown, fmt::join(names, ", ")));
    }
    lab::SweepOptions options;
    options.modulePath = common.modulePath;
    options.kinds = choice.kinds;
    options.progress = progressWanted(common);
    options.reproducerFolder = command.reproducers;
    lab::SweepResult result = lab::sweepScenarioFile(command.file, options);
    if (common.json) {
        std::cout << lab::sweepJsonReport(result).dump(2, ' ', false, nlohmann::json::error_handler_t::replace) << "\n";
        if (!result.invalid.empty()) fmt::print(stderr, "morvanek-lab: invalid scenario: {}\n", result.invalid);
        if (!result.labError.empty()) fmt::print(stderr, "morvanek-lab: {}: {}\n", result.file, result.labError);
    } else {
        lab::printSweepReport(stdout, result);
    }
    return result.exitCode();
}

struct ExportCommand {
    std::string file;
    std::string folder;
    bool force = false;
};

// Standard output: the morvanek-usb arguments (or, with --json, the one
// document); standard error: a line per part a real machine cannot be given.
int exportScenario(const ExportCommand& command, bool json)
{
    lab::Scenario scenario;
    try {
        scenario = command.file == lab::kStandardInput
                       ? lab::loadScenarioStream(std::cin, "(standard input)", std::filesystem::current_path())
                       : lab::loadScenarioFile(command.file);
    } catch (const lab::ScenarioError& error) {
        throw lab::CommandError(lab::kExitScenarioInvalid, std::string("invalid scenario: ") + error.what());
    }
    lab::WorldExport written = lab::exportWorld(scenario, command.folder, command.force);
    for (const std::string& part : written.notExported) fmt::print(stderr, "morvanek-lab: not exported: {}\n", part);
    if (json) {
        nlohmann::json drives = nlohmann::json::object();
        for (const auto& [letter, folder] : written.drives) drives[std::string(1, letter)] = folder.string();
        nlohmann::json document = {{"registry", written.registryFile.string()},
                                   {"drives", drives},
                                   {"arguments", written.usbArguments()},
                                   {"notExported", written.notExported}};
        std::cout << document.dump(2, ' ', false, nlohmann::json::error_handler_t::replace) << "\n";
    } else {
        fmt::print("{}\n", written.usbArguments());
    }
    return lab::kExitSuccess;
}

// The first word that is not an option names the command; CLI11 would call a
// mistyped one an unexpected argument, which does not help.
std::string unknownCommand(int argc, char** argv)
{
    int at = 1;
    while (at < argc && argv[at][0] == '-') ++at;
    if (at == argc) return {};
    auto known = [](const char* word, const auto& names) {
        for (const char* name : names) {
            if (std::strcmp(word, name) == 0) return true;
        }
        return false;
    };
    if (!known(argv[at], kCommands)) {
        return fmt::format("unknown command \"{}\"; the commands are run, demo, sweep, inspect and export (morvanek-lab --help)",
                           argv[at]);
    }
    if (std::strcmp(argv[at], "inspect") != 0) return {};
    ++at;
    while (at < argc && argv[at][0] == '-') ++at;
    if (at < argc && !known(argv[at], kInspectCommands)) {
        return fmt::format("unknown inspect command \"{}\"; inspect image FILE or inspect identity FILE", argv[at]);
    }
    return {};
}

std::string versionText()
{
    char text[16];
    return fmt::format("morvanek-lab for the morvanek module {} (0x{:08X})", tSSVersion(kCurrentVersion).toString(text),
                       kCurrentVersion);
}

}  // namespace

int main(int argc, char** argv)
{
    bool json = false;
    bool version = false;
    for (int i = 1; i < argc; ++i) {
        json = json || std::strcmp(argv[i], "--json") == 0;
        version = version || std::strcmp(argv[i], "--version") == 0;
    }
    Reporter reporter(json);
    if (version) {
        if (json) {
            std::cout << nlohmann::json{{"version", versionText()}, {"moduleVersion", fmt::format("0x{:08X}", kCurrentVersion)}}.dump(2)
                      << "\n";
        } else {
            fmt::print("{}\n", versionText());
        }
        return lab::kExitSuccess;
    }
    if (std::string unknown = unknownCommand(argc, argv); !unknown.empty())
        return reporter.fail(lab::kExitScenarioInvalid, unknown);

    CLI::App app{"morvanek-lab: runs the morvanek loader module against emulated loader-mode devices and shows what "
                 "it did to each."};
    app.footer(kExitCodes);
    app.require_subcommand(1);
    app.add_flag("--version", "say which module this lab was built for");
    app.add_flag("--json", "with any command: one JSON document on standard output, errors included");

    CommonOptions common;
    std::vector<std::string> files;
    CLI::App* run = app.add_subcommand("run", "run scenario files and check their expectations");
    run->add_option("scenario", files, "scenario files (JSON); - reads one from standard input")->required();
    addCommonOptions(*run, common);

    CLI::App* demo = app.add_subcommand("demo", "run the bundled demonstration: two devices, one on each loader");
    addCommonOptions(*demo, common);

    SweepCommand sweepCommand;
    CLI::App* sweep = app.add_subcommand(
        "sweep", "run a scenario once clean, then once per place a fault can strike, and check every run against what "
                 "the loader promises");
    sweep->add_option("scenario", sweepCommand.file, "the scenario file (JSON)")->required();
    sweep->add_option("--faults", sweepCommand.faults,
                      "kinds of fault, separated by commas; \"all\" (the default) or \"none\" (the clean run only)");
    sweep->add_option("--reproducers", sweepCommand.reproducers,
                      "where the scenarios that reproduce violations are written (default: sweep-reproducers)");
    sweep->add_flag("--json", common.json, "write one machine-readable report, and nothing else, on standard output");
    sweep->add_flag("--no-progress", common.noProgress, "no progress line, even on a terminal");
    sweep->add_option("--module", common.modulePath, "the module to load (default: the one built beside the lab)");

    lab::InspectOptions inspect;
    CLI::App* inspectCommand = app.add_subcommand("inspect", "decode an image file or an identity block");
    inspectCommand->require_subcommand(1);
    CLI::App* image = inspectCommand->add_subcommand("image", "decode a firmware image as the module reads it");
    image->add_option("file", inspect.file, "the image file")->required()->check(CLI::ExistingFile);
    image->add_option("--expect", inspect.expectedVersion, "a version to check the image against, such as 0x0143C000");
    image->add_option("--product", inspect.productId, "the product ID to install the image for (default 0x4B01)");
    image->add_flag("--json", inspect.json, "machine-readable output");
    image->add_option("--module", inspect.modulePath, "the module to load");
    CLI::App* identity = inspectCommand->add_subcommand(
        "identity", "decode an identity block (16 bytes) or a flash dump and say what the identity check makes of it");
    identity->add_option("file", inspect.file, "16-byte identity block or whole flash dump")->required()->check(CLI::ExistingFile);
    identity->add_option("--loader", inspect.loaderProductId, "the loader product ID, 0x4A10 (default) or 0x4A20");
    identity->add_option("--fvtpid", inspect.fvtpid, "the registry's FVTPID value, such as 4B01");
    identity->add_flag("--json", inspect.json, "machine-readable output");
    identity->add_option("--module", inspect.modulePath, "the module to load");

    ExportCommand exportCommand;
    CLI::App* exportWorld = app.add_subcommand(
        "export", "write a scenario's registry and drives into a folder, for morvanek-usb on a real machine");
    exportWorld->add_option("scenario", exportCommand.file, "the scenario file (JSON); - reads it from standard input")
        ->required();
    exportWorld->add_option("folder", exportCommand.folder, "where registry.reg and the drive-* folders go")->required();
    exportWorld->add_flag("--force", exportCommand.force,
                          "write into a folder that is not empty, replacing its registry.reg and drive-* folders");
    exportWorld->add_flag("--json", common.json, "write one machine-readable report, and nothing else, on standard output");

    try {
        app.parse(argc, argv);
    } catch (const CLI::CallForHelp& help) {
        return app.exit(help);
    } catch (const CLI::CallForAllHelp& help) {
        return app.exit(help);
    } catch (const CLI::ParseError& error) {
        return reporter.fail(lab::kExitScenarioInvalid, std::string(error.what()) + " (morvanek-lab --help)");
    }

    // --json holds wherever it stands on the line.
    common.json = common.json || json;
    inspect.json = inspect.json || json;
    try {
        if (run->parsed()) return runScenarios(files, common);
        if (demo->parsed()) return runScenarios({MORVANEK_LAB_DEMO_SCENARIO}, common);
        if (sweep->parsed()) return sweepScenario(sweepCommand, common);
        if (image->parsed()) return lab::inspectImage(inspect, stdout);
        if (identity->parsed()) return lab::inspectIdentity(inspect, stdout);
        if (exportWorld->parsed()) return exportScenario(exportCommand, common.json);
    } catch (const lab::CommandError& error) {
        return reporter.fail(error.exitCode(), error.what());
    } catch (const std::exception& error) {
        return reporter.fail(lab::kExitLabError, error.what());
    }
    return reporter.fail(lab::kExitScenarioInvalid, "no command given (morvanek-lab --help)");
}
