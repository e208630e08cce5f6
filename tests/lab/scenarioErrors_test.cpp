// Malformed scenarios are refused naming the file, the place and the problem,
// never a crash. The refused files of tests/lab/scenarios (bad JSON, an unknown
// field, a wrong type, IDs out of range, a missing file) show the same through
// the command, with its exit code, as tests of their own (ctest -L lab).
#include <gtest/gtest.h>

#include <set>
#include <string>
#include <utility>
#include <vector>

#include "morvanek-lab/lib/scenarioError.h"
#include "morvanek-lab/lib/lab.h"
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
        {R"({"drives": {"C": {"files": {"WINDOWS\\syst/": {"hex": "00"}}}}})", "/drives/C/files/WINDOWS\\syst~1",
         "may not end in"},
        {R"({"fileFaults": {"failOpen": [{"status": -1}]}})", "/fileFaults/failOpen/0", "missing field \"number\""},
        {R"({"fileFaults": {"failOpen": [{"number": 0, "status": -1}]}})", "/fileFaults/failOpen/0/number",
         "calls count from 1"},
        {R"({"fileFaults": {"failOpen": {"number": 1, "status": 0}}})", "/fileFaults/failOpen/status",
         "0 is not a failure"},
        {R"({"fileFaults": {"failSizeQuery": [{"number": 1, "status": -1, "file": "WINDOWS\\x.bin"}]}})",
         "/fileFaults/failSizeQuery/0/file", "not a DOS path with its drive letter"},
        {R"({"fileFaults": {"failSizeQuery": [{"number": 1, "status": -1, "fiel": "C:\\x.bin"}]}})",
         "/fileFaults/failSizeQuery/0/fiel", "did you mean \"file\""},
        {R"({"fileFaults": {"failReads": 5}})", "/fileFaults/failReads", "5 is not a failure"},
        {R"({"host": {"failAddListener": [{"number": 2}]}})", "/host/failAddListener/0", "missing field \"status\""},
        {R"({"host": {"failFindDevices": [{"number": 1, "status": -1, "file": "C:\\x"}]}})",
         "/host/failFindDevices/0/file", "unknown field \"file\""},
        {R"({"host": {"failCreateQuery": true}})", "/host/failCreateQuery", "expected a status"},
        {R"({"host": {"failSetAttribute": "0x7FFFFFFF"}})", "/host/failSetAttribute", "is not a failure"},
        {R"({"devices": [{"name": "a", "faults": {"failAttributes": [{"id": 3, "status": -1}]}}]})",
         "/devices/0/faults/failAttributes/0/id", "attributes 1 (vendor ID), 2 (product ID) and 21"},
        {R"({"devices": [{"name": "a", "faults": {"failGetDescriptor": 0}}]})", "/devices/0/faults/failGetDescriptor",
         "0 is not a failure"},
        {R"({"devices": [{"name": "a", "startsIn": "flash"}]})", "/devices/0/startsIn",
         "\"startsIn\" is \"loader\" or \"product\""},
        {R"({"devices": [{"name": "a", "loaderProductId": "0x1234", "startsIn": "product"}]})", "/devices/0/startsIn",
         "only a loader of the family"},
        {R"({"devices": [{"name": "a", "loaderProductId": "0x100000000"}]})", "/devices/0/loaderProductId",
         "above the largest value allowed here, 0xFFFFFFFF"},
        {R"({"devices": [{"name": "a"}], "steps": [{"do": "plugIn", "device": "a", "startsIn": "boot"}]})",
         "/steps/0/startsIn", "or \"flash\" (the firmware when the completion marker is in place"},
        {R"({"devices": [{"name": "a"}], "steps": [{"do": "unplug", "device": "a", "startsIn": "loader"}]})",
         "/steps/0/startsIn", "unknown field \"startsIn\""},
        {R"({"drives": {"C": {"files": {"a|b.bin": {"hex": "00"}}}}})", "/drives/C/files/a|b.bin", "may not hold '|'"},
        {R"({"registry": {"faults": [{"key": "HKLM\\Software", "value": "X", "status": 0}]}})",
         "/registry/faults/0/status", "0 is not a failure"},
        {R"({"registry": {"faults": [{"key": "HKLM\\Software", "status": -1, "number": 0}]}})",
         "/registry/faults/0/number", "calls count from 1"},
        {R"({"devices": [{"name": "a", "faults": {"failFreeBuffer": 1}}]})", "/devices/0/faults/failFreeBuffer",
         "1 is not a failure"},
        {R"({"devices": [{"name": "a", "faults": {"lostStatus": [3, 0]}}]})", "/devices/0/faults/lostStatus/1",
         "requests count from 1"},
        {R"({"devices": [{"name": "a", "faults": {"stuckBits": [{"address": 1, "mask": 256}]}}]})",
         "/devices/0/faults/stuckBits/0/mask", "above the largest value"},
        {R"({"fileFaults": {"shortReads": {"number": 0, "bytes": 1}}})", "/fileFaults/shortReads/number",
         "reads count from 1"},
        {R"({"fileFaults": {"changeContent": {"file": "C:\\a.bin", "afterOpens": 0, "hex": "00"}}})",
         "/fileFaults/changeContent/afterOpens", "before its first open"},
        {R"({"fileFaults": {"changeContent": {"file": "C:\\a.bin", "hex": "00", "text": "x"}}})",
         "/fileFaults/changeContent", "exactly one of"},
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

