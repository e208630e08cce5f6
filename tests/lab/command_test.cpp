// The lab as a command: exit codes, standard output, and the shipped scenarios.
#include <gtest/gtest.h>

#include <sys/wait.h>

#include <cstdint>
#include <cstdio>
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

TEST(LabCommand, ExitCodesTellSuccessFailureInvalidAndLabError)
{
    EXPECT_EQ(runLab("run " + kScenarios + "/fresh-device.json").exitCode, 0);
    EXPECT_EQ(runLab("run " + kBad + "/wrong-expectation.json").exitCode, 1);
    EXPECT_EQ(runLab("run " + kBad + "/unknown-field.json").exitCode, 2);
    EXPECT_EQ(runLab("run --no-such-option x.json").exitCode, 2);
    EXPECT_EQ(runLab("run --module /nonexistent.so " + kScenarios + "/fresh-device.json").exitCode, 3);
    // The worst outcome wins, and every scenario still runs.
    Outcome both = runLab("run " + kBad + "/wrong-expectation.json " + kBad + "/wrong-type.json " + kScenarios +
                          "/fresh-device.json");
    EXPECT_EQ(both.exitCode, 2);
    EXPECT_NE(both.output.find("1 of 3 scenario(s) passed"), std::string::npos) << both.output;
}

TEST(LabCommand, JsonIsTheOnlyThingOnStandardOutput)
{
    Outcome json = runLab("run --json " + kScenarios + "/missing-image.json " + kBad + "/bad-json.json");
    EXPECT_EQ(json.exitCode, 2);
    nlohmann::json report = nlohmann::json::parse(json.output);  // throws on anything else
    ASSERT_EQ(report["scenarios"].size(), 2u);
    EXPECT_EQ(report["scenarios"][0]["passed"], true);
    EXPECT_NE(report["scenarios"][1]["invalid"].get<std::string>().find("line 3, column"), std::string::npos);
}

TEST(LabCommand, InspectImageSaysWhatTheModuleConcludes)
{
    Outcome inspect = runLab("inspect image " + kScenarios + "/images/special-4B01.bin --expect 0x0143C001 --json");
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

}  // namespace

namespace {

struct IdentityCase {
    const char* name;
    std::vector<uint8_t> block;
    const char* arguments;
    bool accepted;
    const char* conclusion;
};

class InspectIdentity : public ::testing::TestWithParam<IdentityCase> {};

TEST_P(InspectIdentity, RunsTheModuleAndReportsItsConclusion)
{
    const IdentityCase& c = GetParam();
    std::string file = ::testing::TempDir() + "identity-" + c.name + ".bin";
    FILE* out = std::fopen(file.c_str(), "wb");
    ASSERT_NE(out, nullptr);
    std::fwrite(c.block.data(), 1, c.block.size(), out);
    std::fclose(out);

    Outcome inspect = runLab("inspect identity --json " + file + " " + c.arguments);
    std::remove(file.c_str());
    ASSERT_EQ(inspect.exitCode, 0) << inspect.output;
    nlohmann::json report = nlohmann::json::parse(inspect.output);
    EXPECT_EQ(report["accepted"], c.accepted);
    EXPECT_NE(report["conclusion"].get<std::string>().find(c.conclusion), std::string::npos) << report.dump(2);
}

const std::vector<uint8_t> kBlank(16, 0xFF);
const std::vector<uint8_t> kZeroed(16, 0x00);

INSTANTIATE_TEST_SUITE_P(
    Lab, InspectIdentity,
    ::testing::Values(
        IdentityCase{"sound", {0x4B, 0x01, 0xFF, 0xFF, 0, 0, 0, 0, 0x5C, 0x1D, 0xFF, 0xFF, 0, 0, 0xBE, 0xEF}, "", true,
                     "accepted as vendor 5C1D, product 4B01, serial 0000BEEF"},
        IdentityCase{"blank", kBlank, "--fvtpid 4B02", true, "accepted as vendor 5C1D, product 4B02, serial FFFFFFFF"},
        IdentityCase{"blankWithoutFvtpid", kBlank, "", false, "the block is blank"},
        IdentityCase{"zeroedOn4A20", kZeroed, "--fvtpid 4B01 --loader 0x4A20", true, "product 4B01"},
        IdentityCase{"foreign", {0x4B, 0x01, 0xFF, 0xFF, 0, 0, 0, 0, 0x12, 0x34, 0xFF, 0xFF, 0, 0, 0, 1}, "", false,
                     "vendor ID is not the family's"},
        IdentityCase{"erasedProductUnknownFirmware", {0xFF, 0xFF, 0xFF, 0xFF, 0, 0, 0, 0, 0x5C, 0x1D, 0xFF, 0xFF, 0, 0, 0, 1},
                     "", false, "matches neither known signature"}),
    [](const ::testing::TestParamInfo<IdentityCase>& info) { return std::string(info.param.name); });

TEST(LabCommand, InspectIdentityOfAWholeDumpNeedsTheLoader)
{
    std::string file = ::testing::TempDir() + "dump.bin";
    FILE* out = std::fopen(file.c_str(), "wb");
    std::vector<uint8_t> dump(0x8000, 0xFF);
    std::fwrite(dump.data(), 1, dump.size(), out);
    std::fclose(out);
    EXPECT_EQ(runLab("inspect identity " + file).exitCode, 2);
    Outcome withLoader = runLab("inspect identity " + file + " --loader 0x4A20 --fvtpid 4B03");
    std::remove(file.c_str());
    EXPECT_EQ(withLoader.exitCode, 0);
    EXPECT_NE(withLoader.output.find("identity block at 0x7DF0"), std::string::npos) << withLoader.output;
    EXPECT_NE(withLoader.output.find("product 4B03"), std::string::npos) << withLoader.output;
}

}  // namespace
