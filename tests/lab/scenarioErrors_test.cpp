// Malformed scenarios are refused naming the file, the place and the problem,
// never a crash. The refused files of tests/lab/scenarios (bad JSON, an unknown
// field, a wrong type, IDs out of range, a missing file) show the same through
// the command, with its exit code, as tests of their own (ctest -L lab).
#include <gtest/gtest.h>

#include <string>

#include "morvanek-lab/lib/scenarioError.h"
#include "morvanek-lab/lib/scenarioParser.h"

namespace {

TEST(MalformedScenario, IsRefusedNamingThePlaceAndTheProblem)
{
    struct BadScenario {
        const char* text;
        const char* where;    // the place the error must name
        const char* problem;  // words the error must hold
    };
    const BadScenario cases[] = {
        {"{ \"devices\": [", "line 1, column 15", "JSON syntax error"},
        {"[1, 2]", "/", "expected an object, found an array"},
        {R"({"devices": [{"name": "a", "loaderProductID": 1}]})", "/devices/0/loaderProductID",
         "did you mean \"loaderProductId\""},
        {R"({"devices": [{"name": "a"}, {"name": "b", "name": "c"}]})", "/devices/1/name", "\"name\" appears twice"},
        {R"({"devices": [{"name": "a", "loaderProductId": 1.5}]})", "/devices/0/loaderProductId",
         "found a fractional number"},
        {R"({"devices": [{"name": "a", "vendorId": "0x5C1G"}]})", "/devices/0/vendorId", "\"0x5C1G\" is not a number"},
        {R"({"devices": [{"name": "a", "vendorId": -1}]})", "/devices/0/vendorId", "is negative"},
        {R"({"devices": [{"name": "a", "faults": {"stallRequests": [1, 1e999]}}]})",
         "/devices/0/faults/stallRequests/1", "a number too large to read"},
        {R"({"devices": [{"name": "a", "memory": [{"address": "0xFFFF", "hex": "00 01"}]}]})",
         "/devices/0/memory/0", "run past the end"},
        {R"({"devices": [{"name": "a", "memory": [{"address": 0, "hex": "ABC"}]}]})",
         "/devices/0/memory/0/hex", "odd number of hexadecimal digits"},
        {R"({"devices": [{"loaderProductId": "0x4A10"}]})", "/devices/0", "missing field \"name\""},
        {R"({"devices": [{"name": "a"}, {"name": "a"}]})", "/devices/1/name", "two devices are named"},
        {R"({"devices": [{"name": "a", "loaderProductId": "0x1234", "identity": "blank"}]})",
         "/devices/0/identity", "has no identity block"},
        {R"({"steps": ["load", {"do": "reboot"}]})", "/steps/1/do", "\"reboot\" is not a step"},
        {R"({"steps": [{"do": "plugIn", "device": "ghost"}]})", "/steps/0/device", "no device named \"ghost\""},
        {R"({"steps": [{"do": "compareVersion", "newest": 1, "oldest": 1, "expect": {"result": 0}}]})",
         "/steps/0/expect/result", "unknown field \"result\""},
        {R"({"steps": [{"do": "getCurrentVersion", "status": "0x100000000"}]})", "/steps/0/status",
         "does not fit a 32-bit status"},
        {R"({"registry": {"keys": {"HKEY_CURRENT_USER\\Software": {}}}})",
         "/registry/keys/HKEY_CURRENT_USER\\Software", "not a key of the machine hive"},
        {R"({"registry": {"import": "nowhere.reg"}})", "/registry/import", "no such file"},
        {R"({"devices": [{"name": "a", "flashDump": "nowhere.bin"}]})", "/devices/0/flashDump", "no such file"},
        {R"({"drives": {"D": {"folder": "nowhere"}}})", "/drives/D/folder", "no such folder"},
        {R"({"drives": {"C": {"files": {"a.bin": {"hex": "00", "text": "x"}}}}})",
         "/drives/C/files/a.bin", "exactly one of"},
        {R"({"drives": {"C": {"files": {"..\\a.bin": {"hex": "00"}}}}})", "/drives/C/files/..\\a.bin", "\"..\""},
        {R"({"expect": {"devices": {"ghost": {"mode": "loader"}}}})",
         "/expect/devices/ghost", "no device named \"ghost\""},
        {R"({"devices": [{"name": "a"}], "expect": {"devices": {"a": {"mode": "bootloader"}}}})",
         "/expect/devices/a/mode", "\"mode\" is \"loader\", \"product\" or \"unplugged\""},
    };
    for (const BadScenario& bad : cases) {
        SCOPED_TRACE(bad.text);
        try {
            lab::parseScenarioText(bad.text, "bad.json", MORVANEK_SOURCE_DIR "/tests/lab/scenarios");
            ADD_FAILURE() << "accepted";
        } catch (const lab::ScenarioError& error) {
            EXPECT_EQ(std::string(error.what()).rfind(std::string("bad.json: ") + bad.where + ": ", 0), 0u)
                << error.what();
            EXPECT_NE(error.problem().find(bad.problem), std::string::npos) << error.what();
        }
    }
}

// A drive's file name must be one a file system can hold, or the run would
// fail later with the lab's own error instead of the scenario's.
TEST(MalformedScenario, RefusesFileNamesNoFileSystemHolds)
{
    struct BadName {
        std::string name;  // as JSON text
        const char* problem;
    };
    const BadName cases[] = {
        {std::string(256, 'a'), "longer than 255 bytes"},
        {"dir\\" + std::string(256, 'b') + ".bin", "longer than 255 bytes"},
        {"a\\u0000b.bin", "control characters"},
        {"a\\u001Fb.bin", "control characters"},
        {"a?.bin", "any of < > : \" | ? *"},
        {"dir\\\\a|b.bin", "any of < > : \" | ? *"},
    };
    for (const BadName& bad : cases) {
        SCOPED_TRACE(bad.name);
        const std::string text = R"({"drives": {"C": {"files": {")" + bad.name + R"(": {"hex": "00"}}}}})";
        try {
            lab::parseScenarioText(text, "bad.json", MORVANEK_SOURCE_DIR "/tests/lab/scenarios");
            ADD_FAILURE() << "accepted";
        } catch (const lab::ScenarioError& error) {
            EXPECT_EQ(error.where().rfind("/drives/C/files/", 0), 0u) << error.what();
            EXPECT_NE(error.problem().find(bad.problem), std::string::npos) << error.what();
        }
    }
    const std::string longest = R"({"drives": {"C": {"files": {")" + std::string(255, 'a') + R"(": {"hex": "00"}}}}})";
    EXPECT_NO_THROW(lab::parseScenarioText(longest, "good.json", MORVANEK_SOURCE_DIR "/tests/lab/scenarios"));
}

// Numbers as JSON numbers, decimal or hexadecimal text; registry keys as the
// kernel or the registry editor names them.
TEST(ScenarioParser, TakesNumbersAndKeyPathsInEachOfTheirForms)
{
    lab::Scenario scenario = lab::parseScenarioText(
        R"({"devices": [{"name": "a", "loaderProductId": 18976},
                        {"name": "b", "loaderProductId": "0x4A20"},
                        {"name": "c", "loaderProductId": "18976", "attribute21": "0xFFFFFFFF"}],
            "steps": [{"do": "compareVersion", "newest": 1, "oldest": 1, "status": "0xC000026C"}],
            "registry": {"keys": {"HKEY_LOCAL_MACHINE\\Software\\A": {}, "HKLM\\Software\\B": {},
                                  "\\Registry\\Machine\\Software\\C\\": {"N": {"type": "REG_DWORD", "value": 7}}}}})",
        "forms.json", ".");
    for (const lab::DevicePlan& device : scenario.devices) EXPECT_EQ(device.options.loaderProductId, 0x4A20);
    EXPECT_EQ(scenario.devices[2].options.attribute21, 0xFFFFFFFFu);
    EXPECT_EQ(scenario.steps[0].statusIn, static_cast<int32_t>(0xC000026Cu));
    ASSERT_EQ(scenario.registry.keys.size(), 3u);
    EXPECT_EQ(scenario.registry.keys[0].path, "\\Registry\\Machine\\Software\\A");
    EXPECT_EQ(scenario.registry.keys[1].path, "\\Registry\\Machine\\Software\\B");
    EXPECT_EQ(scenario.registry.keys[2].path, "\\Registry\\Machine\\Software\\C");
    EXPECT_EQ(scenario.registry.keys[2].values.at(0).data, (std::vector<uint8_t>{7, 0, 0, 0}));
}

}  // namespace
