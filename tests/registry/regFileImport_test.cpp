// The registry editor's export format: reading regedit's files, refusing
// malformed ones by line, and writing the hive back out.
#include <cstdio>
#include <fstream>

#include "moduleRegistryCalls.h"
#include "tests/support/WorldTest.h"

using namespace sim::kernel;
using namespace registry_test;

namespace {

const std::string kClassKey =
    "\\Registry\\Machine\\System\\CurrentControlSet\\Control\\Class\\{6D2F4B10-93A7-11CF-B4E8-00C05D7A3F21}";
const std::string kDriverKey = kClassKey + "\\0003";
const std::string kInstanceKey =
    "\\Registry\\Machine\\System\\CurrentControlSet\\Enum\\USB\\Vid_5C1D&Pid_4B01\\0001E240";

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
    "\"Quad\"=hex(b):01,00,00,00,00,00,00,00\r\n"
    "\r\n"
    "[HKLM\\SYSTEM\\CurrentControlSet\\Enum\\USB\\Vid_5C1D&Pid_4B01\\0001E240]\r\n"
    "\"Driver\"=\"{6D2F4B10-93A7-11CF-B4E8-00C05D7A3F21}\\\\0003\"\r\n"
    "\r\n"
    "[HKEY_LOCAL_MACHINE\\SOFTWARE\\Old]\r\n"
    "[-HKEY_LOCAL_MACHINE\\SOFTWARE\\Old]\r\n";

class RegFileImport : public testing_support::WorldTest {};

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
    expectValue(kDriverKey, "Quad", 0xb, {1, 0, 0, 0, 0, 0, 0, 0});
    expectValue(kInstanceKey, "Driver", kRegSz, utf16leBytes("{6D2F4B10-93A7-11CF-B4E8-00C05D7A3F21}\\0003"));
    EXPECT_FALSE(registry().keyExists("\\Registry\\Machine\\SOFTWARE\\Old"));
    EXPECT_TRUE(registry().keyExists("\\Registry\\Machine\\SOFTWARE"));
}

std::string utf16leWithBom(const std::string& text)
{
    std::string bytes = "\xFF\xFE";
    for (char16_t unit : toUtf16(text)) {
        bytes += static_cast<char>(unit & 0xFF);
        bytes += static_cast<char>(unit >> 8);
    }
    return bytes;
}

TEST_F(RegFileImport, ReadsEveryValueFormOfARegeditExport)
{
    registry().importText(kExport, "loader.reg");
    expectTheExportsValues();
}

TEST_F(RegFileImport, ReadsUtf16WithByteOrderMarkAsRegeditWritesIt)
{
    registry().importText(utf16leWithBom(kExport + "[HKLM\\SOFTWARE\\Grüße]\r\n@=\"Grüße\"\r\n"), "loader.reg");
    expectTheExportsValues();
    expectValue("\\Registry\\Machine\\SOFTWARE\\grüße", "", kRegSz, utf16leBytes("Grüße"));
}

TEST_F(RegFileImport, Regedit4TextInHexIsWidenedToUtf16)
{
    registry().importText("REGEDIT4\n\n[HKEY_LOCAL_MACHINE\\SOFTWARE\\Old]\n\"Path\"=hex(2):25,41,25,00\n"
                          "\"Raw\"=hex:25,41\n",
                          "old.reg");
    expectValue("\\Registry\\Machine\\SOFTWARE\\Old", "Path", kRegExpandSz, utf16leBytes("%A%"));
    expectValue("\\Registry\\Machine\\SOFTWARE\\Old", "Raw", kRegBinary, {0x25, 0x41});
}

