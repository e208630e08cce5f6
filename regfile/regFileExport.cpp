#include "regFileExport.h"

#include <cstdio>

#include "sim/kernel/kernelUtf16.h"

namespace sim::regfile {

using kernel::RegistryKeyContent;
using kernel::RegistryValue;
using kernel::toUtf16;
using kernel::toUtf8;

namespace {

constexpr size_t kLineWidth = 80;  // where regedit wraps hex lists

std::string quoted(const std::string& text)
{
    std::string out = "\"";
    for (char c : text) {
        if (c == '\\' || c == '"') out += '\\';
        out += c;
    }
    return out + "\"";
}

// The text of a REG_SZ that a quoted string reproduces exactly: one NUL, at
// the end, no line breaks, valid UTF-16. Anything else is written as hex(1).
bool asPlainString(const RegistryValue& value, std::string& text)
{
    const std::vector<uint8_t>& data = value.data;
    if (value.type != kRegSz || data.size() < 2 || data.size() % 2 != 0) return false;
    std::u16string units;
    for (size_t i = 0; i < data.size(); i += 2) units += static_cast<char16_t>(data[i] | (data[i + 1] << 8));
    if (units.back() != 0) return false;
    units.pop_back();
    for (char16_t unit : units)
        if (unit == 0 || unit == u'\r' || unit == u'\n') return false;
    text = toUtf8(units);
    return toUtf16(text) == units;  // false for lone surrogates
}

std::string hexList(const std::string& prefix, size_t column, const std::vector<uint8_t>& data)
{
    std::string out = prefix;
    column += prefix.size();
    for (size_t i = 0; i < data.size(); ++i) {
        char item[4];
        std::snprintf(item, sizeof item, i + 1 < data.size() ? "%02x," : "%02x", data[i]);
        size_t width = i + 1 < data.size() ? 3 : 2;
        // Room is kept for the continuation backslash.
        if (column + width + 1 > kLineWidth) {
            out += "\\\n  ";
            column = 2;
        }
        out += item;
        column += width;
    }
    return out;
}

std::string valueLine(const RegistryValue& value)
{
    std::string line = (value.name.empty() ? "@" : quoted(value.name)) + "=";
    std::string text;
    if (asPlainString(value, text)) return line + quoted(text);
    if (value.type == kRegDword && value.data.size() == 4) {
        char digits[16];
        uint32_t number = value.data[0] | (value.data[1] << 8) | (value.data[2] << 16) |
                          (static_cast<uint32_t>(value.data[3]) << 24);
        std::snprintf(digits, sizeof digits, "dword:%08x", number);
        return line + digits;
    }
    char prefix[24];
    if (value.type == kRegBinary) std::snprintf(prefix, sizeof prefix, "hex:");
    else std::snprintf(prefix, sizeof prefix, "hex(%x):", value.type);
    return line + hexList(prefix, line.size(), value.data);
}

}  // namespace

std::string formatRegistryExport(const std::vector<RegistryKeyContent>& keys)
{
    static const std::string kernelRoot = "\\Registry\\Machine";
    std::string out = "Windows Registry Editor Version 5.00\n";
    for (const RegistryKeyContent& key : keys) {
        out += "\n[HKEY_LOCAL_MACHINE" + key.path.substr(kernelRoot.size()) + "]\n";
        for (const RegistryValue& value : key.values) out += valueLine(value) + "\n";
    }
    return out;
}

}  // namespace sim::regfile
