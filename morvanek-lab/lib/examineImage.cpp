#include <fstream>
#include <iterator>

#include <fmt/format.h>
#include <nlohmann/json.hpp>

#include "imageHeaderText.h"
#include "examine.h"
#include "lab.h"
#include "scenarioError.h"

namespace lab {

namespace {

constexpr const char* kSystemVersionKey = "\\Registry\\Machine\\Software\\Microsoft\\Windows NT\\CurrentVersion";

// A world in which the image is the product's 0200 image, and the module's
// compareFirmwareVersion is asked about each version in turn.
Scenario comparisonScenario(const InspectOptions& options, const std::vector<uint8_t>& image,
                            const std::vector<uint32_t>& versions)
{
    Scenario scenario;
    scenario.file = options.file;
    scenario.registry.keys.push_back({kSystemVersionKey, {{"SystemRoot", 1, sim::kernel::utf16leBytes("C:\\WINDOWS")}}});
    DrivePlan drive;
    drive.files.push_back({fmt::format("WINDOWS\\system32\\drivers\\QVUSB{:04X}0200.bin", options.productId), image, false});
    scenario.drives.push_back(drive);
    for (uint32_t version : versions) {
        StepPlan step;
        step.kind = StepKind::compareFirmwareVersion;
        step.version = version;
        step.productId = options.productId;
        scenario.steps.push_back(step);
    }
    return scenario;
}

std::string conclusion(int32_t status)
{
    switch (status) {
    case 0:
        return "accepted";
    case -50252:
        return "refused: the image is older than expected (-50252)";
    case -50253:
        return "refused: the image is newer than expected (-50253)";
    case -50150:
        return "refused: the image could not be opened (-50150)";
    default:
        return fmt::format("status {}", status);
    }
}

}  // namespace

int inspectImage(const InspectOptions& options, std::FILE* out)
{
    std::ifstream in(options.file, std::ios::binary);
    std::vector<uint8_t> image((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
    DecodedHeader header = decodeImageHeader(image);
    bool compared = header.readable && (header.headerRevision & 0xFF00) == 0x0200 && header.imageType != 0xF0;
    bool markerRoom = image.size() >= 8 && image[6] == 0xFF && image[7] == 0xFF;
    bool fits4A10 = !image.empty() && image.size() <= 0x3400;
    bool fits4A20 = !image.empty() && image.size() <= 0x7600;

    // The module's own reading: its compareFirmwareVersion against the decoded
    // version must accept, and against the expected version says what it says.
    std::vector<uint32_t> versions = {header.imageVersion};
    if (options.expectedVersion) versions.push_back(*options.expectedVersion);
    RunOptions runOptions;
    runOptions.modulePath = options.modulePath;
    ScenarioResult result = runScenario(comparisonScenario(options, image, versions), runOptions);
    if (!result.labError.empty()) throw CommandError(kExitLabError, result.labError);
    int32_t selfCheck = result.record.steps.at(0).status.value_or(0);
    std::optional<int32_t> againstExpected;
    if (options.expectedVersion) againstExpected = result.record.steps.at(1).status;

    if (options.json) {
        nlohmann::json report = {
            {"file", options.file},
            {"size", image.size()},
            {"headerText", header.text},
            {"headerReadable", header.readable},
            {"imageVersion", fmt::format("0x{:08X}", header.imageVersion)},
            {"field2", fmt::format("0x{:08X}", header.field2)},
            {"field3", fmt::format("0x{:04X}", header.field3)},
            {"field4", fmt::format("0x{:04X}", header.field4)},
            {"headerRevision", fmt::format("0x{:04X}", header.headerRevision)},
            {"imageType", fmt::format("0x{:02X}", header.imageType)},
            {"versionCompared", compared},
            {"moduleAgreesOnVersion", selfCheck == 0},
            {"loaders", {{"0x4A10", fits4A10}, {"0x4A20", fits4A20}}},
            {"roomForMarker", markerRoom}};
        if (!header.problem.empty()) report["headerProblem"] = header.problem;
        if (againstExpected) {
            report["expected"] = fmt::format("0x{:08X}", *options.expectedVersion);
            report["compareFirmwareVersionStatus"] = *againstExpected;
        }
        fmt::print(out, "{}\n", report.dump(2));
        return kExitSuccess;
    }

    fmt::print(out, "{}\n", options.file);
    fmt::print(out, "  size            {} bytes (0x{:X})\n", image.size(), image.size());
    fmt::print(out, "  header text     \"{}\" at offset 514\n", header.text);
    if (!header.readable) {
        fmt::print(out, "  header          unreadable: {}; the module takes it as revision 0x0100 and compares nothing\n",
                   header.problem);
    } else {
        if (!header.problem.empty()) fmt::print(out, "  header          {}\n", header.problem);
        fmt::print(out, "  image version   0x{:08X}\n", header.imageVersion);
        fmt::print(out, "  fields 2 to 4   0x{:08X} 0x{:04X} 0x{:04X}\n", header.field2, header.field3, header.field4);
        fmt::print(out, "  revision        0x{:04X}{}\n", header.headerRevision,
                   (header.headerRevision & 0xFF00) == 0x0200 ? "" : " (not 0x02xx: the version is not compared)");
        fmt::print(out, "  image type      0x{:02X}{}\n", header.imageType,
                   header.imageType == 0xF0 ? " (exempt from the version comparison)" : "");
    }
    fmt::print(out, "  version check   {}\n",
               compared ? fmt::format("compared; the module reads 0x{:08X}{}", header.imageVersion,
                                      selfCheck == 0 ? " too" : fmt::format(" differently (status {})", selfCheck))
                        : "any expected version is accepted");
    if (againstExpected)
        fmt::print(out, "  against 0x{:08X}  {}\n", *options.expectedVersion, conclusion(*againstExpected));
    auto fits = [&](bool ok, size_t room) {
        if (image.empty()) return std::string("no: the image is empty");
        return ok ? fmt::format("yes ({} of {} bytes)", image.size(), room)
                  : fmt::format("no: {} bytes is more than the {} before the identity page", image.size(), room);
    };
    fmt::print(out, "  loader 0x4A10   {}\n", fits(fits4A10, 0x3400));
    fmt::print(out, "  loader 0x4A20   {}\n", fits(fits4A20, 0x7600));
    fmt::print(out, "  marker room     {}\n",
               markerRoom ? "yes: bytes 6 and 7 are FF FF"
                          : image.size() < 8 ? "no: the image is shorter than 8 bytes"
                                             : fmt::format("no: bytes 6 and 7 are {:02X} {:02X}; the completion marker "
                                                           "AA 55 cannot be programmed over them",
                                                           image[6], image[7]));
    return kExitSuccess;
}

}  // namespace lab
