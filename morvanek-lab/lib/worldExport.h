// A scenario's world written out for a real machine: the registry as a
// registry-editor export and each drive as a folder, so that morvanek-usb can
// run the module against real devices in the world the scenario describes.
#pragma once

#include <filesystem>
#include <string>
#include <utility>
#include <vector>

#include "scenario.h"

namespace lab {

struct WorldExport {
    std::filesystem::path registryFile;                            // FOLDER/registry.reg
    std::vector<std::pair<char, std::filesystem::path>> drives;    // letter, FOLDER/drive-<letter>
    std::vector<std::string> notExported;                          // see partsNotExported, and files a drive folder could not give
    // "--registry FOLDER/registry.reg --drive C=FOLDER/drive-C", paths quoted for a shell where they need it.
    std::string usbArguments() const;
};

// Writes FOLDER/registry.reg and FOLDER/drive-<letter> for every drive, FOLDER
// made when missing. A FOLDER that holds anything is refused (CommandError,
// invalid command line) unless `force`, which replaces registry.reg and every
// drive-* folder and leaves the rest. Everything is written beside the old
// export first, so a failure (LabError) leaves FOLDER as it was.
WorldExport exportWorld(const Scenario& scenario, const std::filesystem::path& folder, bool force);

}  // namespace lab
