// A scenario's world exported for morvanek-usb: the registry.reg reads back as
// the registry the World builds, every drive holds exactly the scenario's
// files, what a real machine cannot be given is named, and a folder that
// holds anything is written into only when asked.
#include <gtest/gtest.h>

#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <map>
#include <regex>
#include <string>
#include <tuple>
#include <vector>

#include <nlohmann/json.hpp>

#include "morvanek-lab/lib/lab.h"
#include "morvanek-lab/lib/notExported.h"
#include "morvanek-lab/lib/scenarioError.h"
#include "morvanek-lab/lib/scenarioParser.h"
#include "morvanek-lab/lib/scenarioRegistry.h"
#include "morvanek-lab/lib/worldExport.h"
#include "regfile/registryText.h"

namespace {

namespace fs = std::filesystem;

// A fresh folder per call; tests of this program run side by side under ctest.
fs::path freshFolder(const std::string& name)
{
    static int calls = 0;
    fs::path folder = fs::path(::testing::TempDir()) /
                      ("morvanek-export-" + std::to_string(::getpid()) + "-" + std::to_string(++calls) + "-" + name);
    fs::remove_all(folder);
    return folder;
}

std::string readBytes(const fs::path& path)
{
    std::ifstream in(path, std::ios::binary);
    return std::string((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
}

void writeBytes(const fs::path& path, const std::string& bytes)
{
    fs::create_directories(path.parent_path());
    std::ofstream(path, std::ios::binary) << bytes;
}

// Every file below a folder, by its path relative to it ("WINDOWS/x.bin").
std::map<std::string, std::string> filesUnder(const fs::path& root)
{
    std::map<std::string, std::string> files;
    for (const auto& entry : fs::recursive_directory_iterator(root)) {
        if (entry.is_regular_file()) files[fs::relative(entry.path(), root).generic_string()] = readBytes(entry.path());
    }
    return files;
}

// The files a drive of the scenario stands for, as the lab would use them.
std::map<std::string, std::string> scenarioFiles(const lab::DrivePlan& drive)
{
    if (drive.folder) return filesUnder(*drive.folder);
    std::map<std::string, std::string> files;
    for (const lab::FilePlan& file : drive.files) {
        files[std::regex_replace(file.path, std::regex("\\\\"), "/")] = std::string(file.bytes.begin(), file.bytes.end());
    }
    return files;
}

using RegistryDump = std::vector<std::tuple<std::string, std::string, uint32_t, std::vector<uint8_t>>>;

// Keys and values, in the stand-in's order, comparable as a whole.
RegistryDump dump(const sim::kernel::Registry& registry)
{
    RegistryDump rows;
    for (const sim::kernel::RegistryKeyContent& key : registry.contents()) {
        rows.emplace_back(key.path, "", UINT32_MAX, std::vector<uint8_t>{});
        for (const sim::kernel::RegistryValue& value : key.values) rows.emplace_back(key.path, value.name, value.type, value.data);
    }
    return rows;
}

// Every scenario the lab ships or tests its engines with, and the documented example.
std::vector<std::string> scenarioFilesToExport()
{
    std::vector<std::string> files{MORVANEK_SOURCE_DIR "/docs/example/example.json"};
    for (const char* folder : {MORVANEK_LAB_SCENARIOS, MORVANEK_SOURCE_DIR "/tests/lab/engines"}) {
        for (const auto& entry : fs::directory_iterator(folder)) {
            if (entry.path().extension() == ".json") files.push_back(entry.path().string());
        }
    }
    std::sort(files.begin(), files.end());
    return files;
}

class ExportedScenario : public ::testing::TestWithParam<std::string> {};

TEST_P(ExportedScenario, ReadsBackAsTheWorldTheLabBuilds)
{
    const lab::Scenario scenario = lab::loadScenarioFile(GetParam());
    const fs::path folder = freshFolder("shipped");
    const lab::WorldExport written = lab::exportWorld(scenario, folder, false);

    sim::kernel::Registry expected;
    lab::fillRegistry(expected, scenario.registry);
    sim::kernel::Registry readBack;
    sim::regfile::importRegistryFile(readBack, (folder / "registry.reg").string());
    EXPECT_EQ(dump(readBack), dump(expected));
    EXPECT_EQ(readBytes(written.registryFile).rfind("Windows Registry Editor Version 5.00", 0), 0u);

    std::string arguments = "--registry " + (folder / "registry.reg").string();
    ASSERT_EQ(written.drives.size(), scenario.drives.size());
    for (size_t i = 0; i < scenario.drives.size(); ++i) {
        const lab::DrivePlan& drive = scenario.drives[i];
        const fs::path root = folder / ("drive-" + std::string(1, drive.letter));
        EXPECT_EQ(written.drives[i], std::make_pair(drive.letter, root));
        EXPECT_EQ(filesUnder(root), scenarioFiles(drive)) << "drive " << drive.letter;
        arguments += " --drive " + std::string(1, drive.letter) + "=" + root.string();
    }
    EXPECT_EQ(written.usbArguments(), arguments);
    EXPECT_EQ(written.notExported, lab::partsNotExported(scenario));
    // Nothing but the export: the staging folder is gone.
    size_t entries = static_cast<size_t>(std::distance(fs::directory_iterator(folder), fs::directory_iterator()));
    EXPECT_EQ(entries, 1 + scenario.drives.size());
    fs::remove_all(folder);
}

INSTANTIATE_TEST_SUITE_P(EveryShippedScenario, ExportedScenario, ::testing::ValuesIn(scenarioFilesToExport()),
                         [](const ::testing::TestParamInfo<std::string>& info) {
                             // "firmware-path-with-slashes" -> "FirmwarePathWithSlashes"
                             std::string name;
                             bool wordStarts = true;
                             for (char c : fs::path(info.param).stem().string()) {
                                 if (!std::isalnum(static_cast<unsigned char>(c))) {
                                     wordStarts = true;
                                     continue;
                                 }
                                 name += wordStarts ? static_cast<char>(std::toupper(static_cast<unsigned char>(c))) : c;
                                 wordStarts = false;
                             }
                             return name;
                         });

// One image on C:, and whatever the case adds.
lab::Scenario scenarioWith(const std::string& parts)
{
    std::string text = R"({"drives": {"C": {"files": {"WINDOWS\\x.bin": {"hex": "01 02"}}}})" +
                       std::string(parts.empty() ? "" : ", ") + parts + "}";
    return lab::parseScenarioText(text, "world.json", ".");
}

TEST(WorldExport, NamesEveryPartARealMachineCannotBeGiven)
{
    struct Case {
        const char* parts;     // scenario fields beside the drive
        const char* expected;  // the one line it must give
    };
    const Case cases[] = {
        {R"("registry": {"faults": [{"key": "HKLM\\Software\\X", "status": "0xC0000022"}]})",
         R"(registry fault: opening \Registry\Machine\Software\X fails with 0xC0000022)"},
        {R"("registry": {"faults": [{"key": "HKLM\\Software\\X", "value": "V", "status": -1, "number": 2}]})",
         R"(registry fault: querying value "V" of \Registry\Machine\Software\X fails with 0xFFFFFFFF at call 2)"},
        {R"("fileFaults": {"failReads": "0xC0000185"})", "file fault: every read fails with 0xC0000185"},
        {R"("fileFaults": {"failRead": {"number": 3, "status": "0xC0000185"}})", "file fault: read 3 fails with 0xC0000185"},
        {R"("fileFaults": {"failSizeQuery": "0xC0000022"})", "file fault: every size query fails with 0xC0000022"},
        {R"("fileFaults": {"failSizeQuery": {"file": "C:\\WINDOWS\\x.bin", "number": 1, "status": "0xC0000022"}})",
         R"(file fault: size query 1 of C:\WINDOWS\x.bin fails with 0xC0000022)"},
        {R"("fileFaults": {"failSetPosition": "0xC0000022"})", "file fault: every position change fails with 0xC0000022"},
        {R"("fileFaults": {"failOpen": {"file": "C:\\WINDOWS\\x.bin", "number": 2, "status": "0xC0000022"}})",
         R"(file fault: open 2 of C:\WINDOWS\x.bin fails with 0xC0000022)"},
        {R"("fileFaults": {"failOpen": {"number": 1, "status": "0xC0000022"}})", "file fault: open 1 fails with 0xC0000022"},
        {R"("fileFaults": {"shortReads": {"number": 2, "bytes": 5}})", "file fault: read 2 brings at most 5 bytes"},
        {R"("fileFaults": {"changeContent": {"file": "C:\\WINDOWS\\x.bin", "hex": "03"}})",
         R"(content change: C:\WINDOWS\x.bin becomes other bytes after 1 open(s); its first bytes are exported)"},
        {R"("drives": {"D": {"files": {"y.bin": {"hex": "00", "heldOpenElsewhere": true}}}})",
         R"(heldOpenElsewhere: D:\y.bin is exported as an ordinary file)"},
        {R"("host": {"ready": false})", "host: the host library is not ready"},
        {R"("host": {"deviceTree": false})", "host: there is no device tree"},
        {R"("host": {"failAllocations": 4})", "host fault: allocation 4 fails"},
        {R"("host": {"failAllAllocations": true})", "host fault: every allocation fails"},
        {R"("host": {"registrationFailure": -50001})", "host fault: registration fails with 0xFFFF3CAF"},
        {R"("host": {"unregistrationFailure": -50001})", "host fault: unregistration fails with 0xFFFF3CAF"},
        {R"("host": {"failCreateQuery": -1})", "host fault: every createQuery of the device tree fails with 0xFFFFFFFF"},
        {R"("host": {"failAddListener": {"number": 2, "status": -1}})",
         "host fault: addListener 2 of the device tree fails with 0xFFFFFFFF"},
        {R"("devices": [{"name": "a"}, {"name": "b", "faults": {"stallRequests": [1]}}])",
         "devices (a, b), with their faults: served elsewhere; put them on a bus (morvanek-usb-gadget)"},
    };
    for (const Case& item : cases) {
        std::string parts = item.parts;
        // A second drive is written into the case's own "drives".
        if (parts.rfind(R"("drives")", 0) == 0) {
            parts = std::regex_replace(parts, std::regex(R"(^"drives": \{)"),
                                       R"("drives": {"C": {"files": {"WINDOWS\\x.bin": {"hex": "01 02"}}}, )");
            lab::Scenario scenario = lab::parseScenarioText("{" + parts + "}", "world.json", ".");
            EXPECT_EQ(lab::partsNotExported(scenario), std::vector<std::string>{item.expected}) << item.parts;
            continue;
        }
        EXPECT_EQ(lab::partsNotExported(scenarioWith(parts)), std::vector<std::string>{item.expected}) << item.parts;
    }
    EXPECT_TRUE(lab::partsNotExported(scenarioWith("")).empty());
}

TEST(WorldExport, CopiesADriveFolderAndNamesWhatIsNeitherFileNorFolder)
{
    const fs::path images = freshFolder("images");
    writeBytes(images / "top.bin", "top");
    writeBytes(images / "deeper" / "inner.bin", std::string("\0\xFF", 2));
    fs::create_directory_symlink(images / "deeper", images / "link");
    lab::Scenario scenario =
        lab::parseScenarioText(R"({"drives": {"E": {"folder": ")" + images.string() + R"("}}})", "world.json", ".");

    const fs::path folder = freshFolder("copied");
    lab::WorldExport written = lab::exportWorld(scenario, folder, false);
    EXPECT_EQ(filesUnder(folder / "drive-E"),
              (std::map<std::string, std::string>{{"deeper/inner.bin", std::string("\0\xFF", 2)}, {"top.bin", "top"}}));
    ASSERT_EQ(written.notExported.size(), 1u);
    EXPECT_NE(written.notExported[0].find("is a link to a folder; not copied"), std::string::npos) << written.notExported[0];

    // A folder inside the drive's folder would be copied into itself.
    try {
        lab::exportWorld(scenario, images / "export", false);
        ADD_FAILURE() << "exported into the drive's own folder";
    } catch (const lab::CommandError& error) {
        EXPECT_EQ(error.exitCode(), lab::kExitScenarioInvalid);
        EXPECT_NE(std::string(error.what()).find("lies inside drive E's folder"), std::string::npos) << error.what();
    }
    EXPECT_FALSE(fs::exists(images / "export"));
    fs::remove_all(folder);
    fs::remove_all(images);
}

TEST(WorldExport, WritesIntoAFolderThatHoldsAnythingOnlyWhenForcedAndThenOnlyItsOwnParts)
{
    const lab::Scenario scenario = scenarioWith("");
    const fs::path folder = freshFolder("forced");
    writeBytes(folder / "notes.txt", "mine");
    writeBytes(folder / "registry.reg", "old");
    writeBytes(folder / "drive-Z" / "old.bin", "old");
    const auto before = filesUnder(folder);

    try {
        lab::exportWorld(scenario, folder, false);
        ADD_FAILURE() << "wrote into a folder that holds files";
    } catch (const lab::CommandError& error) {
        EXPECT_EQ(error.exitCode(), lab::kExitScenarioInvalid);
        EXPECT_NE(std::string(error.what()).find("is not empty; --force replaces"), std::string::npos) << error.what();
    }
    EXPECT_EQ(filesUnder(folder), before);

    lab::exportWorld(scenario, folder, true);
    auto after = filesUnder(folder);
    EXPECT_EQ(after.count("drive-Z/old.bin"), 0u);
    EXPECT_EQ(after["notes.txt"], "mine");
    EXPECT_EQ(after["drive-C/WINDOWS/x.bin"], "\x01\x02");
    EXPECT_EQ(after["registry.reg"].rfind("Windows Registry Editor Version 5.00", 0), 0u);
    EXPECT_EQ(after.size(), 3u);

    // A file where the folder should be is no folder to write into, forced or not.
    try {
        lab::exportWorld(scenario, folder / "notes.txt", true);
        ADD_FAILURE() << "wrote into a file";
    } catch (const lab::CommandError& error) {
        EXPECT_NE(std::string(error.what()).find("exists and is not a folder"), std::string::npos) << error.what();
    }
    fs::remove_all(folder);
}

TEST(WorldExport, AFailedExportLeavesTheFolderAsItWas)
{
    // "a" is a file, so "a\b" cannot be written below it.
    const lab::Scenario clash =
        lab::parseScenarioText(R"({"drives": {"C": {"files": {"a": {"hex": "01"}, "a\\b": {"hex": "02"}}}}})", "clash.json", ".");
    const fs::path missing = freshFolder("missing");
    EXPECT_THROW(lab::exportWorld(clash, missing, false), lab::LabError);
    EXPECT_FALSE(fs::exists(missing));

    const fs::path exported = freshFolder("kept");
    lab::exportWorld(scenarioWith(""), exported, false);
    const auto before = filesUnder(exported);
    EXPECT_THROW(lab::exportWorld(clash, exported, true), lab::LabError);
    EXPECT_EQ(filesUnder(exported), before);
    EXPECT_EQ(std::distance(fs::directory_iterator(exported), fs::directory_iterator()), 2);
    fs::remove_all(exported);
}

// The command as a user runs it: standard output, standard error, exit code.
struct Streams {
    int exitCode = -1;
    std::string output;
    std::string errors;
};

Streams runExport(const std::string& arguments)
{
    const fs::path base = freshFolder("streams");
    std::string command = std::string(MORVANEK_LAB_EXECUTABLE) + " export " + arguments + " >" + base.string() +
                          ".out 2>" + base.string() + ".err </dev/null";
    int status = std::system(command.c_str());
    Streams streams{WIFEXITED(status) ? WEXITSTATUS(status) : -1, readBytes(base.string() + ".out"),
                    readBytes(base.string() + ".err")};
    fs::remove(base.string() + ".out");
    fs::remove(base.string() + ".err");
    return streams;
}

TEST(ExportCommand, PrintsTheUsbArgumentsAndNamesWhatItLeavesOut)
{
    const std::string example = MORVANEK_SOURCE_DIR "/docs/example/example.json";
    const fs::path folder = freshFolder("command with space");
    const std::string quoted = "'" + folder.string() + "'";

    Streams first = runExport(example + " " + quoted);
    EXPECT_EQ(first.exitCode, lab::kExitSuccess) << first.errors;
    EXPECT_EQ(first.output, "--registry '" + (folder / "registry.reg").string() + "' --drive 'C=" +
                                (folder / "drive-C").string() + "' --drive 'D=" + (folder / "drive-D").string() + "'\n");
    EXPECT_EQ(first.errors,
              "morvanek-lab: not exported: devices (bench, spare), with their faults: served elsewhere; put them on a "
              "bus (morvanek-usb-gadget)\n");

    Streams again = runExport(example + " " + quoted);
    EXPECT_EQ(again.exitCode, lab::kExitScenarioInvalid);
    EXPECT_EQ(again.output, "");
    EXPECT_NE(again.errors.find("is not empty; --force replaces its registry.reg and drive-* folders"), std::string::npos)
        << again.errors;

    Streams forced = runExport("--force --json " + example + " " + quoted);
    EXPECT_EQ(forced.exitCode, lab::kExitSuccess) << forced.errors;
    nlohmann::json document = nlohmann::json::parse(forced.output);
    EXPECT_EQ(document["drives"]["D"], (folder / "drive-D").string());
    EXPECT_EQ(document["arguments"].get<std::string>() + "\n", first.output);
    EXPECT_EQ(document["notExported"].size(), 1u);

    Streams invalid = runExport(MORVANEK_SOURCE_DIR "/tests/lab/scenarios/bad-json.json " + quoted + "-not-made");
    EXPECT_EQ(invalid.exitCode, lab::kExitScenarioInvalid);
    EXPECT_NE(invalid.errors.find("invalid scenario: "), std::string::npos) << invalid.errors;
    EXPECT_FALSE(fs::exists(folder.string() + "-not-made"));
    EXPECT_EQ(runExport(example).exitCode, lab::kExitScenarioInvalid);  // no folder
    fs::remove_all(folder);
}

}  // namespace
