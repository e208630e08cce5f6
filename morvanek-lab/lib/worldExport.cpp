#include "worldExport.h"

#include <algorithm>
#include <cctype>
#include <fstream>
#include <random>
#include <string_view>
#include <system_error>

#include <fmt/format.h>

#include "lab.h"
#include "notExported.h"
#include "regfile/registryText.h"
#include "scenarioError.h"
#include "scenarioRegistry.h"

namespace lab {

namespace fs = std::filesystem;

namespace {

constexpr const char* kRegistryFileName = "registry.reg";
constexpr const char* kDrivePrefix = "drive-";

// A path as one shell word: as it is when it needs no quoting.
std::string shellWord(const std::string& text)
{
    bool plain = !text.empty() && std::all_of(text.begin(), text.end(), [](char c) {
        return std::isalnum(static_cast<unsigned char>(c)) != 0 || std::string_view("/._-=+:,@%").find(c) != std::string_view::npos;
    });
    if (plain) return text;
    std::string quoted = "'";
    for (char c : text) quoted += c == '\'' ? std::string("'\\''") : std::string(1, c);
    return quoted + "'";
}

void check(const std::error_code& error, const std::string& what)
{
    if (error) throw LabError(fmt::format("cannot {}: {}", what, error.message()));
}

void writeFile(const fs::path& path, const std::string_view bytes)
{
    std::error_code error;
    fs::create_directories(path.parent_path(), error);
    check(error, "make " + path.parent_path().string());
    std::ofstream out(path, std::ios::binary);
    out.write(bytes.data(), static_cast<std::streamsize>(bytes.size()));
    out.close();
    if (!out) throw LabError("cannot write " + path.string());
}

// A drive's file, DOS separators turned into folders.
fs::path pathInDrive(const fs::path& drive, const std::string& dosRelative)
{
    fs::path path = drive;
    size_t start = 0;
    while (start <= dosRelative.size()) {
        size_t end = std::min(dosRelative.find('\\', start), dosRelative.size());
        path /= dosRelative.substr(start, end - start);
        start = end + 1;
    }
    return path;
}

bool isInside(const fs::path& inner, const fs::path& outer)
{
    auto mismatch = std::mismatch(outer.begin(), outer.end(), inner.begin(), inner.end());
    return mismatch.first == outer.end();
}

// A real folder a drive stands for, copied so that the export holds everything.
// What is neither a file nor a folder (a link to a folder, a device node) is named, not copied.
void copyDriveFolder(const fs::path& from, const fs::path& to, char letter, std::vector<std::string>& notExported)
{
    std::error_code error;
    fs::recursive_directory_iterator entries(from, error);
    check(error, "read " + from.string());
    for (auto end = fs::recursive_directory_iterator(); entries != end; entries.increment(error)) {
        check(error, "read " + from.string());
        const fs::directory_entry& entry = *entries;
        fs::path target = to / fs::relative(entry.path(), from);
        if (entry.is_symlink(error) && entry.is_directory(error)) {
            notExported.push_back(fmt::format("drive {}: {} is a link to a folder; not copied", letter, entry.path().string()));
        } else if (entry.is_directory(error)) {
            fs::create_directories(target, error);
            check(error, "make " + target.string());
        } else if (entry.is_regular_file(error)) {
            fs::copy_file(entry.path(), target, error);
            check(error, "copy " + entry.path().string());
        } else {
            notExported.push_back(
                fmt::format("drive {}: {} is neither a file nor a folder; not copied", letter, entry.path().string()));
        }
    }
    check(error, "read " + from.string());
}

// Writes the whole export into `staging`.
WorldExport writeExport(const Scenario& scenario, const fs::path& staging)
{
    WorldExport written;
    written.notExported = partsNotExported(scenario);
    // A registry of its own: nothing another run left in the kernel's stand-in comes along.
    sim::kernel::Registry registry;
    try {
        fillRegistry(registry, scenario.registry);
    } catch (const std::runtime_error& error) {
        throw LabError(error.what());
    }
    written.registryFile = staging / kRegistryFileName;
    writeFile(written.registryFile, sim::regfile::exportRegistryText(registry));
    for (const DrivePlan& drive : scenario.drives) {
        fs::path root = staging / (kDrivePrefix + std::string(1, drive.letter));
        std::error_code error;
        fs::create_directories(root, error);
        check(error, "make " + root.string());
        if (drive.folder) copyDriveFolder(*drive.folder, root, drive.letter, written.notExported);
        for (const FilePlan& file : drive.files) {
            writeFile(pathInDrive(root, file.path),
                      std::string_view(reinterpret_cast<const char*>(file.bytes.data()), file.bytes.size()));
        }
        written.drives.emplace_back(drive.letter, root);
    }
    return written;
}

bool isExportPart(const fs::path& name)
{
    std::string text = name.string();
    return text == kRegistryFileName || text.rfind(kDrivePrefix, 0) == 0;
}

}  // namespace

std::string WorldExport::usbArguments() const
{
    std::string arguments = "--registry " + shellWord(registryFile.string());
    for (const auto& [letter, folder] : drives) arguments += " --drive " + shellWord(fmt::format("{}={}", letter, folder.string()));
    return arguments;
}

WorldExport exportWorld(const Scenario& scenario, const fs::path& folder, bool force)
{
    std::error_code error;
    fs::path target = fs::absolute(folder, error).lexically_normal();
    check(error, "find " + folder.string());
    if (!target.has_filename()) target = target.parent_path();

    bool existed = fs::exists(target, error);
    if (existed && !fs::is_directory(target, error))
        throw CommandError(kExitScenarioInvalid, fmt::format("{} exists and is not a folder", target.string()));
    bool empty = existed && fs::is_empty(target, error);
    check(error, "read " + target.string());
    if (existed && !force && !empty) {
        throw CommandError(kExitScenarioInvalid,
                           fmt::format("{} is not empty; --force replaces its registry.reg and drive-* folders",
                                       target.string()));
    }
    fs::path resolved = fs::weakly_canonical(target, error);
    for (const DrivePlan& drive : scenario.drives) {
        if (!drive.folder) continue;
        std::error_code unresolved;
        fs::path driveFolder = fs::weakly_canonical(*drive.folder, unresolved);
        if (!unresolved && !driveFolder.empty() && isInside(resolved, driveFolder)) {
            throw CommandError(kExitScenarioInvalid,
                               fmt::format("{} lies inside drive {}'s folder {}, which is copied into it; export elsewhere",
                                           target.string(), drive.letter, drive.folder->string()));
        }
    }

    fs::create_directories(target, error);
    check(error, "make " + target.string());
    fs::path staging;
    std::random_device random;
    for (int attempt = 0; attempt < 10 && staging.empty(); ++attempt) {
        fs::path candidate = target / fmt::format(".export-{:08x}", random());
        if (fs::create_directory(candidate, error)) staging = candidate;
    }
    if (staging.empty()) throw LabError(fmt::format("cannot make a folder in {}: {}", target.string(), error.message()));

    WorldExport written;
    try {
        written = writeExport(scenario, staging);
        if (force) {
            std::vector<fs::path> old;
            for (const auto& entry : fs::directory_iterator(target)) {
                if (isExportPart(entry.path().filename())) old.push_back(entry.path());
            }
            for (const fs::path& path : old) fs::remove_all(path);
        }
        written.registryFile = target / kRegistryFileName;
        fs::rename(staging / kRegistryFileName, written.registryFile);
        for (auto& [letter, root] : written.drives) {
            fs::path placed = target / root.filename();
            fs::rename(root, placed);
            root = placed;
        }
        fs::remove(staging);
    } catch (const std::exception& failure) {
        fs::remove_all(staging, error);
        if (!existed) fs::remove(target, error);
        if (dynamic_cast<const LabError*>(&failure) != nullptr) throw;
        throw LabError(failure.what());
    }
    return written;
}

}  // namespace lab
