#include "pictures.h"

#include <fstream>
#include <set>

#include <fmt/format.h>

#include "scenarioError.h"

namespace lab {

namespace {

// A name fit for a file on any system: letters, digits, '-', '_' and '.', the rest '_'.
std::string fileNamePart(const std::string& name)
{
    std::string out;
    for (char c : name) {
        bool plain = (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '-' ||
                     c == '_' || c == '.';
        out += plain ? c : '_';
    }
    if (out.empty() || out.front() == '.') out.insert(out.begin(), '_');
    return out;
}

void writeFile(const std::filesystem::path& path, const std::string& text)
{
    std::ofstream out(path, std::ios::binary | std::ios::trunc);
    out << text;
    out.close();
    if (!out) throw LabError("cannot write the picture " + path.string());
}

}  // namespace

std::vector<std::filesystem::path> writePictures(const ScenarioResult& result, const std::filesystem::path& folder)
{
    std::vector<std::filesystem::path> written;
    if (!result.scenario || !result.invalid.empty() || !result.labError.empty()) return written;
    const RunRecord& record = result.record;
    std::string scenarioName = std::filesystem::path(result.file).filename().string();
    std::filesystem::path stem = std::filesystem::path(result.file).stem();
    std::filesystem::path into = folder / fileNamePart(stem.empty() || stem == "-" ? "scenario" : stem.string());
    std::error_code error;
    std::filesystem::create_directories(into, error);
    if (error) throw LabError("cannot make the folder " + into.string() + " for pictures: " + error.message());

    BusTimeline timeline = layOutBusTimeline(record);
    std::vector<int> all;
    for (size_t i = 0; i < record.devices.size(); ++i) all.push_back(static_cast<int>(i));
    written.push_back(into / "timeline.svg");
    writeFile(written.back(), timelineSvg(record, timeline, all, scenarioName + ": the updates on the bus"));

    std::set<std::string> taken;
    for (int i : all) {
        const DeviceRecord& device = record.devices[static_cast<size_t>(i)];
        std::string base = fileNamePart(device.name);
        // Two names may come out the same once made fit for a file.
        while (!taken.insert(base).second) base += fmt::format("-{}", i + 1);
        written.push_back(into / (base + "-flash.svg"));
        writeFile(written.back(), flashMapSvg(record, i, fmt::format("{}: flash of {}", scenarioName, device.name)));
        written.push_back(into / (base + "-timeline.svg"));
        writeFile(written.back(),
                  timelineSvg(record, timeline, {i}, fmt::format("{}: {} on the bus", scenarioName, device.name)));
    }
    return written;
}

std::string writePicturesOf(ScenarioResult& result, const std::filesystem::path& folder)
{
    try {
        std::vector<std::filesystem::path> files = writePictures(result, folder);
        if (files.empty()) return "";
        std::vector<std::string> names;
        for (const std::filesystem::path& file : files) names.push_back(file.filename().string());
        return fmt::format("  pictures in {}: {}", files.front().parent_path().string(), fmt::join(names, ", "));
    } catch (const LabError& error) {
        result.labError = error.what();
        return "";
    }
}

}  // namespace lab
