// morvanek-lab: runs the real loader module against emulated devices and
// shows what it did. The work is in the lab library; this is the command line.
#include <unistd.h>

#include <cstdio>
#include <iostream>

#include <CLI/CLI.hpp>
#include <fmt/format.h>

#include "lib/examine.h"
#include "lib/jsonNode.h"
#include "lib/lab.h"
#include "lib/reports.h"
#include "lib/sweep.h"

namespace {

constexpr const char* kExitCodes =
    "Exit codes: 0 success, 1 an expectation failed, 2 a scenario (or the command line) is invalid, "
    "3 the lab itself failed (for example, the module cannot be loaded).";

struct CommonOptions {
    bool json = false;
    bool trace = false;
    bool noProgress = false;
    std::string modulePath;
    std::vector<std::string> memory;
};

void addCommonOptions(CLI::App& command, CommonOptions& options)
{
    command.add_flag("--json", options.json, "write one machine-readable report, and nothing else, on standard output");
    command.add_flag("--trace", options.trace, "list every request each device received");
    command.add_option("--memory", options.memory, "show device memory: ADDRESS:LENGTH, such as 0x0200:64 (repeatable)");
    command.add_flag("--no-progress", options.noProgress, "no progress line, even on a terminal");
    command.add_option("--module", options.modulePath, "the module to load (default: the one built beside the lab)");
}

// "0x0200:64" -> address and length; throws ScenarioError-free CLI validation errors.
lab::MemoryRange parseMemoryRange(const std::string& text)
{
    size_t colon = text.find(':');
    auto address = lab::parseNumberText(text.substr(0, colon));
    auto length = colon == std::string::npos ? std::optional<int64_t>(16) : lab::parseNumberText(text.substr(colon + 1));
    if (!address || !length || *address < 0 || *address > 0xFFFF || *length <= 0 || *length > 0x10000)
        throw CLI::ValidationError("--memory", "\"" + text + "\" is not ADDRESS:LENGTH within 0x0000 to 0xFFFF");
    return {static_cast<uint16_t>(*address), static_cast<size_t>(*length)};
}

int runScenarios(const std::vector<std::string>& files, const CommonOptions& common)
{
    lab::RunOptions options;
    options.modulePath = common.modulePath;
    options.trace = common.trace;
    options.progress = !common.json && !common.noProgress && isatty(fileno(stdout)) != 0;
    for (const std::string& range : common.memory) options.memoryRanges.push_back(parseMemoryRange(range));

    std::vector<lab::ScenarioResult> results;
    for (size_t i = 0; i < files.size(); ++i) {
        results.push_back(lab::runScenarioFile(files[i], options));
        if (common.json) continue;
        if (i != 0) std::fputs("\n", stdout);
        lab::printTextReport(stdout, results.back(), options);
        std::fflush(stdout);
    }
    if (common.json) {
        std::cout << lab::jsonReport(results, options).dump(2) << "\n";
    } else {
        lab::printSummary(stdout, results);
    }
    // With --json, standard output carries only the report: say what stopped a scenario on standard error too.
    for (const lab::ScenarioResult& result : results) {
        if (!common.json) break;
        if (!result.invalid.empty()) fmt::print(stderr, "morvanek-lab: invalid scenario: {}\n", result.invalid);
        if (!result.labError.empty()) fmt::print(stderr, "morvanek-lab: {}: {}\n", result.file, result.labError);
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
        fmt::print(stderr, "morvanek-lab: --faults: \"{}\" is not a kind of fault; the kinds are {}, or all or none\n",
                   choice.unknown, fmt::join(names, ", "));
        return lab::kExitScenarioInvalid;
    }
    lab::SweepOptions options;
    options.modulePath = common.modulePath;
    options.kinds = choice.kinds;
    options.progress = !common.json && !common.noProgress && isatty(fileno(stdout)) != 0;
    options.reproducerFolder = command.reproducers;
    lab::SweepResult result = lab::sweepScenarioFile(command.file, options);
    if (common.json) {
        std::cout << lab::sweepJsonReport(result).dump(2) << "\n";
        if (!result.invalid.empty()) fmt::print(stderr, "morvanek-lab: invalid scenario: {}\n", result.invalid);
        if (!result.labError.empty()) fmt::print(stderr, "morvanek-lab: {}: {}\n", result.file, result.labError);
    } else {
        lab::printSweepReport(stdout, result);
    }
    return result.exitCode();
}

}  // namespace

int main(int argc, char** argv)
{
    CLI::App app{"morvanek-lab: runs the morvanek loader module against emulated loader-mode devices and shows what "
                 "it did to each."};
    app.footer(kExitCodes);
    app.require_subcommand(1);

    CommonOptions common;
    std::vector<std::string> files;
    CLI::App* run = app.add_subcommand("run", "run scenario files and check their expectations");
    run->add_option("scenario", files, "scenario files (JSON)")->required();
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

    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& error) {
        int code = app.exit(error);
        return code == 0 ? 0 : lab::kExitScenarioInvalid;
    }

    try {
        if (run->parsed()) return runScenarios(files, common);
        if (demo->parsed()) return runScenarios({MORVANEK_LAB_DEMO_SCENARIO}, common);
        if (sweep->parsed()) return sweepScenario(sweepCommand, common);
        if (image->parsed()) return lab::inspectImage(inspect, stdout);
        if (identity->parsed()) return lab::inspectIdentity(inspect, stdout);
    } catch (const CLI::ValidationError& error) {
        fmt::print(stderr, "morvanek-lab: {}\n", error.what());
        return lab::kExitScenarioInvalid;
    } catch (const std::exception& error) {
        fmt::print(stderr, "morvanek-lab: {}\n", error.what());
        return lab::kExitLabError;
    }
    return lab::kExitScenarioInvalid;
}