// A JSON text that is not a scenario says why, in words about the text, at
// the place where it goes wrong.
TEST(MalformedScenario, JsonTextErrorsKeepTheirReason)
{
    struct BadText {
        std::string text;
        const char* where;
        const char* problem;
    };
    const BadText cases[] = {
        {"{\"description\": \"open", "line 1, column 22", "a string is not closed"},
        {"{\"description\": \"two\nlines\"}", "line 1, column 21", "control character U+000A (LF) must be escaped"},
        {"{\"host\": {\"ready\": ture}}", "line 1, column 21", "'ture' is not a JSON value"},
        {"{\n  // a note\n  \"steps\": []\n}", "line 2, column 3", "comments are not part of JSON"},
        {"{\"steps\": []} {\"steps\": []}", "line 1, column 15", "text after the end of the JSON value, starting with '{'"},
        {"{\"steps\": []} and more", "line 1, column 15", "starting with 'and'"},
        {"{\"steps\": [", "line 1, column 12", "the text ends before the JSON value is complete"},
        {std::string("{\"a\": 1}\0\x9F\x92", 11), "(whole file)", "not a text file: byte 0x00 at offset 8"},
        {"\xFF\xFE{\0", "(whole file)", "not a text file: byte 0xFF at offset 0"},
        {"", "(whole file)", "the file is empty"},
        {" \n\t ", "(whole file)", "the file is empty"},
        {R"({"devices": [{"name": "a", "vendorId": 99999999999999999999}]})", "/devices/0/vendorId",
         "99999999999999999999 is out of range"},
        {R"({"devices": [{"name": "a", "vendorId": "99999999999999999999"}]})", "/devices/0/vendorId",
         "is out of range"},
        {R"({"steps": [{"do": "getCurrentVersion", "status": 1e999}]})", "line 1, column 50", "1e999 is out of range"},
        {R"({"drives": {"C": {"files": {"a": {"hex": "00"}, "a": {"hex": "01"}}}}})", "/drives/C/files/a",
         "\"a\" appears twice"},
        {std::string(70, '[') + std::string(70, ']'), "/0/0/0", "nested more than 64 deep"},
    };
    for (const BadText& bad : cases) {
        SCOPED_TRACE(bad.text.substr(0, 60));
        try {
            lab::parseScenarioText(bad.text, "bad.json", ".");
            ADD_FAILURE() << "accepted";
        } catch (const lab::ScenarioError& error) {
            EXPECT_EQ(error.where().rfind(bad.where, 0) == 0 || std::string(bad.where) == "(whole file)", true)
                << error.what();
            if (std::string(bad.where) == "(whole file)") {
                EXPECT_EQ(error.where(), "") << error.what();
            }
            EXPECT_NE(error.problem().find(bad.problem), std::string::npos) << error.what();
        }
    }
}

