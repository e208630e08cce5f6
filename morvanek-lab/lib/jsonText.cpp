#include "jsonText.h"

#include <algorithm>
#include <cctype>
#include <cstdint>
#include <optional>
#include <utility>
#include <vector>

#include <fmt/format.h>

#include "jsonNode.h"
#include "scenarioError.h"

namespace lab {

namespace {

using json = nlohmann::json;

// The parser counts bytes read; people want a line and a column.
std::string lineAndColumn(const std::string& text, size_t bytesRead)
{
    size_t line = 1;
    size_t column = 1;
    for (size_t i = 0; i + 1 < bytesRead && i < text.size(); ++i) {
        if (text[i] == '\n') {
            ++line;
            column = 1;
        } else {
            ++column;
        }
    }
    return fmt::format("line {}, column {}", line, column);
}

// The first byte that no UTF-8 text holds (a NUL included), if any. Finer
// UTF-8 faults inside strings are the parser's to name.
std::optional<size_t> firstNonTextByte(const std::string& text)
{
    size_t i = 0;
    while (i < text.size()) {
        auto lead = static_cast<unsigned char>(text[i]);
        size_t length = 0;
        if (lead >= 0x01 && lead < 0x80) {
            length = 1;
        } else if (lead >= 0xC2 && lead < 0xE0) {
            length = 2;
        } else if (lead >= 0xE0 && lead < 0xF0) {
            length = 3;
        } else if (lead >= 0xF0 && lead < 0xF5) {
            length = 4;
        }
        if (length == 0 || text.size() - i < length) return i;
        for (size_t k = 1; k < length; ++k) {
            if ((static_cast<unsigned char>(text[i + k]) & 0xC0) != 0x80) return i;
        }
        i += length;
    }
    return std::nullopt;
}

bool isWordCharacter(char c)
{
    return std::isalnum(static_cast<unsigned char>(c)) != 0 || c == '+' || c == '-' || c == '.' || c == '_';
}

// The word of the text where the parser stopped: its echo of the input cannot
// be trusted to show just the bad token.
std::string wordAt(const std::string& text, size_t bytesRead)
{
    if (bytesRead == 0 || bytesRead > text.size()) return {};
    size_t end = bytesRead - 1;
    while (end < text.size() && isWordCharacter(text[end])) ++end;
    size_t start = std::min(end, bytesRead);
    while (start > 0 && isWordCharacter(text[start - 1])) --start;
    if (start == end) return text.substr(bytesRead - 1, 1);
    return text.substr(start, end - start);
}

// The parser's own words, without its position prefix and its echo of the
// input, turned into what a person writing a scenario needs to hear.
std::string syntaxReason(const std::string& what, const std::string& text, size_t bytesRead)
{
    std::string reason = what;
    if (size_t dash = reason.find(" - "); dash != std::string::npos) {
        reason.erase(0, dash + 3);
    } else if (size_t colon = reason.find(": "); colon != std::string::npos) {
        reason.erase(0, colon + 2);
    }
    std::string expected;
    if (size_t semicolon = reason.find("; expected "); semicolon != std::string::npos) {
        expected = reason.substr(semicolon + 11);
        reason.erase(semicolon);
    }
    if (size_t lastRead = reason.find("; last read"); lastRead != std::string::npos) reason.erase(lastRead);
    auto startsWith = [&](const char* prefix) { return reason.rfind(prefix, 0) == 0; };
    std::string word = wordAt(text, bytesRead);
    if (startsWith("invalid string: missing closing quote")) return "a string is not closed: its closing \" is missing";
    if (startsWith("invalid string: ")) return "in a string: " + reason.substr(16);
    if (startsWith("invalid literal") && word == "/") return "comments are not part of JSON; remove the comment";
    if (expected == "end of input")
        return fmt::format("text after the end of the JSON value, starting with '{}'; a scenario is one JSON object", word);
    if (startsWith("invalid literal")) {
        return fmt::format("'{}' is not a JSON value (true, false, null, a number, a \"string\", an [array] or an "
                           "{{object}})",
                           word);
    }
    if (startsWith("invalid number")) return fmt::format("'{}' is not a number", word);
    if (startsWith("unexpected end of input"))
        return "the text ends before the JSON value is complete" + (expected.empty() ? "" : "; expected " + expected);
    return reason + (expected.empty() ? "" : "; expected " + expected);
}

// Builds the document from the parser's events, as nlohmann's own builder
// does, but refuses a second key in an object by looking it up in the object
// itself (no callback that rescans the parent at every closing brace, which
// made large scenarios quadratic), and keeps what it needs to say where.
class DocumentBuilder {
public:
    DocumentBuilder(json& root, const std::string& text) : root_(root), text_(text) {}

