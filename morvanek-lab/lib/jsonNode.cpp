#include "jsonNode.h"

#include <algorithm>
#include <cctype>

#include <fmt/format.h>

namespace lab {

namespace {

// Edit distance, for "did you mean" on a mistyped field name.
size_t distance(const std::string& a, const std::string& b)
{
    std::vector<size_t> row(b.size() + 1);
    for (size_t j = 0; j <= b.size(); ++j) row[j] = j;
    for (size_t i = 1; i <= a.size(); ++i) {
        size_t diagonal = row[0];
        row[0] = i;
        for (size_t j = 1; j <= b.size(); ++j) {
            size_t above = row[j];
            bool same = std::tolower(static_cast<unsigned char>(a[i - 1])) ==
                        std::tolower(static_cast<unsigned char>(b[j - 1]));
            row[j] = std::min({row[j] + 1, row[j - 1] + 1, diagonal + (same ? 0 : 1)});
            diagonal = above;
        }
    }
    return row[b.size()];
}

// Digits that parseNumberText refused only for their size.
bool isTooLargeNumberText(std::string text)
{
    text.erase(0, text.find_first_not_of(" \t-"));
    bool hex = text.size() > 2 && text[0] == '0' && (text[1] == 'x' || text[1] == 'X');
    if (hex) text.erase(0, 2);
    if (text.empty()) return false;
    for (char c : text) {
        bool digit = hex ? std::isxdigit(static_cast<unsigned char>(c)) != 0 : std::isdigit(static_cast<unsigned char>(c)) != 0;
        if (!digit && c != ' ' && c != '\t') return false;
    }
    return true;
}

std::string notANumber(const std::string& text, const char* example)
{
    if (isTooLargeNumberText(text)) return fmt::format("\"{}\" is out of range: too large for any field here", text);
    return fmt::format("\"{}\" is not a number (write it as {})", text, example);
}

}  // namespace

std::string escapePointerToken(const std::string& token)
{
    std::string out;
    for (char c : token) {
        if (c == '~') {
            out += "~0";
        } else if (c == '/') {
            out += "~1";
        } else if (static_cast<unsigned char>(c) < 0x20) {
            out += fmt::format("\\u{:04X}", static_cast<int>(c));  // shown, never printed raw
        } else {
            out += c;
        }
    }
    return out;
}

std::optional<int64_t> parseNumberText(const std::string& raw)
{
    std::string text = raw;
    text.erase(0, text.find_first_not_of(" \t"));
    text.erase(text.find_last_not_of(" \t") + 1);
    bool negative = !text.empty() && text[0] == '-';
    if (negative) text.erase(0, 1);
    int base = 10;
    if (text.size() > 2 && text[0] == '0' && (text[1] == 'x' || text[1] == 'X')) {
        base = 16;
        text.erase(0, 2);
    }
    if (text.empty() || text.size() > 16) return std::nullopt;
    uint64_t value = 0;
    for (char c : text) {
        int digit;
        if (c >= '0' && c <= '9') {
            digit = c - '0';
        } else if (base == 16 && std::isxdigit(static_cast<unsigned char>(c))) {
            digit = std::tolower(static_cast<unsigned char>(c)) - 'a' + 10;
        } else {
            return std::nullopt;
        }
        value = value * static_cast<uint64_t>(base) + static_cast<uint64_t>(digit);
        if (value > (uint64_t{1} << 62)) return std::nullopt;
    }
    return negative ? -static_cast<int64_t>(value) : static_cast<int64_t>(value);
}

void JsonNode::fail(const std::string& what) const
{
    throw ScenarioError(*file_, pointer_.empty() ? "/" : pointer_, what);
}

std::string JsonNode::typeName() const
{
    if (value_->is_number_float()) return "a fractional number";
    if (value_->is_number()) return "a number";
    if (value_->is_string()) return "a string";
    if (value_->is_boolean()) return "true/false";
    if (value_->is_null()) return "null";
    if (value_->is_array()) return "an array";
    return "an object";
}

JsonNode JsonNode::child(const nlohmann::json& value, const std::string& token) const
{
    return JsonNode(value, file_, pointer_ + "/" + escapePointerToken(token));
}

void JsonNode::requireObject() const
{
    if (!value_->is_object()) fail("expected an object, found " + typeName());
}

void JsonNode::allowOnly(std::initializer_list<const char*> names) const
{
    requireObject();
    for (const auto& item : value_->items()) {
        const std::string& key = item.key();
        if (std::any_of(names.begin(), names.end(), [&](const char* name) { return key == name; })) continue;
        std::string best;
        size_t bestDistance = 4;
        std::vector<std::string> known;
        for (const char* name : names) {
            known.push_back(name);
            size_t d = distance(key, name);
            if (d < bestDistance) {
                bestDistance = d;
                best = name;
            }
        }
        std::string message = fmt::format("unknown field \"{}\"", key);
        if (!best.empty()) {
            message += fmt::format(" (did you mean \"{}\"?)", best);
        } else {
            message += fmt::format(" (known fields: {})", fmt::join(known, ", "));
        }
        child(item.value(), key).fail(message);
    }
}

bool JsonNode::has(const char* name) const
{
    return value_->is_object() && value_->contains(name);
}

JsonNode JsonNode::field(const char* name) const
{
    requireObject();
    auto it = value_->find(name);
    if (it == value_->end()) fail(fmt::format("missing field \"{}\"", name));
    return child(*it, name);
}

std::optional<JsonNode> JsonNode::optionalField(const char* name) const
{
    requireObject();
    auto it = value_->find(name);
    if (it == value_->end()) return std::nullopt;
    return child(*it, name);
}

std::vector<std::pair<std::string, JsonNode>> JsonNode::members() const
{
    requireObject();
    std::vector<std::pair<std::string, JsonNode>> result;
    for (const auto& item : value_->items()) result.emplace_back(item.key(), child(item.value(), item.key()));
    return result;
}

std::vector<JsonNode> JsonNode::items() const
{
    if (!value_->is_array()) fail("expected an array, found " + typeName());
    std::vector<JsonNode> result;
    for (size_t i = 0; i < value_->size(); ++i) result.push_back(child((*value_)[i], std::to_string(i)));
    return result;
}

std::vector<JsonNode> JsonNode::itemsOrOne() const
{
    if (value_->is_array()) return items();
    return {*this};
}

std::string JsonNode::text() const
{
    if (!value_->is_string()) fail("expected a string, found " + typeName());
    return value_->get<std::string>();
}

bool JsonNode::flag() const
{
    if (!value_->is_boolean()) fail("expected true or false, found " + typeName());
    return value_->get<bool>();
}

uint64_t JsonNode::unsignedNumber(uint64_t maximum) const
{
    int64_t value = 0;
    if (value_->is_number_integer()) {
        if (value_->is_number_unsigned()) {
            uint64_t big = value_->get<uint64_t>();
            if (big > maximum) fail(fmt::format("{} (0x{:X}) is above the largest value allowed here, 0x{:X}", big, big, maximum));
            return big;
        }
        value = value_->get<int64_t>();
    } else if (value_->is_string()) {
        std::optional<int64_t> parsed = parseNumberText(value_->get<std::string>());
        if (!parsed) fail(notANumber(value_->get<std::string>(), "19024 or \"0x4A50\""));
        value = *parsed;
    } else {
        fail("expected a number (such as 19024 or \"0x4A50\"), found " + typeName());
    }
    if (value < 0) fail(fmt::format("{} is negative; a value from 0 to 0x{:X} is needed here", value, maximum));
    if (static_cast<uint64_t>(value) > maximum)
        fail(fmt::format("0x{:X} is above the largest value allowed here, 0x{:X}", value, maximum));
    return static_cast<uint64_t>(value);
}

int32_t JsonNode::status() const
{
    int64_t value = 0;
    if (value_->is_number_integer()) {
        if (value_->is_number_unsigned() && value_->get<uint64_t>() > 0xFFFFFFFFu)
            fail("a status is a 32-bit value; this one is larger");
        value = value_->is_number_unsigned() ? static_cast<int64_t>(value_->get<uint64_t>()) : value_->get<int64_t>();
    } else if (value_->is_string()) {
        std::optional<int64_t> parsed = parseNumberText(value_->get<std::string>());
        if (!parsed) fail(notANumber(value_->get<std::string>(), "-50150 or \"0xC000026C\""));
        value = *parsed;
    } else {
        fail("expected a status (such as -50150 or \"0xC000026C\"), found " + typeName());
    }
    if (value < INT32_MIN || value > static_cast<int64_t>(UINT32_MAX))
        fail(fmt::format("{} does not fit a 32-bit status", value));
    return static_cast<int32_t>(static_cast<uint32_t>(value));
}

std::vector<uint8_t> JsonNode::hexBytes() const
{
    std::vector<uint8_t> bytes;
    if (value_->is_array()) {
        for (const JsonNode& item : items()) bytes.push_back(static_cast<uint8_t>(item.unsignedNumber(0xFF)));
        return bytes;
    }
    std::string digits;
    for (char c : text()) {
        if (std::isspace(static_cast<unsigned char>(c))) continue;
        if (!std::isxdigit(static_cast<unsigned char>(c)))
            fail(fmt::format("'{}' is not a hexadecimal digit; write bytes as \"AA 55 0F\"", c));
        digits += c;
    }
    if (digits.size() % 2 != 0) fail("an odd number of hexadecimal digits; every byte takes two");
    for (size_t i = 0; i < digits.size(); i += 2)
        bytes.push_back(static_cast<uint8_t>(std::stoul(digits.substr(i, 2), nullptr, 16)));
    return bytes;
}

}  // namespace lab
