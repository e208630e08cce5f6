// The registry editor's export format: reading regedit's files, refusing
// malformed ones by line, and writing the hive back out.
#include <cstdio>
#include <fstream>

#include "moduleRegistryCalls.h"
#include "regfile/registryText.h"

using namespace registry_test;
using namespace sim::regfile;

namespace {

const std::string kDriverKey = kClassKey + "\\0003";
const std::string kInstanceKey = kUsbKey + "\\0001E240";

// As regedit exports it: CRLF, comments, wrapped hex lists, every value form.
const std::string kExport =
    "Windows Registry Editor Version 5.00\r\n"
    "\r\n"
    "; the loader's keys\r\n"
    "[HKEY_LOCAL_MACHINE\\SYSTEM\\CurrentControlSet\\Control\\Class\\{6D2F4B10-93A7-11CF-B4E8-00C05D7A3F21}]\r\n"
    "\"FVTPID\"=\"4B01\"\r\n"
    "@=\"Data acquisition\"\r\n"
    "\"Obsolete\"=\"x\"\r\n"
    "\"Obsolete\"=-\r\n"
    "\r\n"
    "[HKEY_LOCAL_MACHINE\\SYSTEM\\CurrentControlSet\\Control\\Class\\{6D2F4B10-93A7-11CF-B4E8-00C05D7A3F21}\\0003]\r\n"
    "\"Firmware\"=\"C:\\\\Firmware\\\\\\\"new\\\".bin\"\r\n"
    "\"Flags\"=dword:0000abcd\r\n"
    "\"Blob\"=hex:01,02,ff\r\n"
    "\"Expand\"=hex(2):25,00,53,00,52,00,25,00,00,00\r\n"
    "\"List\"=hex(7):61,00,00,00,62,00,63,00,00,00,\\\r\n"
    "  00,00\r\n"
    "\r\n"
    "[HKLM\\SYSTEM\\CurrentControlSet\\Enum\\USB\\Vid_5C1D&Pid_4B01\\0001E240]\r\n"
    "\"Driver\"=\"{6D2F4B10-93A7-11CF-B4E8-00C05D7A3F21}\\\\0003\"\r\n"
    "\r\n"
    "[HKEY_LOCAL_MACHINE\\SOFTWARE\\Old]\r\n"
    "[-HKEY_LOCAL_MACHINE\\SOFTWARE\\Old]\r\n";

void expectValue(const std::string& key, const std::string& name, uint32_t type, const std::vector<uint8_t>& data)
{
    SCOPED_TRACE(key + " : " + name);
    std::optional<RegistryValue> value = registry().value(key, name);
    ASSERT_TRUE(value.has_value());
    EXPECT_EQ(value->type, type);
    EXPECT_EQ(value->data, data);
}

void expectTheExportsValues()
{
    expectValue(kClassKey, "FVTPID", kRegSz, utf16leBytes("4B01"));
    expectValue(kClassKey, "", kRegSz, utf16leBytes("Data acquisition"));
    EXPECT_FALSE(registry().value(kClassKey, "Obsolete").has_value());
    expectValue(kDriverKey, "Firmware", kRegSz, utf16leBytes("C:\\Firmware\\\"new\".bin"));
    expectValue(kDriverKey, "Flags", kRegDword, {0xcd, 0xab, 0, 0});
    expectValue(kDriverKey, "Blob", kRegBinary, {1, 2, 0xff});
    expectValue(kDriverKey, "Expand", kRegExpandSz, utf16leBytes("%SR%"));
    expectValue(kDriverKey, "List", kRegMultiSz, multiStringBytes({"a", "bc"}));
    expectValue(kInstanceKey, "Driver", kRegSz, utf16leBytes("{6D2F4B10-93A7-11CF-B4E8-00C05D7A3F21}\\0003"));
    EXPECT_FALSE(registry().keyExists("\\Registry\\Machine\\SOFTWARE\\Old"));
    EXPECT_TRUE(registry().keyExists("\\Registry\\Machine\\SOFTWARE"));
}

std::string utf16leWithBom(const std::string& text)
{
    std::string bytes = "\xFF\xFE";
    for (char16_t unit : toUtf16(text)) bytes += {static_cast<char>(unit & 0xFF), static_cast<char>(unit >> 8)};
    return bytes;
}

TEST_F(RegistryTest, ReadsEveryValueFormOfRegeditExportsInUtf8Utf16OrRegedit4)
{
    importRegistryText(registry(), kExport, "loader.reg");
    expectTheExportsValues();

    registry().reset();
    const std::string path = std::string(MORVANEK_BINARY_DIR) + "/registry-import-test.reg";
    std::ofstream(path, std::ios::binary) << utf16leWithBom(kExport + "[HKLM\\SOFTWARE\\Grüße]\r\n@=\"Grüße\"\r\n");
    importRegistryFile(registry(), path);
    expectTheExportsValues();
    expectValue("\\Registry\\Machine\\SOFTWARE\\grüße", "", kRegSz, utf16leBytes("Grüße"));

    std::ofstream(path, std::ios::binary) << utf16leWithBom(kExport + "\"Broken\"\r\n");
    try {
        importRegistryFile(registry(), path);
        ADD_FAILURE() << "accepted";
    } catch (const std::runtime_error& error) {
        EXPECT_EQ(std::string(error.what()), path + ":23: expected '=' after value name");
    }
    std::remove(path.c_str());
    EXPECT_THROW(importRegistryFile(registry(), path), std::runtime_error);

    // REGEDIT4 files carry text in hex lists one byte a character; the registry keeps UTF-16.
    importRegistryText(registry(), "REGEDIT4\n[HKLM\\SOFTWARE\\Old]\n\"Path\"=hex(2):25,41,25,00\n\"Raw\"=hex:25,41\n",
                          "old.reg");
    expectValue("\\Registry\\Machine\\SOFTWARE\\Old", "Path", kRegExpandSz, utf16leBytes("%A%"));
    expectValue("\\Registry\\Machine\\SOFTWARE\\Old", "Raw", kRegBinary, {0x25, 0x41});
}

TEST_F(RegistryTest, MalformedLinesAreNamedByNumberAndChangeNothing)
{
    const std::string header = "Windows Registry Editor Version 5.00\n";
    const std::string key = header + "[HKEY_LOCAL_MACHINE\\SOFTWARE\\Test]\n";
    const std::pair<std::string, std::string> cases[] = {
        {"", "t.reg:1: expected 'Windows Registry Editor Version 5.00' or 'REGEDIT4'"},
        {key + "\"Name\"\"x\"\n", "t.reg:3: expected '=' after value name"},
        {key + "Name=\"x\"\n", "t.reg:3: expected a key in brackets, a quoted value name or '@'"},
        {key + "\"Name\"=\"x\n", "t.reg:3: unterminated string"},
        {key + "\"Name\"=\"a\\tb\"\n", "t.reg:3: unknown escape '\\t' in string"},
        {key + "\"Name\"=dword:123456789\n", "t.reg:3: dword: needs 1 to 8 hexadecimal digits"},
        {key + "\"Name\"=hex:01,\\\n  0x2\n", "t.reg:3: expected a byte as two hexadecimal digits"},
        {key + "\"Name\"=hex:01,\\", "t.reg:3: the line goes on past the end of the file"},
        {header + "\n\"Name\"=\"x\"\n", "t.reg:3: value outside a key section"},
        {header + "[-HKLM\\SOFTWARE\\Test]\n\"Name\"=\"x\"\n", "t.reg:3: value outside a key section"},
        {header + "[HKEY_CURRENT_USER\\Software]\n", "t.reg:2: key outside HKEY_LOCAL_MACHINE"},
        {header + "[HKEY_LOCAL_MACHINE\\SOFTWARE\\Test\n", "t.reg:2: expected ']' at the end of the key name"},
        {header + "[HKEY_LOCAL_MACHINE\\SOFTWARE\\\\Test]\n", "t.reg:2: empty key name"},
        {key + "\"N\xE4me\"=\"x\"\n", "t.reg:3: malformed UTF-8"},
    };
    registry().setString("\\Registry\\Machine\\SOFTWARE\\Test", "Name", "before");
    const std::string before = exportRegistryText(registry());
    for (const auto& [text, message] : cases) {
        SCOPED_TRACE(text);
        try {
            importRegistryText(registry(), text, "t.reg");
            ADD_FAILURE() << "accepted";
        } catch (const std::runtime_error& error) {
            EXPECT_EQ(std::string(error.what()).substr(0, message.size()), message);
        }
        EXPECT_EQ(exportRegistryText(registry()), before);
    }
}

TEST_F(RegistryTest, ExportsInRegeditsFormatAndWhatIsExportedReadsBackTheSame)
{
    registry().setString("\\Registry\\Machine\\SOFTWARE\\Test", "FVTPID", "4B01");
    registry().setDword("\\Registry\\Machine\\SOFTWARE\\Test", "Flags", 0xabcd);
    registry().setValue("\\Registry\\Machine\\SOFTWARE\\Test\\Sub", "", kRegBinary, {1, 2});
    EXPECT_EQ(exportRegistryText(registry()),
              "Windows Registry Editor Version 5.00\n"
              "\n[HKEY_LOCAL_MACHINE\\SOFTWARE]\n"
              "\n[HKEY_LOCAL_MACHINE\\SOFTWARE\\Test]\n\"Flags\"=dword:0000abcd\n\"FVTPID\"=\"4B01\"\n"
              "\n[HKEY_LOCAL_MACHINE\\SOFTWARE\\Test\\Sub]\n@=hex:01,02\n");

    importRegistryText(registry(), kExport, "loader.reg");
    registry().setString(kDriverKey, "No terminator", "4B01A", false);
    registry().setString(kDriverKey, "Two lines", "a\r\nb");
    registry().setString(kDriverKey, "Quote \"and\" \\", "C:\\\"x\"");
    registry().setValue(kDriverKey, "Long", kRegBinary, std::vector<uint8_t>(100, 0x5a));
    registry().setValue(kDriverKey, "Short dword", kRegDword, {1, 2});
    registry().setValue(kDriverKey, "Empty", kRegSz, {});
    const std::string exported = exportRegistryText(registry());

    registry().reset();
    importRegistryText(registry(), exported, "exported.reg");

    EXPECT_EQ(exportRegistryText(registry()), exported);
    expectTheExportsValues();
    expectValue(kDriverKey, "No terminator", kRegSz, utf16leBytes("4B01A", false));
}

}  // namespace