    bool null() { return add(json(nullptr)); }
    bool boolean(bool value) { return add(json(value)); }
    bool number_integer(json::number_integer_t value) { return add(json(value)); }
    bool number_unsigned(json::number_unsigned_t value) { return add(json(value)); }
    bool number_float(json::number_float_t value, const std::string& written)
    {
        // The parser takes an integer that does not fit 64 bits as a fraction.
        if (written.find_first_of(".eE") == std::string::npos)
            return refuse(fmt::format("{} is out of range: integers go from {} to {}", written, INT64_MIN, UINT64_MAX));
        return add(json(value));
    }
    bool string(std::string& value)
    {
        if (value.size() > kMaxStringBytes) return refuse(tooLong(value.size()));
        return add(json(std::move(value)));
    }
    bool binary(json::binary_t& /*value: never in a JSON text*/) { return refuse("binary data is not JSON"); }
    bool start_object(std::size_t /*elements: unknown in a JSON text*/) { return open(json::object()); }
    bool start_array(std::size_t /*elements*/) { return open(json::array()); }
    bool end_object() { return close(); }
    bool end_array() { return close(); }
    bool key(std::string& name)
    {
        Frame& frame = frames_.back();
        frame.key = name;
        if (name.size() > kMaxStringBytes) return refuse(tooLong(name.size()));
        // Either value would silently win; the second one is refused where it stands.
        if (frame.container->contains(name)) return refuse(fmt::format("the field \"{}\" appears twice in one object", name));
        return true;
    }
    bool parse_error(std::size_t bytesRead, const std::string& lastToken, const nlohmann::detail::exception& error)
    {
        where_ = lineAndColumn(text_, bytesRead);
        if (error.id == 406) {
            // A number too large for a double, such as 1e999; the parser has read past it.
            size_t at = text_.rfind(lastToken, bytesRead);
            if (at != std::string::npos) where_ = lineAndColumn(text_, at + 1);
            problem_ = fmt::format("{} is out of range: it is too large for a number", lastToken);
        } else {
            problem_ = "JSON syntax error: " + syntaxReason(error.what(), text_, bytesRead);
        }
        return false;
    }

    const std::string& where() const { return where_; }
    const std::string& problem() const { return problem_; }

private:
    struct Frame {
        json* container;
        std::string key;  // objects: the key of the value being read
    };

    // Where the value being read stands.
    std::string pointer() const
    {
        std::string path;
        for (size_t i = 0; i < frames_.size(); ++i) {
            const Frame& frame = frames_[i];
            if (frame.container->is_object()) {
                path += "/" + escapePointerToken(frame.key);
            } else {
                // An enclosing array already holds the element being read; the innermost one does not yet.
                size_t index = frame.container->size() - (i + 1 < frames_.size() ? 1 : 0);
                path += "/" + std::to_string(index);
            }
        }
        return path.empty() ? "/" : path;
    }

    std::string tooLong(size_t size) const
    {
        return fmt::format("a string of {} bytes; the lab takes strings of at most {} bytes", size, kMaxStringBytes);
    }

    bool refuse(const std::string& problem)
    {
        where_ = pointer();
        problem_ = problem;
        return false;
    }

    json* place(json&& value)
    {
        if (frames_.empty()) {
            root_ = std::move(value);
            return &root_;
        }
        Frame& frame = frames_.back();
        if (frame.container->is_object()) return &((*frame.container)[frame.key] = std::move(value));
        frame.container->push_back(std::move(value));
        return &frame.container->back();
    }

    bool add(json&& value)
    {
        place(std::move(value));
        return true;
    }

    bool open(json&& empty)
    {
        if (frames_.size() >= kMaxNesting)
            return refuse(fmt::format("nested more than {} deep; no scenario needs that", kMaxNesting));
        json* container = place(std::move(empty));
        frames_.push_back({container, {}});
        return true;
    }

    bool close()
    {
        frames_.pop_back();
        return true;
    }

    json& root_;
    const std::string& text_;
    std::vector<Frame> frames_;
    std::string where_;
    std::string problem_;
};

}  // namespace

nlohmann::json readJsonText(const std::string& text, const std::string& fileName)
{
    if (text.size() > kMaxScenarioBytes)
        throw ScenarioError(fileName, "",
                            fmt::format("{} bytes; the lab takes scenarios of at most {} MiB", text.size(),
                                        kMaxScenarioBytes / (1024 * 1024)));
    if (auto offset = firstNonTextByte(text)) {
        throw ScenarioError(fileName, "",
                            fmt::format("not a text file: byte 0x{:02X} at offset {} is not UTF-8 text",
                                        static_cast<unsigned char>(text[*offset]), *offset));
    }
    if (text.find_first_not_of(" \t\r\n") == std::string::npos)
        throw ScenarioError(fileName, "", "the file is empty; a scenario is one JSON object");

    json document;
    DocumentBuilder builder(document, text);
    if (!json::sax_parse(text, &builder)) throw ScenarioError(fileName, builder.where(), builder.problem());
    return document;
}

}  // namespace lab
