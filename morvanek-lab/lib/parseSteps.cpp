// The steps of a scenario, in order, each with what its result must be.
#include <algorithm>

#include <fmt/format.h>

#include "parseParts.h"

namespace lab {

namespace {

constexpr const char* kDefaultRegistryPath = "\\Registry\\Machine\\System\\CurrentControlSet\\Services\\morvanek";

struct StepName {
    const char* name;
    StepKind kind;
};

constexpr StepName kStepNames[] = {
    {"load", StepKind::load},
    {"start", StepKind::start},
    {"stop", StepKind::stop},
    {"main", StepKind::moduleMain},
    {"plugIn", StepKind::plugIn},
    {"unplug", StepKind::unplug},
    {"setWdmLoadState", StepKind::setWdmLoadState},
    {"setLegacyLoadState", StepKind::setLegacyLoadState},
    {"getCurrentVersion", StepKind::getCurrentVersion},
    {"getOldestCompatibleVersion", StepKind::getOldestCompatibleVersion},
    {"compareVersion", StepKind::compareVersion},
    {"compareFirmwareVersion", StepKind::compareFirmwareVersion},
    {"unload", StepKind::unload},
};

StepKind stepKind(const JsonNode& node)
{
    std::string name = node.text();
    for (const StepName& step : kStepNames) {
        if (name == step.name) return step.kind;
    }
    std::vector<std::string> known;
    for (const StepName& step : kStepNames) known.push_back(step.name);
    node.fail(fmt::format("\"{}\" is not a step; the steps are {}", name, fmt::join(known, ", ")));
}

MainRoute route(const JsonNode& node)
{
    std::string name = node.text();
    if (name == "moduleMain") return MainRoute::moduleMain;
    if (name == "wrapper") return MainRoute::wrapper;
    node.fail("\"via\" is \"moduleMain\" (the host calls the record's module main) or \"wrapper\" "
              "(pkgWDMWrapperCallSSMain)");
}

// What a step's "expect" may name: its result, the status it leaves, or a GUID.
void parseStepExpectation(const JsonNode& node, StepPlan& step)
{
    switch (step.kind) {
    case StepKind::load:
    case StepKind::unload:
    case StepKind::start:
    case StepKind::stop:
    case StepKind::moduleMain:
        node.allowOnly({"result"});
        break;
    case StepKind::setWdmLoadState:
        node.allowOnly({"guid"});
        break;
    case StepKind::getCurrentVersion:
    case StepKind::getOldestCompatibleVersion:
        node.allowOnly({"result", "status"});
        break;
    case StepKind::compareVersion:
    case StepKind::compareFirmwareVersion:
        node.allowOnly({"status"});
        break;
    case StepKind::plugIn:
    case StepKind::unplug:
    case StepKind::setLegacyLoadState:
        node.fail(fmt::format("a \"{}\" step has no result to expect", stepKindName(step.kind)));
    }
    if (auto result = node.optionalField("result")) {
        bool isVersion = step.kind == StepKind::getCurrentVersion || step.kind == StepKind::getOldestCompatibleVersion;
        step.expectResult = isVersion ? static_cast<int64_t>(result->unsignedNumber(0xFFFFFFFF)) : result->status();
    }
    if (auto status = node.optionalField("status")) step.expectStatus = status->status();
    if (auto guid = node.optionalField("guid")) step.expectGuid = guid->text();
}

std::string deviceName(const JsonNode& node, const std::vector<DevicePlan>& devices)
{
    std::string name = node.text();
    if (std::none_of(devices.begin(), devices.end(), [&](const DevicePlan& d) { return d.name == name; }))
        node.fail(fmt::format("there is no device named \"{}\" in \"devices\"", name));
    return name;
}

StepPlan parseStep(const JsonNode& node, const std::vector<DevicePlan>& devices)
{
    StepPlan step;
    step.pointer = node.pointer();
    if (node.isString()) {
        step.kind = stepKind(node);
        if (step.kind != StepKind::load && step.kind != StepKind::start && step.kind != StepKind::stop &&
            step.kind != StepKind::unload)
            node.fail(fmt::format("a \"{}\" step needs arguments: write it as an object with \"do\"",
                                  stepKindName(step.kind)));
        if (step.kind == StepKind::load) step.registryPath = kDefaultRegistryPath;
        if (step.kind == StepKind::stop) step.reason = 1;
        return step;
    }
    step.kind = stepKind(node.field("do"));
    switch (step.kind) {
    case StepKind::load:
        node.allowOnly({"do", "registryPath", "expect"});
        step.registryPath = kDefaultRegistryPath;
        if (auto path = node.optionalField("registryPath")) step.registryPath = path->text();
        break;
    case StepKind::start:
    case StepKind::stop:
    case StepKind::moduleMain:
        if (step.kind == StepKind::moduleMain) {
            node.allowOnly({"do", "reason", "via", "expect"});
            step.reason = static_cast<uint32_t>(node.field("reason").unsignedNumber(0xFFFFFFFF));
        } else {
            node.allowOnly({"do", "via", "expect"});
            step.reason = step.kind == StepKind::stop ? 1 : 0;
        }
        if (auto via = node.optionalField("via")) step.route = route(*via);
        break;
    case StepKind::plugIn:
        node.allowOnly({"do", "device", "startsIn"});
        step.device = deviceName(node.field("device"), devices);
        if (auto startsIn = node.optionalField("startsIn")) step.startsIn = powerUp(*startsIn, true);
        break;
    case StepKind::unplug:
        node.allowOnly({"do", "device"});
        step.device = deviceName(node.field("device"), devices);
        break;
    case StepKind::setWdmLoadState:
    case StepKind::setLegacyLoadState:
        node.allowOnly({"do", "state", "expect"});
        step.state = static_cast<uint32_t>(node.field("state").unsignedNumber(0xFFFFFFFF));
        break;
    case StepKind::getCurrentVersion:
    case StepKind::getOldestCompatibleVersion:
        node.allowOnly({"do", "status", "expect"});
        break;
    case StepKind::compareVersion:
        node.allowOnly({"do", "newest", "oldest", "component", "status", "expect"});
        step.newest = static_cast<uint32_t>(node.field("newest").unsignedNumber(0xFFFFFFFF));
        step.oldest = static_cast<uint32_t>(node.field("oldest").unsignedNumber(0xFFFFFFFF));
        if (auto component = node.optionalField("component"); component && !component->isNull())
            step.component = component->text();
        break;
    case StepKind::compareFirmwareVersion:
        node.allowOnly({"do", "version", "productId", "status", "expect"});
        step.version = static_cast<uint32_t>(node.field("version").unsignedNumber(0xFFFFFFFF));
        step.productId = static_cast<uint16_t>(node.field("productId").unsignedNumber(0xFFFF));
        break;
    case StepKind::unload:
        node.allowOnly({"do", "expect"});
        break;
    }
    if (auto status = node.optionalField("status")) step.statusIn = status->status();
    if (auto expect = node.optionalField("expect")) parseStepExpectation(*expect, step);
    return step;
}

}  // namespace

const char* stepKindName(StepKind kind)
{
    for (const StepName& step : kStepNames) {
        if (step.kind == kind) return step.name;
    }
    return "?";
}

std::vector<StepPlan> parseSteps(const JsonNode& node, const std::vector<DevicePlan>& devices)
{
    std::vector<StepPlan> steps;
    for (const JsonNode& item : node.items()) steps.push_back(parseStep(item, devices));
    return steps;
}

}  // namespace lab
