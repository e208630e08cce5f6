// Malformed scenarios are refused with the place and the problem, never a crash.
#include <gtest/gtest.h>

#include <string>

#include "morvanek-lab/lib/ScenarioError.h"
#include "morvanek-lab/lib/ScenarioParser.h"

namespace {

struct BadScenario {
    const char* name;
    const char* text;
    const char* where;    // the place the error must name
    const char* problem;  // words the error must hold
};

const BadScenario kBadScenarios[] = {
    {"syntax", "{\n  \"devices\": [\n    { \"name\": \"a\", }\n  ]\n}", "line 3, column 20", "JSON syntax error"},
    {"truncated", "{ \"devices\": [", "line 1, column 15", "JSON syntax error"},
    {"not an object", "[1, 2]", "/", "expected an object, found an array"},
    {"unknown top field", R"({"device": []})", "/device", "did you mean \"devices\""},
    {"unknown device field", R"({"devices": [{"name": "a", "loaderProductID": 1}]})", "/devices/0/loaderProductID",
     "did you mean \"loaderProductId\""},
    {"duplicate field", R"({"devices": [{"name": "a"}, {"name": "b", "name": "c"}]})", "/devices/1/name",
     "\"name\" appears twice"},
    {"wrong type", R"({"host": {"ready": 1}})", "/host/ready", "expected true or false, found a number"},
    {"fraction", R"({"devices": [{"name": "a", "loaderProductId": 1.5}]})", "/devices/0/loaderProductId",
     "found a fractional number"},
    {"not a number", R"({"devices": [{"name": "a", "vendorId": "0x5C1G"}]})", "/devices/0/vendorId",
     "\"0x5C1G\" is not a number"},
    {"product ID too large", R"({"devices": [{"name": "a"}, {"name": "b", "loaderProductId": "0x10000"}]})",
     "/devices/1/loaderProductId", "0x10000 is above the largest value allowed here, 0xFFFF"},
    {"negative ID", R"({"devices": [{"name": "a", "vendorId": -1}]})", "/devices/0/vendorId", "is negative"},
    {"address too large", R"({"devices": [{"name": "a", "memory": [{"address": "0x10000", "hex": "00"}]}]})",
     "/devices/0/memory/0/address", "above the largest value allowed here, 0xFFFF"},
    {"bytes past the end", R"({"devices": [{"name": "a", "memory": [{"address": "0xFFFF", "hex": "00 01"}]}]})",
     "/devices/0/memory/0", "run past the end"},
    {"odd hex", R"({"devices": [{"name": "a", "memory": [{"address": 0, "hex": "ABC"}]}]})",
     "/devices/0/memory/0/hex", "odd number of hexadecimal digits"},
    {"missing name", R"({"devices": [{"loaderProductId": "0x4A10"}]})", "/devices/0", "missing field \"name\""},
    {"same name twice", R"({"devices": [{"name": "a"}, {"name": "a"}]})", "/devices/1/name", "two devices are named"},
    {"identity on a non-loader", R"({"devices": [{"name": "a", "loaderProductId": "0x1234", "identity": "blank"}]})",
     "/devices/0/identity", "has no identity block"},
    {"unknown step", R"({"steps": ["load", {"do": "reboot"}]})", "/steps/1/do", "\"reboot\" is not a step"},
    {"step without its device", R"({"steps": [{"do": "plugIn", "device": "ghost"}]})", "/steps/0/device",
     "no device named \"ghost\""},
    {"result a step has not", R"({"steps": [{"do": "compareVersion", "newest": 1, "oldest": 1, "expect": {"result": 0}}]})",
     "/steps/0/expect/result", "unknown field \"result\""},
    {"status too large", R"({"steps": [{"do": "getCurrentVersion", "status": "0x100000000"}]})", "/steps/0/status",
     "does not fit a 32-bit status"},
    {"foreign hive", R"({"registry": {"keys": {"HKEY_CURRENT_USER\\Software": {}}}})",
     "/registry/keys/HKEY_CURRENT_USER\\Software", "not a key of the machine hive"},
    {"missing .reg", R"({"registry": {"import": "nowhere.reg"}})", "/registry/import", "no such file"},
    {"missing image", R"({"drives": {"C": {"files": {"a.bin": {"copyOf": "nowhere.bin"}}}}})",
     "/drives/C/files/a.bin/copyOf", "no such file"},
    {"missing dump", R"({"devices": [{"name": "a", "flashDump": "nowhere.bin"}]})", "/devices/0/flashDump",
     "no such file"},
    {"missing folder", R"({"drives": {"D": {"folder": "nowhere"}}})", "/drives/D/folder", "no such folder"},
    {"two contents", R"({"drives": {"C": {"files": {"a.bin": {"hex": "00", "text": "x"}}}}})",
     "/drives/C/files/a.bin", "exactly one of"},
    {"file outside the drive", R"({"drives": {"C": {"files": {"..\\a.bin": {"hex": "00"}}}}})",
     "/drives/C/files/..\\a.bin", "\"..\""},
    {"expectation for an unknown device", R"({"expect": {"devices": {"ghost": {"mode": "loader"}}}})",
     "/expect/devices/ghost", "no device named \"ghost\""},
    {"unknown mode", R"({"devices": [{"name": "a"}], "expect": {"devices": {"a": {"mode": "bootloader"}}}})",
     "/expect/devices/a/mode", "\"mode\" is \"loader\", \"product\" or \"unplugged\""},
};

class MalformedScenario : public ::testing::TestWithParam<BadScenario> {};

TEST_P(MalformedScenario, IsRefusedNamingThePlaceAndTheProblem)
{
    const BadScenario& bad = GetParam();
    try {
        lab::parseScenarioText(bad.text, "bad.json", MORVANEK_SOURCE_DIR "/tests/lab/scenarios");
        FAIL() << "accepted: " << bad.text;
    } catch (const lab::ScenarioError& error) {
        EXPECT_EQ(error.file(), "bad.json");
        EXPECT_EQ(error.where(), bad.where) << error.what();
        EXPECT_NE(error.problem().find(bad.problem), std::string::npos) << error.what();
        EXPECT_EQ(std::string(error.what()).rfind("bad.json: ", 0), 0u) << error.what();
    }
}

INSTANTIATE_TEST_SUITE_P(Lab, MalformedScenario, ::testing::ValuesIn(kBadScenarios),
                         [](const ::testing::TestParamInfo<BadScenario>& info) {
                             std::string name;
                             for (const char* c = info.param.name; *c != 0; ++c) name += std::isalnum(*c) ? *c : '_';
                             return name;
                         });

TEST(ScenarioNumbers, AreTakenAsJsonNumbersOrDecimalOrHexadecimalText)
{
    lab::Scenario scenario = lab::parseScenarioText(
        R"({"devices": [{"name": "a", "loaderProductId": 18976},
                        {"name": "b", "loaderProductId": "0x4A20"},
                        {"name": "c", "loaderProductId": "18976", "attribute21": "0xFFFFFFFF"}],
            "steps": [{"do": "compareVersion", "newest": 1, "oldest": 1, "status": "0xC000026C"}]})",
        "numbers.json", ".");
    EXPECT_EQ(scenario.devices[0].options.loaderProductId, 0x4A20);
    EXPECT_EQ(scenario.devices[1].options.loaderProductId, 0x4A20);
    EXPECT_EQ(scenario.devices[2].options.loaderProductId, 0x4A20);
    EXPECT_EQ(scenario.devices[2].options.attribute21, 0xFFFFFFFFu);
    EXPECT_EQ(scenario.steps[0].statusIn, static_cast<int32_t>(0xC000026Cu));
}

TEST(ScenarioRegistry, TakesKernelAndRegistryEditorKeyPathsAlike)
{
    lab::Scenario scenario = lab::parseScenarioText(
        R"({"registry": {"keys": {"HKEY_LOCAL_MACHINE\\Software\\A": {}, "HKLM\\Software\\B": {},
                                  "\\Registry\\Machine\\Software\\C\\": {"N": {"type": "REG_DWORD", "value": 7}}}}})",
        "keys.json", ".");
    ASSERT_EQ(scenario.registry.keys.size(), 3u);
    EXPECT_EQ(scenario.registry.keys[0].path, "\\Registry\\Machine\\Software\\A");
    EXPECT_EQ(scenario.registry.keys[1].path, "\\Registry\\Machine\\Software\\B");
    EXPECT_EQ(scenario.registry.keys[2].path, "\\Registry\\Machine\\Software\\C");
    EXPECT_EQ(scenario.registry.keys[2].values.at(0).data, (std::vector<uint8_t>{7, 0, 0, 0}));
}

}  // namespace
