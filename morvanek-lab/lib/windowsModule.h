// The lab's Windows engine: the real morvanek.sys under Wine, in place of
// libmorvanek.so. To the rest of the lab it is a ModuleImage like the Linux
// one: the same exports, and the same host stand-in and emulated devices
// behind the host's calls. The scenario's registry and drives are put into
// the Wine prefix, where the module meets Wine's own kernel.
#pragma once

#include <filesystem>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "bridgeServer.h"
#include "scenario.h"
#include "sim/loader/moduleImage.h"
#include "wineProcess.h"

namespace lab {

class WindowsModule final : public sim::ModuleImage {
public:
    // `drives`: the scenario's drive letters and the folders that hold them;
    // `hostPath` finds the Linux file behind a DOS path. Throws LabError.
    WindowsModule(const Scenario& scenario, const std::map<char, std::filesystem::path>& drives,
                  BridgeServer::HostPath hostPath);
    ~WindowsModule() override;

    // Ends the Windows side: what karvelk.sys and Wine's kernel still hold
    // for the module, one line each, and the prefix put back as it was.
    std::vector<std::string> finish();

    // A call into the Windows process, serving its host calls meanwhile.
    std::vector<uint8_t> call(uint32_t kind, const std::vector<uint8_t>& payload);

    const uint8_t* guid() const { return guid_; }

private:
    void placeDrives(const std::map<char, std::filesystem::path>& drives);
    void removeDrives();
    // The scenario's registry, the values it lacks, its kernel faults and files held elsewhere.
    void prepareKernel(const Scenario& scenario);

    WineSetup setup_;
    std::unique_ptr<WineProcess> process_;
    std::unique_ptr<BridgeServer> server_;
    std::filesystem::path regFile_;
    std::vector<std::filesystem::path> placedFiles_;    // copied into the prefix's C: drive
    std::vector<std::filesystem::path> placedFolders_;  // made there for them, deepest last
    std::vector<std::filesystem::path> placedLinks_;    // other drive letters
    std::optional<std::vector<std::string>> finished_;
    uint8_t guid_[16] = {};
};

}  // namespace lab
