// What the command line asked for.
#pragma once

#include <map>
#include <string>
#include <vector>

namespace usbapp {

enum class Mode { once, watch };

// Exit codes; the same list is in the help text and in docs/usb.md.
constexpr int kExitSuccess = 0;       // once: every selected loader-mode device updated; watch: stopped cleanly
constexpr int kExitUpdateFailed = 1;  // an update failed or was abandoned, or a device came back in loader mode
constexpr int kExitInvalid = 2;       // the command line, a .reg file or a drive folder is invalid
constexpr int kExitCannotRun = 3;     // USB, the module or the host failed; or something was left behind
constexpr int kExitNothingFound = 4;  // once: no loader-mode device of the selection is present

struct ProgramOptions {
    Mode mode = Mode::once;
    std::vector<std::string> registryFiles;
    std::map<char, std::string> drives;  // upper-case letter to folder
    std::vector<std::string> busPaths;
    std::vector<std::string> serials;
    bool json = false;
    bool noProgress = false;
    unsigned timeoutMs = 0;    // 0: the host's default
    unsigned settleMs = 5000;  // once: how long to wait for restarted devices to come back
    std::string modulePath;
    std::string serviceKey = "\\Registry\\Machine\\System\\CurrentControlSet\\Services\\morvanek";
};

}  // namespace usbapp
