// morvanek-usb: runs the unchanged loader module against real USB devices,
// through libusb. The work is in the host library and the session; this is
// the command line.
#include <unistd.h>

#include <regex>

#include <CLI/CLI.hpp>

#include "programOptions.h"
#include "reporter.h"
#include "session.h"

namespace {

constexpr const char* kExitCodes =
    "Exit codes: 0 every selected loader-mode device was updated (watch: stopped cleanly), "
    "1 an update failed or was abandoned, or a device came back in loader mode, "
    "2 the command line, a .reg file or a drive folder is invalid, "
    "3 USB, the module or the host failed, or something was left behind, "
    "4 (once) no loader-mode device of the selection is present.";

void addOptions(CLI::App& command, usbapp::ProgramOptions& options)
{
    command
        .add_option("--registry", options.registryFiles,
                    "a registry-editor export (.reg) the loader reads its settings from (repeatable)")
        ->check(CLI::ExistingFile);
    command
        .add_option_function<std::vector<std::string>>(
            "--drive",
            [&options](const std::vector<std::string>& drives) {
                for (const std::string& drive : drives) {
                    if (drive.size() < 3 || drive[1] != '=' || !std::isalpha(static_cast<unsigned char>(drive[0])))
                        throw CLI::ValidationError("--drive",
                                                   "\"" + drive + "\" is not LETTER=FOLDER, such as C=/srv/windows");
                    options.drives[static_cast<char>(std::toupper(static_cast<unsigned char>(drive[0])))] =
                        drive.substr(2);
                }
            },
            "a folder that stands for a Windows drive: LETTER=FOLDER, such as C=/srv/windows (repeatable)")
        ->expected(1, -1);
    command
        .add_option("--device", options.busPaths, "update only the device at this bus path, such as 1-3.2 (repeatable)")
        ->check([](const std::string& path) {
            static const std::regex form("[0-9]+-[0-9]+(\\.[0-9]+)*");
            return std::regex_match(path, form) ? std::string() : "\"" + path + "\" is not a bus path such as 1-3.2";
        });
    command.add_option("--serial", options.serials, "update only the device with this USB serial number (repeatable)");
    command.add_flag("--json", options.json, "JSON lines on standard output instead of text on standard error");
    command.add_flag("--no-progress", options.noProgress, "no progress line, even on a terminal");
    command.add_option("--timeout-ms", options.timeoutMs, "time-out of each control transfer (default 5000)")
        ->check(CLI::Range(1u, 600000u));
    command.add_option("--module", options.modulePath,
                       "the module to load (default: the one built beside this program)");
}

}  // namespace

int main(int argc, char** argv)
{
    usbapp::ProgramOptions options;
    CLI::App app("morvanek-usb: updates the firmware of loader-mode devices on USB with the morvanek loader module");
    app.footer(kExitCodes);
    app.require_subcommand(1);
    CLI::App* once = app.add_subcommand("once", "update every selected loader-mode device present now, then exit");
    CLI::App* watch =
        app.add_subcommand("watch", "update every selected loader-mode device that is present or arrives, "
                                    "until SIGINT or SIGTERM");
    addOptions(*once, options);
    addOptions(*watch, options);
    once->add_option("--settle-ms", options.settleMs,
                     "how long to wait for restarted devices to come back on the bus (default 5000)");
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& error) {
        int code = app.exit(error);
        return code == 0 ? 0 : usbapp::kExitInvalid;
    }
    options.mode = watch->parsed() ? usbapp::Mode::watch : usbapp::Mode::once;

    usbapp::installStopSignals();
    usbapp::Reporter reporter(options.json, !options.noProgress && isatty(fileno(stderr)) != 0);
    return usbapp::runSession(options, reporter);
}
