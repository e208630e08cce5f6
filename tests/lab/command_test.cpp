// The lab as a command: exit codes, standard output, and what the inspect
// commands conclude by running the module. The shipped scenarios and the
// refused files of tests/lab/scenarios run as tests of their own (ctest -L lab).
#include <gtest/gtest.h>

#include <sys/wait.h>
#include <unistd.h>

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

#include <nlohmann/json.hpp>

namespace {

struct Outcome {
    int exitCode = -1;
    std::string output;  // standard output only
};

Outcome runLab(const std::string& arguments)
{
    Outcome outcome;
    std::string command = std::string(MORVANEK_LAB_EXECUTABLE) + " " + arguments + " 2>/dev/null";
    FILE* pipe = popen(command.c_str(), "r");
    if (pipe == nullptr) return outcome;
    char buffer[4096];
    for (size_t n; (n = fread(buffer, 1, sizeof buffer, pipe)) > 0;) outcome.output.append(buffer, n);
    int status = pclose(pipe);
    outcome.exitCode = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    return outcome;
}

// Standard output and standard error apart, with text fed to standard input.
struct Streams {
    int exitCode = -1;
    std::string output;
    std::string errors;
};

Streams runLabStreams(const std::string& arguments, const std::string& input = "")
{
    // Tests of this program run side by side under ctest: each call has files of its own.
    static int calls = 0;
    const std::string base = ::testing::TempDir() + "morvanek-lab-streams-" + std::to_string(::getpid()) + "-" +
                             std::to_string(++calls);
    std::ofstream(base + ".in", std::ios::binary) << input;
    std::string command = std::string(MORVANEK_LAB_EXECUTABLE) + " " + arguments + " <" + base + ".in >" + base +
                          ".out 2>" + base + ".err";
    int status = std::system(command.c_str());
    Streams streams;
    streams.exitCode = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    auto slurp = [](const std::string& file) {
        std::ifstream in(file, std::ios::binary);
        return std::string((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
    };
    streams.output = slurp(base + ".out");
    streams.errors = slurp(base + ".err");
    for (const char* suffix : {".in", ".out", ".err"}) std::remove((base + suffix).c_str());
    return streams;
}

const std::string kScenarios = MORVANEK_LAB_SCENARIOS;
const std::string kBad = MORVANEK_SOURCE_DIR "/tests/lab/scenarios";

TEST(LabCommand, DemoTellsItsStoryAndSucceeds)
{
    Outcome demo = runLab("demo");
    EXPECT_EQ(demo.exitCode, 0) << demo.output;
    for (const char* words : {"loader 5C1D:4A10", "loader 5C1D:4A20", "repaired from the registry's FVTPID",
                              "runs its firmware as 5C1D:4B01", "runs its firmware as 5C1D:4B02", "PASS"}) {
        EXPECT_NE(demo.output.find(words), std::string::npos) << words << "\n" << demo.output;
    }
    // Not a terminal: no progress line.
    EXPECT_EQ(demo.output.find("programming"), std::string::npos);
    EXPECT_EQ(demo.output.find('\r'), std::string::npos);
}

TEST(LabCommand, ExitCodesTellInvalidAndLabErrorAndTheWorstWinsInTextAndJson)
{
    EXPECT_EQ(runLab("run --no-such-option x.json").exitCode, 2);
    EXPECT_EQ(runLab("run --module /nonexistent.so " + kScenarios + "/fresh-device.json").exitCode, 3);
    // Every scenario still runs.
    const std::string three =
        kBad + "/wrong-expectation.json " + kBad + "/bad-json.json " + kScenarios + "/fresh-device.json";
    Outcome text = runLab("run " + three);
    EXPECT_EQ(text.exitCode, 2);
    EXPECT_NE(text.output.find("3 scenarios: 1 passed, 1 failed, 1 invalid"), std::string::npos) << text.output;
    Outcome json = runLab("run --json " + three);
    EXPECT_EQ(json.exitCode, 2);
    nlohmann::json report = nlohmann::json::parse(json.output);  // throws on anything else on standard output
    ASSERT_EQ(report["scenarios"].size(), 3u);
    EXPECT_EQ(report["scenarios"][0]["exitCode"], 1);
    EXPECT_NE(report["scenarios"][1]["invalid"].get<std::string>().find("bad-json.json: line 3, column"),
              std::string::npos);
    EXPECT_EQ(report["scenarios"][2]["passed"], true);
}

// Whatever stops the command, --json gives one JSON document on standard
// output and text mode a line on standard error with nothing on standard output.
TEST(LabCommand, ErrorsOfTheCommandLineAreOneJsonDocumentOrALineOnStandardError)
{
    struct Case {
        std::string arguments;
        int exitCode;
        const char* words;
    };
    const Case cases[] = {
        {"frobnicate x.json", 2, "unknown command \"frobnicate\""},
        {"inspect picture x.bin", 2, "unknown inspect command \"picture\""},
        {"run --no-such-option x.json", 2, "--no-such-option"},
        {"run", 2, "scenario is required"},
        {"run --memory 0xFFF0:64 " + kScenarios + "/fresh-device.json", 2, "runs past the end of the device's memory"},
        {"run --memory 0x10000:1 " + kScenarios + "/fresh-device.json", 2, "runs past the end"},
        {"inspect image /nonexistent.bin", 2, "/nonexistent.bin"},
        {"inspect identity " + kScenarios + "/images/custom-4B01.bin", 2, "give a 16-byte identity block"},
        {"run --module /nonexistent.so " + kScenarios + "/fresh-device.json", 3, "nonexistent.so"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.arguments);
        Streams text = runLabStreams(c.arguments);
        EXPECT_EQ(text.exitCode, c.exitCode);
        EXPECT_NE(text.errors.find(c.words), std::string::npos) << text.errors;
        EXPECT_EQ(text.output, "");

        Streams json = runLabStreams(c.arguments + " --json");
        EXPECT_EQ(json.exitCode, c.exitCode);
        nlohmann::json document = nlohmann::json::parse(json.output);  // throws on anything else on standard output
        std::string said = document.contains("error") ? document["error"].get<std::string>() : document.dump();
        EXPECT_NE(said.find(c.words), std::string::npos) << json.output;
        EXPECT_EQ(document["exitCode"], c.exitCode);
    }
}

TEST(LabCommand, SaysItsVersionAndReadsAScenarioFromStandardInput)
{
    Streams version = runLabStreams("--version");
    EXPECT_EQ(version.exitCode, 0);
    EXPECT_NE(version.output.find("morvanek-lab for the morvanek module 1.4.3f0"), std::string::npos) << version.output;
    EXPECT_EQ(nlohmann::json::parse(runLabStreams("--version --json").output)["moduleVersion"], "0x0143C000");

    std::ifstream scenario(kScenarios + "/fresh-device.json");
    std::string text((std::istreambuf_iterator<char>(scenario)), std::istreambuf_iterator<char>());
    // Files a scenario on standard input names are found from the current folder; this one names none.
    Streams piped = runLabStreams("run -", text);
    EXPECT_EQ(piped.exitCode, 0) << piped.output << piped.errors;
    EXPECT_NE(piped.output.find("PASS  (standard input)"), std::string::npos) << piped.output;
    Streams broken = runLabStreams("run -", "{\"devices\": [}");
    EXPECT_EQ(broken.exitCode, 2);
    EXPECT_NE(broken.errors.find("(standard input): line 1, column 14: JSON syntax error"), std::string::npos)
        << broken.errors;
}

// A number too large for a double used to escape as an exception: the lab
// failed (exit 3) and the other scenarios' results were lost with it.
TEST(LabCommand, AnOverflowingNumberIsAnInvalidScenarioAndTheOthersStillReport)
{
    const std::string overflowing = ::testing::TempDir() + "morvanek-lab-overflow-" + std::to_string(::getpid()) + ".json";
    std::ofstream(overflowing) << R"({"steps": [{"do": "getCurrentVersion", "status": 1e999}]})";
    Streams json = runLabStreams("run --json " + kScenarios + "/fresh-device.json " + overflowing);
    EXPECT_EQ(json.exitCode, 2) << json.errors;
    nlohmann::json report = nlohmann::json::parse(json.output);
    ASSERT_EQ(report["scenarios"].size(), 2u);
    EXPECT_EQ(report["scenarios"][0]["passed"], true);
    EXPECT_NE(report["scenarios"][1]["invalid"].get<std::string>().find("1e999 is out of range"), std::string::npos);
    std::remove(overflowing.c_str());
}

TEST(LabCommand, InspectImageSaysWhatTheModuleConcludes)
{
    Outcome inspect = runLab("inspect image " + kScenarios + "/images/custom-4B01.bin --expect 0x0143C001 --json");
    ASSERT_EQ(inspect.exitCode, 0);
    nlohmann::json report = nlohmann::json::parse(inspect.output);
    EXPECT_EQ(report["imageVersion"], "0x0143C000");
    EXPECT_EQ(report["headerRevision"], "0x0200");
    EXPECT_EQ(report["versionCompared"], true);
    EXPECT_EQ(report["moduleAgreesOnVersion"], true);
    EXPECT_EQ(report["compareFirmwareVersionStatus"], -50252);
    EXPECT_EQ(report["loaders"]["0x4A10"], true);
    EXPECT_EQ(report["roomForMarker"], true);
}

TEST(LabCommand, InspectIdentityRunsTheModuleAndSaysWhatItConcludes)
{
    struct Case {
        std::vector<uint8_t> block;  // 16 bytes, or a whole flash dump
        const char* arguments;
        int exitCode;
        std::vector<const char*> words;
    };
    const std::vector<uint8_t> dump(0x8000, 0xFF);
    const Case cases[] = {
        {{0x4B, 0x01, 0xFF, 0xFF, 0, 0, 0, 0, 0x5C, 0x1D, 0xFF, 0xFF, 0, 0, 0xBE, 0xEF}, "", 0,
         {"accepted as vendor 5C1D, product 4B01, serial 0000BEEF"}},
        {std::vector<uint8_t>(16, 0xFF), "", 0, {"refused: the block is blank"}},
        {std::vector<uint8_t>(16, 0), "--fvtpid 4B02 --loader 0x4A20", 0, {"accepted as vendor 5C1D, product 4B02"}},
        {dump, "", 2, {}},  // a dump needs the loader, to find its identity block
        {dump, "--loader 0x4A20 --fvtpid 4B03", 0,
         {"identity block at 0x7DF0", "accepted as vendor 5C1D, product 4B03"}},
    };
    const std::string file = ::testing::TempDir() + "morvanek-lab-identity.bin";
    for (const Case& c : cases) {
        SCOPED_TRACE(std::to_string(c.block.size()) + " bytes, " + c.arguments);
        std::ofstream(file, std::ios::binary)
            .write(reinterpret_cast<const char*>(c.block.data()), static_cast<std::streamsize>(c.block.size()));
        Outcome inspect = runLab("inspect identity " + file + " " + c.arguments);
        EXPECT_EQ(inspect.exitCode, c.exitCode);
        for (const char* words : c.words) EXPECT_NE(inspect.output.find(words), std::string::npos) << inspect.output;
    }
    std::remove(file.c_str());
}

}  // namespace
