#include <fmt/format.h>

#include "busTimeline.h"
#include "deviceStory.h"
#include "reports.h"
#include "requestJson.h"

namespace lab {

namespace {

using nlohmann::json;

std::string hex16(uint32_t value)
{
    return fmt::format("0x{:04X}", value);
}

std::string hex32(uint32_t value)
{
    return fmt::format("0x{:08X}", value);
}

json ownerJson(const RunRecord& record, const Owner& owner)
{
    if (owner.device < 0) return nullptr;
    return {{"device", record.devices[static_cast<size_t>(owner.device)].name}, {"update", owner.update + 1}};
}

json identityJson(const sim::IdentityValues& identity)
{
    return {{"vendorId", hex16(identity.vendorId)},         {"productId", hex16(identity.productId)},
            {"serialNumber", hex32(identity.serialNumber)}, {"productIdCopy", hex16(identity.productIdCopy)},
            {"altProductId", hex16(identity.altProductId)}};
}

json stepJson(const StepRecord& step)
{
    json out = {{"do", stepKindName(step.plan.kind)}, {"title", step.title}};
    bool ntStatus = step.plan.kind == StepKind::load || step.plan.kind == StepKind::unload;
    bool version = step.plan.kind == StepKind::getCurrentVersion || step.plan.kind == StepKind::getOldestCompatibleVersion;
    if (step.result) {
        out["result"] = ntStatus || version ? json(hex32(static_cast<uint32_t>(*step.result))) : json(*step.result);
    }
    if (step.status) out["status"] = *step.status;
    if (step.guid) out["guid"] = *step.guid;
    if (!step.problem.empty()) out["problem"] = step.problem;
    return out;
}

json requestJson(const sim::RequestRecord& request, int update)
{
    json out = requestRecordJson(request);
    out["update"] = update + 1;
    return out;
}

json updateJson(const DeviceRecord& device, const UpdateStory& story)
{
    json writes = json::array();
    for (const IdentityWrite& write : story.identityWrites)
        writes.push_back({{"address", hex16(write.address)}, {"field", write.field}, {"bytes", hexBytesText(write.bytes)},
                          {"took", write.took}});
    json out = {{"update", story.index + 1},
                {"requests", story.requests},
                {"failedRequests", story.failedRequests},
                {"identityWrites", writes},
                {"registryValuesRead", story.registryValuesRead},
                {"imagesOpened", story.imagesOpened},
                {"opensRefused", story.opensRefused},
                {"pagesErased", story.pagesErased},
                {"blocksWritten", story.blocksWritten},
                {"blocksVerified", story.blocksVerified},
                {"readBackDifferences", story.readBackDifferences},
                {"markerWritten", story.markerWritten},
                {"markerTook", story.markerTook},
                {"restarted", story.restarted},
                {"logLines", story.logLines}};
    if (story.imageSize) out["imageSize"] = *story.imageSize;
    if (device.options.timing) {
        out["microseconds"] = {{"fullSpeed", story.fullSpeed.count()}, {"highSpeed", story.highSpeed.count()}};
    }
    return out;
}

json deviceJson(const RunRecord& record, int index, const RunOptions& options)
{
    const DeviceRecord& device = record.devices[static_cast<size_t>(index)];
    json out = {{"name", device.name},
                {"usbVendorId", hex16(device.options.vendorId)},
                {"loaderProductId", hex16(device.options.loaderProductId)},
                {"mode", device.mode},
                {"markerInPlace", device.markerInPlace},
                {"notes", device.notes}};
    if (device.mode != "unplugged")
        out["enumeratedAs"] = fmt::format("{:04X}:{:04X}", device.enumeratedVendorId, device.enumeratedProductId);
    if (auto before = identityIn(device, device.flashBefore)) out["identityBefore"] = identityJson(*before);
    if (auto after = identityIn(device, device.flashAfter)) out["identityAfter"] = identityJson(*after);
    json updates = json::array();
    for (const UpdateStory& story : tellDeviceStory(record, index)) updates.push_back(updateJson(device, story));
    out["updates"] = updates;
    json trace = json::array();
    for (size_t r = 0; r < device.trace.size(); ++r)
        trace.push_back(requestJson(device.trace[r], r < device.updateOf.size() ? device.updateOf[r] : 0));
    out["trace"] = trace;
    json memory = {{"digest", fmt::format("{:016x}", fnv1a64(device.flashAfter))},
                   {"digestBefore", fmt::format("{:016x}", fnv1a64(device.flashBefore))}};
    json ranges = json::array();
    for (const MemoryRange& range : options.memoryRanges) {
        size_t end = std::min(device.flashAfter.size(), static_cast<size_t>(range.address) + range.length);
        std::vector<uint8_t> bytes(device.flashAfter.begin() + range.address,
                                   device.flashAfter.begin() + static_cast<std::ptrdiff_t>(end));
        ranges.push_back({{"address", hex16(range.address)}, {"hex", hexBytesText(bytes)}});
    }
    memory["ranges"] = ranges;
    out["memory"] = memory;
    if (device.options.timing) out["deviceClockMicroseconds"] = device.elapsed.count();
    return out;
}

json scenarioJson(const ScenarioResult& result, const RunOptions& options)
{
    json out = {{"file", result.file}, {"exitCode", result.exitCode()}};
    if (!result.invalid.empty()) {
        out["invalid"] = result.invalid;
        return out;
    }
    if (!result.labError.empty()) {
        out["labError"] = result.labError;
        return out;
    }
    const RunRecord& record = result.record;
    out["description"] = result.scenario->description;
    out["passed"] = result.expectations.failures.empty();
    out["busMicroseconds"] = layOutBusTimeline(record).total.count();  // all devices, served one after another
    json steps = json::array();
    for (const StepRecord& step : record.steps) steps.push_back(stepJson(step));
    out["steps"] = steps;
    json log = json::array();
    for (const LogRecord& entry : record.eventLog) {
        log.push_back({{"component", entry.entry.component},
                       {"location", entry.entry.location},
                       {"level", entry.entry.level},
                       {"tag", entry.entry.tag},
                       {"format", entry.entry.format},
                       {"message", entry.entry.message},
                       {"owner", ownerJson(record, entry.owner)}});
    }
    out["eventLog"] = log;
    out["debugLines"] = record.debugLines;
    json events = json::array();
    for (const sim::PackageEvent& event : record.packageEvents)
        events.push_back({{"event", event.event}, {"firstName", event.firstName}, {"secondName", event.secondName},
                          {"mainName", event.mainName}});
    out["packageEvents"] = events;
    json devices = json::array();
    for (size_t i = 0; i < record.devices.size(); ++i) devices.push_back(deviceJson(record, static_cast<int>(i), options));
    out["devices"] = devices;
    json opens = json::array();
    for (const FileOpenSeen& seen : record.fileOpens)
        opens.push_back({{"path", seen.open.dosPath}, {"status", hex32(static_cast<uint32_t>(seen.open.status))},
                         {"owner", ownerJson(record, seen.owner)}});
    out["fileOpens"] = opens;
    out["registry"] = {{"createdKeys", record.createdKeys}, {"calls", record.registryCalls.size()}};
    out["allocator"] = {{"liveBlocks", record.liveBlocks},
                        {"liveBytes", record.liveBytes},
                        {"totalAllocations", record.totalAllocations}};
    out["handles"] = {{"open", record.openHandles}};
    out["deviceTree"] = {{"listeners", record.liveListeners}, {"queries", record.liveQueries}};
    out["leftovers"] = record.leftovers;
    out["misuse"] = record.misuse;
    json findings = json::array();
    for (const Finding& finding : record.findings)
        findings.push_back({{"device", finding.device.empty() ? json(nullptr) : json(finding.device)}, {"text", finding.text}});
    out["findings"] = findings;
    json failures = json::array();
    for (const ExpectationFailure& failure : result.expectations.failures)
        failures.push_back({{"place", failure.place}, {"what", failure.what}});
    out["expectations"] = {{"checked", result.expectations.checked}, {"failures", failures}};
    if (result.engines) {
        out["engines"] = {{"linuxSeconds", result.engines->linuxSeconds},
                          {"windowsSeconds", result.engines->windowsSeconds},
                          {"differences", result.engines->differences}};
    }
    return out;
}

}  // namespace

uint64_t fnv1a64(const std::vector<uint8_t>& bytes)
{
    uint64_t hash = 0xcbf29ce484222325ull;
    for (uint8_t byte : bytes) {
        hash ^= byte;
        hash *= 0x100000001b3ull;
    }
    return hash;
}

json jsonReport(const std::vector<ScenarioResult>& results, const RunOptions& options)
{
    json scenarios = json::array();
    for (const ScenarioResult& result : results) scenarios.push_back(scenarioJson(result, options));
    return {{"memoryDigest", "FNV-1a 64-bit over the device's 64 KiB of memory"},
            {"exitCode", combinedExitCode(results)},
            {"scenarios", scenarios}};
}

}  // namespace lab
