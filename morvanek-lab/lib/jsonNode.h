// A value of a scenario file together with its place (a JSON pointer), so that
// every complaint about it can say where it is. Reading is strict: unknown
// fields, wrong types and out-of-range numbers are errors.
#pragma once

#include <cstdint>
#include <initializer_list>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include <nlohmann/json.hpp>

#include "scenarioError.h"

namespace lab {

class JsonNode {
public:
    JsonNode(const nlohmann::json& value, std::string file) : JsonNode(value, std::make_shared<std::string>(file), "") {}

    const nlohmann::json& json() const { return *value_; }
    const std::string& pointer() const { return pointer_; }
    const std::string& file() const { return *file_; }

    [[noreturn]] void fail(const std::string& what) const;

    // Objects.
    void requireObject() const;
    // Fails on any field not named here, suggesting the closest known name.
    void allowOnly(std::initializer_list<const char*> names) const;
    bool has(const char* name) const;
    JsonNode field(const char* name) const;  // required
    std::optional<JsonNode> optionalField(const char* name) const;
    std::vector<std::pair<std::string, JsonNode>> members() const;

    // Arrays.
    std::vector<JsonNode> items() const;
    // An array, or a single value taken as an array of one.
    std::vector<JsonNode> itemsOrOne() const;

    bool isString() const { return value_->is_string(); }
    bool isObject() const { return value_->is_object(); }
    bool isArray() const { return value_->is_array(); }
    bool isNull() const { return value_->is_null(); }

    std::string text() const;
    bool flag() const;
    // A JSON integer, or a string holding a decimal or 0x-prefixed hexadecimal
    // number ("0x4A10"); at most `maximum`.
    uint64_t unsignedNumber(uint64_t maximum) const;
    // Signed 32-bit statuses; values from 0x80000000 to 0xFFFFFFFF (kernel
    // statuses such as 0xC000026C) are taken as their 32-bit pattern.
    int32_t status() const;
    // Hex digit pairs, optionally separated by spaces ("AA 55"), or an array of byte values.
    std::vector<uint8_t> hexBytes() const;

private:
    JsonNode(const nlohmann::json& value, std::shared_ptr<const std::string> file, std::string pointer)
        : value_(&value), file_(std::move(file)), pointer_(std::move(pointer))
    {
    }
    JsonNode child(const nlohmann::json& value, const std::string& token) const;
    std::string typeName() const;

    const nlohmann::json* value_;
    std::shared_ptr<const std::string> file_;
    std::string pointer_;
};

// One step of a JSON pointer: "~" and "/" escaped as the pointer syntax
// wants, control characters written out as \uXXXX so that a message never
// carries them raw.
std::string escapePointerToken(const std::string& token);

// Parses a number text as the scenario format accepts it; nullopt when it is not one.
std::optional<int64_t> parseNumberText(const std::string& text);

}  // namespace lab
