// The lab as a command: exit codes, standard output, and what the inspect
// commands conclude by running the module. The shipped scenarios and the
// refused files of tests/lab/scenarios run as tests of their own (ctest -L lab).
#include <gtest/gtest.h>

#include <sys/wait.h>

#include <cstdint>
#include <cstdio>
#include <fstream>
#include <string>
#include <vector>

#include <nlohmann/json.hpp>

#include "tests/lab/labProcess.h"

namespace {

using lab_tests::Outcome;
using lab_tests::runLab;

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
    EXPECT_NE(text.output.find("1 of 3 scenario(s) passed"), std::string::npos) << text.output;
    Outcome json = runLab("run --json " + three);
    EXPECT_EQ(json.exitCode, 2);
    nlohmann::json report = nlohmann::json::parse(json.output);  // throws on anything else on standard output
    ASSERT_EQ(report["scenarios"].size(), 3u);
    EXPECT_EQ(report["scenarios"][0]["exitCode"], 1);
    EXPECT_NE(report["scenarios"][1]["invalid"].get<std::string>().find("bad-json.json: line 3, column"),
              std::string::npos);
    EXPECT_EQ(report["scenarios"][2]["passed"], true);
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