TEST_F(RegFileImport, MalformedLinesAreNamedByNumberAndChangeNothing)
{
    struct Case {
        std::string text;
        std::string message;
    };
    const std::string header = "Windows Registry Editor Version 5.00\n";
    const std::string key = "[HKEY_LOCAL_MACHINE\\SOFTWARE\\Test]\n";
    const Case cases[] = {
        {"", "t.reg:1: expected 'Windows Registry Editor Version 5.00' or 'REGEDIT4'"},
        {"Windows Registry Editor Version 4.00\n", "t.reg:1: expected 'Windows Registry"},
        {header + key + "\"Name\"\"x\"\n", "t.reg:3: expected '=' after value name"},
        {header + key + "Name=\"x\"\n", "t.reg:3: expected a key in brackets, a quoted value name or '@'"},
        {header + key + "\"Name=\"x\"\n", "t.reg:3: expected '=' after value name"},
        {header + key + "\"Name\"=\"x\n", "t.reg:3: unterminated string"},
        {header + key + "\"Name\"=\"a\\tb\"\n", "t.reg:3: unknown escape '\\t' in string"},
        {header + key + "\"Name\"=\"x\" trailing\n", "t.reg:3: unexpected text after the string"},
        {header + key + "\"Name\"=dword:123456789\n", "t.reg:3: dword: needs 1 to 8 hexadecimal digits"},
        {header + key + "\"Name\"=dword:12g4\n", "t.reg:3: dword: needs 1 to 8 hexadecimal digits"},
        {header + key + "\"Name\"=hex:01,,02\n", "t.reg:3: expected a byte as two hexadecimal digits, found ''"},
        {header + key + "\"Name\"=hex:01,\\\n  0x2\n", "t.reg:3: expected a byte as two hexadecimal digits"},
        {header + key + "\"Name\"=hex(z):01\n", "t.reg:3: expected hex(<type>): with the type in hexadecimal"},
        {header + key + "\"Name\"=text\n", "t.reg:3: unknown value data 'text'"},
        {header + key + "\"Name\"=hex:01,\\", "t.reg:3: the line goes on past the end of the file"},
        {header + "\n\"Name\"=\"x\"\n", "t.reg:3: value outside a key section"},
        {header + "[-HKLM\\SOFTWARE\\Test]\n\"Name\"=\"x\"\n", "t.reg:3: value outside a key section"},
        {header + "[HKEY_CURRENT_USER\\Software]\n", "t.reg:2: key outside HKEY_LOCAL_MACHINE"},
        {header + "[HKEY_LOCAL_MACHINE\\SOFTWARE\\Test\n", "t.reg:2: expected ']' at the end of the key name"},
        {header + "[HKEY_LOCAL_MACHINE\\SOFTWARE\\\\Test]\n", "t.reg:2: empty key name"},
        {header + "[-HKEY_LOCAL_MACHINE]\n", "t.reg:2: HKEY_LOCAL_MACHINE itself cannot be deleted"},
        {header + key + "\"N\xE4me\"=\"x\"\n", "t.reg:3: malformed UTF-8"},
    };
    registry().setString("\\Registry\\Machine\\SOFTWARE\\Test", "Name", "before");
    const std::string before = registry().exportText();
    for (const Case& c : cases) {
        SCOPED_TRACE(c.text);
        try {
            registry().importText(c.text, "t.reg");
            ADD_FAILURE() << "accepted";
        } catch (const std::runtime_error& error) {
            EXPECT_EQ(std::string(error.what()).substr(0, c.message.size()), c.message);
        }
        EXPECT_EQ(registry().exportText(), before);
    }
}

TEST_F(RegFileImport, ExportsInRegeditsFormat)
{
    registry().setString(kClassKey, "FVTPID", "4B01");
    registry().setDword(kDriverKey, "Flags", 0xabcd);
    registry().setValue(kDriverKey, "", kRegBinary, {1, 2});
    registry().createKey("\\Registry\\Machine\\SOFTWARE");

    EXPECT_EQ(registry().exportText(),
              "Windows Registry Editor Version 5.00\n"
              "\n[HKEY_LOCAL_MACHINE\\SOFTWARE]\n"
              "\n[HKEY_LOCAL_MACHINE\\System]\n"
              "\n[HKEY_LOCAL_MACHINE\\System\\CurrentControlSet]\n"
              "\n[HKEY_LOCAL_MACHINE\\System\\CurrentControlSet\\Control]\n"
              "\n[HKEY_LOCAL_MACHINE\\System\\CurrentControlSet\\Control\\Class]\n"
              "\n[HKEY_LOCAL_MACHINE\\System\\CurrentControlSet\\Control\\Class\\"
              "{6D2F4B10-93A7-11CF-B4E8-00C05D7A3F21}]\n"
              "\"FVTPID\"=\"4B01\"\n"
              "\n[HKEY_LOCAL_MACHINE\\System\\CurrentControlSet\\Control\\Class\\"
              "{6D2F4B10-93A7-11CF-B4E8-00C05D7A3F21}\\0003]\n"
              "@=hex:01,02\n"
              "\"Flags\"=dword:0000abcd\n");
}

TEST_F(RegFileImport, WhatIsExportedReadsBackTheSame)
{
    registry().importText(kExport, "loader.reg");
    registry().setString(kDriverKey, "No terminator", "4B01A", false);
    registry().setString(kDriverKey, "Two lines", "a\r\nb");
    registry().setString(kDriverKey, "Quote \"and\" \\", "C:\\\"x\"");
    registry().setValue(kDriverKey, "Long", kRegBinary, std::vector<uint8_t>(100, 0x5a));
    registry().setValue(kDriverKey, "Short dword", kRegDword, {1, 2});
    registry().setValue(kDriverKey, "Empty", kRegSz, {});
    const std::string exported = registry().exportText();

    registry().reset();
    registry().importText(exported, "exported.reg");

    EXPECT_EQ(registry().exportText(), exported);
    expectValue(kDriverKey, "No terminator", kRegSz, utf16leBytes("4B01A", false));
    expectValue(kDriverKey, "Two lines", kRegSz, utf16leBytes("a\r\nb"));
    expectValue(kDriverKey, "Long", kRegBinary, std::vector<uint8_t>(100, 0x5a));
    expectValue(kDriverKey, "Short dword", kRegDword, {1, 2});
}

TEST_F(RegFileImport, ImportsAFileAndNamesItInErrors)
{
    const std::string path = std::string(MORVANEK_BINARY_DIR) + "/registry-import-test.reg";
    std::ofstream(path, std::ios::binary) << utf16leWithBom(kExport + "\"Broken\"\r\n");

    try {
        registry().importFile(path);
        ADD_FAILURE() << "accepted";
    } catch (const std::runtime_error& error) {
        EXPECT_EQ(std::string(error.what()), path + ":24: expected '=' after value name");
    }
    EXPECT_THROW(registry().importFile(path + ".missing"), std::runtime_error);
    std::ofstream(path, std::ios::binary) << utf16leWithBom(kExport);
    registry().importFile(path);
    expectTheExportsValues();
    std::remove(path.c_str());
}

}  // namespace
