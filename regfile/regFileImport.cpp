#include "regFileImport.h"

#include <cctype>
#include <stdexcept>

#include "kernel/ntkernel.h"
#include "sim/kernel/kernelUtf16.h"
#include "sim/kernel/registrySim.h"

namespace sim::regfile {

using kernel::toUtf16;
using kernel::toUtf8;
using kernel::utf16leBytes;

namespace {

const std::string kHeaderVersion5 = "Windows Registry Editor Version 5.00";
const std::string kHeaderVersion4 = "REGEDIT4";

// A problem on one line; turned into "<source>:<line>: <what>" by the parser.
struct LineError {
    std::string what;
};

std::string trimmed(const std::string& text)
{
    size_t begin = text.find_first_not_of(" \t\r");
    if (begin == std::string::npos) return {};
    size_t end = text.find_last_not_of(" \t\r");
    return text.substr(begin, end - begin + 1);
}

bool startsWithNoCase(const std::string& text, const std::string& prefix)
{
    if (text.size() < prefix.size()) return false;
    for (size_t i = 0; i < prefix.size(); ++i)
        if (std::toupper(static_cast<unsigned char>(text[i])) != std::toupper(static_cast<unsigned char>(prefix[i])))
            return false;
    return true;
}

bool equalsNoCase(const std::string& a, const std::string& b)
{
    return a.size() == b.size() && startsWithNoCase(a, b);
}

bool allHexDigits(const std::string& text)
{
    for (char c : text)
        if (!std::isxdigit(static_cast<unsigned char>(c))) return false;
    return true;
}

// Regedit writes UTF-16LE with a byte-order mark; hand-written files are UTF-8.
std::string decodedText(const std::string& bytes, const std::string& sourceName)
{
    auto byte = [&](size_t i) { return static_cast<uint8_t>(bytes[i]); };
    if (bytes.size() >= 2 && byte(0) == 0xFF && byte(1) == 0xFE) {
        if (bytes.size() % 2 != 0) throw std::runtime_error(sourceName + ": UTF-16 text with an odd number of bytes");
        std::u16string units;
        for (size_t i = 2; i < bytes.size(); i += 2) units += static_cast<char16_t>(byte(i) | (byte(i + 1) << 8));
        return toUtf8(units);
    }
    if (bytes.size() >= 3 && byte(0) == 0xEF && byte(1) == 0xBB && byte(2) == 0xBF) return bytes.substr(3);
    return bytes;
}

std::vector<std::string> physicalLines(const std::string& text)
{
    std::vector<std::string> lines;
    size_t start = 0;
    for (;;) {
        size_t end = text.find('\n', start);
        lines.push_back(text.substr(start, end == std::string::npos ? end : end - start));
        if (end == std::string::npos) return lines;
        start = end + 1;
    }
}

// "HKEY_LOCAL_MACHINE\A\B" (or "HKLM\A\B") as the kernel names it.
std::string kernelPath(const std::string& hivePath)
{
    size_t slash = hivePath.find('\\');
    std::string root = hivePath.substr(0, slash);
    if (!equalsNoCase(root, "HKEY_LOCAL_MACHINE") && !equalsNoCase(root, "HKLM"))
        throw LineError{"key outside HKEY_LOCAL_MACHINE: '" + hivePath + "' (only the machine hive exists here)"};
    std::string rest = slash == std::string::npos ? std::string() : hivePath.substr(slash);
    bool emptyComponent = rest.find("\\\\") != std::string::npos || (!rest.empty() && rest.back() == '\\');
    if (emptyComponent) throw LineError{"empty key name in '" + hivePath + "'"};
    return "\\Registry\\Machine" + rest;
}

// A quoted text starting at text[position]; leaves position after the closing quote.
std::string quotedText(const std::string& text, size_t& position, const char* what)
{
    std::string out;
    for (++position; position < text.size(); ++position) {
        char c = text[position];
        if (c == '"') {
            ++position;
            return out;
        }
        if (c == '\\') {
            if (++position == text.size()) break;
            char escaped = text[position];
            if (escaped != '\\' && escaped != '"')
                throw LineError{std::string("unknown escape '\\") + escaped + "' in " + what};
            c = escaped;
        }
        out += c;
    }
    throw LineError{std::string("unterminated ") + what};
}

std::vector<uint8_t> hexBytes(const std::string& list)
{
    std::vector<uint8_t> bytes;
    if (trimmed(list).empty()) return bytes;
    size_t start = 0;
    for (;;) {
        size_t comma = list.find(',', start);
        std::string item = trimmed(list.substr(start, comma == std::string::npos ? comma : comma - start));
        if (item.empty() || item.size() > 2 || !allHexDigits(item))
            throw LineError{"expected a byte as two hexadecimal digits, found '" + item + "'"};
        bytes.push_back(static_cast<uint8_t>(std::stoul(item, nullptr, 16)));
        if (comma == std::string::npos) return bytes;
        start = comma + 1;
    }
}

bool isStringType(uint32_t type)
{
    return type == kRegSz || type == kRegExpandSz || type == kRegMultiSz;
}

// The value's data after "=": a string, dword:, hex: or hex(N):.
void parseData(const std::string& data, bool version4, RegistryEdit& edit)
{
    edit.kind = RegistryEdit::Kind::setValue;
    if (data == "-") {
        edit.kind = RegistryEdit::Kind::deleteValue;
    } else if (!data.empty() && data[0] == '"') {
        size_t position = 0;
        std::string text = quotedText(data, position, "string");
        if (position != data.size())
            throw LineError{"unexpected text after the string: '" + data.substr(position) + "'"};
        edit.type = kRegSz;
        edit.data = utf16leBytes(text, true);
    } else if (startsWithNoCase(data, "dword:")) {
        std::string digits = data.substr(6);
        if (digits.empty() || digits.size() > 8 || !allHexDigits(digits))
            throw LineError{"dword: needs 1 to 8 hexadecimal digits, found '" + digits + "'"};
        uint32_t number = static_cast<uint32_t>(std::stoul(digits, nullptr, 16));
        edit.type = kRegDword;
        for (int i = 0; i < 4; ++i) edit.data.push_back(static_cast<uint8_t>(number >> (8 * i)));
    } else if (startsWithNoCase(data, "hex:")) {
        edit.type = kRegBinary;
        edit.data = hexBytes(data.substr(4));
    } else if (startsWithNoCase(data, "hex(")) {
        size_t close = data.find("):");
        std::string type = close == std::string::npos ? std::string() : data.substr(4, close - 4);
        if (type.empty() || type.size() > 8 || !allHexDigits(type))
            throw LineError{"expected hex(<type>): with the type in hexadecimal"};
        edit.type = static_cast<uint32_t>(std::stoul(type, nullptr, 16));
        edit.data = hexBytes(data.substr(close + 2));
        // REGEDIT4 files carry text as one byte a character; the registry keeps UTF-16.
        if (version4 && isStringType(edit.type)) {
            std::vector<uint8_t> wide;
            for (uint8_t byte : edit.data) wide.insert(wide.end(), {byte, 0});
            edit.data = std::move(wide);
        }
    } else {
        throw LineError{"unknown value data '" + data + "'"};
    }
}

RegistryEdit parseValueLine(const std::string& line, const std::string& currentKey, bool version4)
{
    RegistryEdit edit;
    size_t position = 0;
    if (line[0] == '@') position = 1;
    else if (line[0] == '"') edit.valueName = quotedText(line, position, "value name");
    else throw LineError{"expected a key in brackets, a quoted value name or '@'"};
    while (position < line.size() && (line[position] == ' ' || line[position] == '\t')) ++position;
    if (position == line.size() || line[position] != '=') throw LineError{"expected '=' after value name"};
    if (currentKey.empty()) throw LineError{"value outside a key section"};
    edit.keyPath = currentKey;
    parseData(trimmed(line.substr(position + 1)), version4, edit);
    return edit;
}

RegistryEdit parseSectionLine(const std::string& line)
{
    if (line.back() != ']') throw LineError{"expected ']' at the end of the key name"};
    std::string name = line.substr(1, line.size() - 2);
    RegistryEdit edit;
    if (!name.empty() && name[0] == '-') {
        edit.kind = RegistryEdit::Kind::deleteKey;
        name.erase(0, 1);
    }
    edit.keyPath = kernelPath(name);
    if (edit.kind == RegistryEdit::Kind::deleteKey && edit.keyPath == "\\Registry\\Machine")
        throw LineError{"HKEY_LOCAL_MACHINE itself cannot be deleted"};
    return edit;
}

}  // namespace

std::vector<RegistryEdit> parseRegistryExport(const std::string& bytes, const std::string& sourceName)
{
    std::vector<std::string> lines = physicalLines(decodedText(bytes, sourceName));
    auto fail = [&](size_t number, const std::string& what) {
        return std::runtime_error(sourceName + ":" + std::to_string(number) + ": " + what);
    };

    std::string header = trimmed(lines[0]);
    if (header != kHeaderVersion5 && header != kHeaderVersion4)
        throw fail(1, "expected '" + kHeaderVersion5 + "' or '" + kHeaderVersion4 + "'");
    bool version4 = header == kHeaderVersion4;

    std::vector<RegistryEdit> edits;
    std::string currentKey;  // empty outside a section, and after a deleted key's section
    for (size_t index = 1; index < lines.size(); ++index) {
        size_t number = index + 1;
        std::string line = trimmed(lines[index]);
        if (line.empty() || line[0] == ';') continue;
        // Long hex lists go on over several lines, each but the last ending in a backslash.
        while (!line.empty() && line.back() == '\\') {
            if (++index == lines.size()) throw fail(number, "the line goes on past the end of the file");
            line.pop_back();
            line += trimmed(lines[index]);
        }
        if (line.empty()) continue;
        try {
            toUtf16(line);  // refuse malformed UTF-8 here, where the line is known
            if (line[0] == '[') {
                edits.push_back(parseSectionLine(line));
                bool deletion = edits.back().kind == RegistryEdit::Kind::deleteKey;
                currentKey = deletion ? std::string() : edits.back().keyPath;
            } else {
                edits.push_back(parseValueLine(line, currentKey, version4));
            }
        } catch (const LineError& error) {
            throw fail(number, error.what);
        } catch (const std::invalid_argument&) {
            throw fail(number, "malformed UTF-8");
        }
    }
    return edits;
}

}  // namespace sim::regfile