TEST(MalformedScenario, ADirectoryOrAMissingFileIsNamedAsSuch)
{
    const std::string folder = MORVANEK_SOURCE_DIR "/tests/lab/scenarios";
    for (const auto& [path, problem] : {std::pair<std::string, const char*>{folder, "is a directory"},
                                        {folder + "/nowhere.json", "no such file"}}) {
        try {
            lab::loadScenarioFile(path);
            ADD_FAILURE() << path << " accepted";
        } catch (const lab::ScenarioError& error) {
            EXPECT_EQ(error.problem().find(problem), 0u) << error.what();
        }
    }
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

// The faults a real device, registry and file system have, as a scenario names them.
TEST(ScenarioParser, TakesTheFaultsOfARealDeviceRegistryAndFileSystem)
{
    lab::Scenario scenario = lab::parseScenarioText(
        R"({"devices": [{"name": "a", "faults": {"lostStatus": [4, 9], "stuckBits": {"address": "0x0210", "mask": 1},
                                                "deadErases": 2, "failTransferBuffer": [2], "failFreeBuffer": -5,
                                                "failCloseStream": "0xC0000001"}}],
            "registry": {"faults": [{"key": "HKLM\\Software\\A", "value": "V", "status": "0x80000005", "number": 3}]},
            "fileFaults": {"shortReads": [{"number": 2, "bytes": 100}],
                           "changeContent": {"file": "c:/images/a.bin", "afterOpens": 2, "hex": "AA 55"}}})",
        "faults.json", ".");
    const sim::DeviceFaults& faults = scenario.devices.at(0).options.faults;
    EXPECT_EQ(faults.lostStatus, (std::set<uint64_t>{4, 9}));
    ASSERT_EQ(faults.stuckBits.size(), 1u);
    EXPECT_EQ(faults.stuckBits[0].address, 0x0210);
    EXPECT_EQ(faults.stuckBits[0].mask, 1);
    EXPECT_EQ(faults.deadErases, (std::set<uint16_t>{2}));
    EXPECT_EQ(faults.failTransferBuffers, (std::set<uint64_t>{2}));
    EXPECT_EQ(faults.failFreeBuffer, -5);
    EXPECT_EQ(faults.failCloseStream, static_cast<int32_t>(0xC0000001u));
    ASSERT_EQ(scenario.registry.faults.size(), 1u);
    EXPECT_EQ(scenario.registry.faults[0].number, 3u);
    EXPECT_EQ(scenario.registry.faults[0].status, static_cast<int32_t>(0x80000005u));
    EXPECT_EQ(scenario.fileFaults.shortReads, (std::vector<std::pair<unsigned, uint32_t>>{{2, 100}}));
    ASSERT_EQ(scenario.fileFaults.contentChanges.size(), 1u);
    EXPECT_EQ(scenario.fileFaults.contentChanges[0].dosPath, "C:\\images\\a.bin");
    EXPECT_EQ(scenario.fileFaults.contentChanges[0].afterOpens, 2u);
    EXPECT_EQ(scenario.fileFaults.contentChanges[0].bytes, (std::vector<uint8_t>{0xAA, 0x55}));
}

// A changed file must be one of the scenario's: found when the world is built.
TEST(ScenarioParser, AChangedFileMissingFromTheDrivesIsRefusedWhenTheWorldIsBuilt)
{
    lab::Scenario scenario = lab::parseScenarioText(
        R"({"drives": {"C": {"files": {"a.bin": {"hex": "00"}}}},
            "fileFaults": {"changeContent": [{"file": "C:\\b.bin", "hex": "01"}]}})",
        "missing.json", ".");
    lab::ScenarioResult result = lab::runScenario(scenario, {});
    EXPECT_NE(result.invalid.find("missing.json: /fileFaults/changeContent/0/file: no such file"), std::string::npos)
        << result.invalid;
}

}  // namespace
