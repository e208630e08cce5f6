// What a scenario expects to see once its steps have run.
#include <algorithm>

#include <fmt/format.h>

#include "parseParts.h"

namespace lab {

namespace {

LineMatcher parseMatcher(const JsonNode& node)
{
    LineMatcher matcher;
    if (node.isString()) {
        matcher.message = node.text();
        return matcher;
    }
    node.allowOnly({"message", "location", "component", "tag", "format", "level"});
    if (auto value = node.optionalField("message")) matcher.message = value->text();
    if (auto value = node.optionalField("location")) matcher.location = value->text();
    if (auto value = node.optionalField("component")) matcher.component = value->text();
    if (auto value = node.optionalField("tag")) matcher.tag = value->text();
    if (auto value = node.optionalField("format")) matcher.format = value->text();
    if (auto value = node.optionalField("level")) matcher.level = static_cast<uint32_t>(value->unsignedNumber(0xFFFFFFFF));
    return matcher;
}

std::vector<LineMatcher> parseMatchers(const JsonNode& node)
{
    std::vector<LineMatcher> matchers;
    for (const JsonNode& item : node.itemsOrOne()) matchers.push_back(parseMatcher(item));
    return matchers;
}

LinesExpectation parseLines(const JsonNode& node)
{
    node.allowOnly({"count", "contains", "absent", "exactly"});
    LinesExpectation lines;
    lines.pointer = node.pointer();
    if (auto value = node.optionalField("count")) lines.count = static_cast<size_t>(value->unsignedNumber(1000000));
    if (auto value = node.optionalField("contains")) lines.contains = parseMatchers(*value);
    if (auto value = node.optionalField("absent")) lines.absent = parseMatchers(*value);
    if (auto value = node.optionalField("exactly")) lines.exactly = parseMatchers(*value);
    return lines;
}

std::vector<std::string> parseTexts(const JsonNode& node)
{
    std::vector<std::string> texts;
    for (const JsonNode& item : node.itemsOrOne()) texts.push_back(item.text());
    return texts;
}

RequestsExpectation parseRequests(const JsonNode& node)
{
    node.allowOnly({"total", "read", "write", "erase", "restart", "failed", "sequence", "startsWith", "endsWith",
                    "contains", "absent"});
    RequestsExpectation requests;
    requests.pointer = node.pointer();
    for (const char* what : {"total", "read", "write", "erase", "restart", "failed"}) {
        if (auto value = node.optionalField(what))
            requests.counts.push_back({what, static_cast<size_t>(value->unsignedNumber(1000000000))});
    }
    if (auto value = node.optionalField("sequence")) requests.sequence = parseTexts(*value);
    if (auto value = node.optionalField("startsWith")) requests.startsWith = parseTexts(*value);
    if (auto value = node.optionalField("endsWith")) requests.endsWith = parseTexts(*value);
    if (auto value = node.optionalField("contains")) requests.contains = parseTexts(*value);
    if (auto value = node.optionalField("absent")) requests.absent = parseTexts(*value);
    return requests;
}

IdentityExpectation parseIdentity(const JsonNode& node)
{
    node.allowOnly({"vendorId", "productId", "serialNumber", "productIdCopy", "altProductId"});
    IdentityExpectation identity;
    auto id16 = [&](const char* name) -> std::optional<uint16_t> {
        if (auto value = node.optionalField(name)) return static_cast<uint16_t>(value->unsignedNumber(0xFFFF));
        return std::nullopt;
    };
    identity.vendorId = id16("vendorId");
    identity.productId = id16("productId");
    identity.productIdCopy = id16("productIdCopy");
    identity.altProductId = id16("altProductId");
    if (auto value = node.optionalField("serialNumber")) identity.serialNumber = static_cast<uint32_t>(value->unsignedNumber(0xFFFFFFFF));
    return identity;
}

DeviceExpectation parseDeviceExpectation(const std::string& name, const JsonNode& node)
{
    node.allowOnly({"mode", "enumeratesAs", "identity", "markerInPlace", "programmedWith", "memory", "requests",
                    "findings"});
    DeviceExpectation device;
    device.device = name;
    device.pointer = node.pointer();
    if (auto value = node.optionalField("mode")) {
        std::string mode = value->text();
        if (mode != "loader" && mode != "product" && mode != "unplugged")
            value->fail("\"mode\" is \"loader\", \"product\" or \"unplugged\"");
        device.mode = mode;
    }
    if (auto value = node.optionalField("enumeratesAs")) device.enumeratesAs = static_cast<uint16_t>(value->unsignedNumber(0xFFFF));
    if (auto value = node.optionalField("identity")) device.identity = parseIdentity(*value);
    if (auto value = node.optionalField("markerInPlace")) device.markerInPlace = value->flag();
    if (auto value = node.optionalField("programmedWith")) device.programmedWith = value->text();
    if (auto list = node.optionalField("memory")) {
        for (const JsonNode& item : list->items()) {
            item.allowOnly({"address", "hex"});
            MemoryExpectation memory;
            memory.pointer = item.pointer();
            memory.address = static_cast<uint16_t>(item.field("address").unsignedNumber(0xFFFF));
            memory.bytes = item.field("hex").hexBytes();
            if (memory.address + memory.bytes.size() > 0x10000)
                item.fail("the bytes run past the end of the device's memory at 0xFFFF");
            device.memory.push_back(memory);
        }
    }
    if (auto value = node.optionalField("requests")) device.requests = parseRequests(*value);
    if (auto value = node.optionalField("findings")) device.findings = parseLines(*value);
    return device;
}

}  // namespace

Expectations parseExpectations(const JsonNode& node, const std::vector<DevicePlan>& devices)
{
    node.allowOnly({"eventLog", "debugLines", "findings", "devices", "nothingLeft", "createdKeys"});
    Expectations expect;
    if (auto value = node.optionalField("eventLog")) expect.eventLog = parseLines(*value);
    if (auto value = node.optionalField("debugLines")) expect.debugLines = parseLines(*value);
    if (auto value = node.optionalField("findings")) expect.findings = parseLines(*value);
    if (auto value = node.optionalField("devices")) {
        for (const auto& [name, device] : value->members()) {
            if (std::none_of(devices.begin(), devices.end(), [&wanted = name](const DevicePlan& d) { return d.name == wanted; }))
                device.fail(fmt::format("there is no device named \"{}\" in \"devices\"", name));
            expect.devices.push_back(parseDeviceExpectation(name, device));
        }
    }
    if (auto value = node.optionalField("nothingLeft")) expect.nothingLeft = value->flag();
    if (auto value = node.optionalField("createdKeys")) {
        std::vector<std::string> keys;
        for (const JsonNode& item : value->items()) keys.push_back(kernelKeyPath(item));
        expect.createdKeys = keys;
    }
    return expect;
}

}  // namespace lab
