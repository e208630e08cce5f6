#include <algorithm>

#include <fmt/format.h>

#include "deviceStory.h"
#include "reports.h"

namespace lab {

namespace {

void line(std::FILE* out, const std::string& label, const std::string& text, int indent = 2)
{
    fmt::print(out, "{:{}}{:<14}{}\n", "", indent, label, text);
}

std::string trimmedMessage(std::string message)
{
    while (!message.empty() && (message.back() == '\n' || message.back() == '\r')) message.pop_back();
    return message;
}

std::string identityStory(const DeviceRecord& device, const UpdateStory& story, bool firstUpdate)
{
    std::optional<sim::IdentityValues> before = identityIn(device, device.flashBefore);
    std::string text;
    if (firstUpdate && before) text = identityText(*before);
    if (story.identityWrites.empty()) return text + (text.empty() ? "" : "; ") + "nothing written";
    std::vector<std::string> writes;
    for (const IdentityWrite& write : story.identityWrites) {
        std::string value = write.bytes.size() == 2 ? fmt::format("{:02X}{:02X}", write.bytes[0], write.bytes[1])
                                                    : hexBytesText(write.bytes);
        writes.push_back(fmt::format("{} {} at 0x{:04X}{}", write.field.empty() ? "bytes" : write.field, value,
                                     write.address, write.took ? "" : " (did not take)"));
    }
    bool fromRegistry = std::any_of(story.registryValuesRead.begin(), story.registryValuesRead.end(),
                                    [](const std::string& value) { return value.rfind("FVTPID", 0) == 0; });
    return text + (text.empty() ? "" : "; ") +
           fmt::format("repaired{}: wrote {}", fromRegistry ? " from the registry's FVTPID" : "", fmt::join(writes, ", "));
}

std::string imageStory(const UpdateStory& story)
{
    std::vector<std::string> parts;
    if (!story.imagesOpened.empty()) {
        parts.push_back(fmt::format("{}", fmt::join(story.imagesOpened, ", ")) +
                        (story.imageSize ? fmt::format(", {} bytes", *story.imageSize) : ""));
    }
    for (const std::string& refused : story.opensRefused) parts.push_back("could not open " + refused);
    return parts.empty() ? "none opened" : fmt::format("{}", fmt::join(parts, "; "));
}

std::string flashStory(const DeviceRecord& device, const UpdateStory& story)
{
    std::vector<std::string> parts;
    if (!story.pagesErased.empty()) parts.push_back("erased pages " + pageRanges(story.pagesErased));
    if (story.blocksWritten != 0)
        parts.push_back(fmt::format("{} block(s) written, {} verified", story.blocksWritten, story.blocksVerified));
    for (const std::string& difference : story.readBackDifferences) parts.push_back(difference);
    if (story.markerWritten && device.layout != nullptr)
        parts.push_back(fmt::format("marker at 0x{:04X}{}", device.layout->firmwareBase + 6,
                                    story.markerTook ? "" : " (did not take)"));
    if (parts.empty()) parts.push_back("nothing erased or written");
    parts.push_back(story.restarted ? "restarted" : "no restart");
    if (story.failedRequests != 0) parts.push_back(fmt::format("{} request(s) failed", story.failedRequests));
    return fmt::format("{}", fmt::join(parts, "; "));
}

std::string nowStory(const DeviceRecord& device)
{
    if (device.mode == "unplugged") return "unplugged";
    if (device.mode == "product")
        return fmt::format("runs its firmware as {:04X}:{:04X}", device.enumeratedVendorId, device.enumeratedProductId);
    return fmt::format("in loader mode as {:04X}:{:04X}", device.enumeratedVendorId, device.enumeratedProductId);
}

void printDevice(std::FILE* out, const RunRecord& record, int index, const RunOptions& options)
{
    const DeviceRecord& device = record.devices[static_cast<size_t>(index)];
    // The module looks at the low 16 bits of the vendor attribute only.
    if (device.layout != nullptr && (device.options.vendorId & 0xFFFF) == sim::kDeviceFamilyVendorId) {
        fmt::print(out, "  device {} (loader {:04X}:{:04X})\n", device.name, device.options.vendorId,
                   device.options.loaderProductId);
    } else {
        fmt::print(out, "  device {} (USB {:04X}:{:04X}, not a loader of the family)\n", device.name,
                   device.options.vendorId, device.options.loaderProductId);
    }
    std::vector<UpdateStory> stories = tellDeviceStory(record, index);
    if (stories.empty()) line(out, "update", "none: the module made no request to it", 4);
    for (const UpdateStory& story : stories) {
        if (stories.size() > 1) fmt::print(out, "    update {} of {}\n", story.index + 1, stories.size());
        int indent = stories.size() > 1 ? 6 : 4;
        line(out, "identity", identityStory(device, story, story.index == 0), indent);
        if (!story.imagesOpened.empty() || !story.opensRefused.empty() || story.blocksWritten != 0)
            line(out, "image", imageStory(story), indent);
        line(out, "flash", flashStory(device, story), indent);
        for (const std::string& message : story.logLines) line(out, "logged", trimmedMessage(message), indent);
        if (device.options.timing)
            line(out, "time",
                 fmt::format("{} requests: {} on a full-speed bus, {} on a high-speed bus", story.requests,
                             durationText(story.fullSpeed), durationText(story.highSpeed)),
                 indent);
    }
    line(out, "now", nowStory(device), 4);
    for (const MemoryRange& range : options.memoryRanges) {
        for (size_t offset = 0; offset < range.length; offset += 16) {
            size_t address = range.address + offset;
            if (address >= device.flashAfter.size()) break;
            size_t end = std::min({address + 16, device.flashAfter.size(), static_cast<size_t>(range.address) + range.length});
            std::vector<uint8_t> bytes(device.flashAfter.begin() + static_cast<std::ptrdiff_t>(address),
                                       device.flashAfter.begin() + static_cast<std::ptrdiff_t>(end));
            line(out, offset == 0 ? "memory" : "", fmt::format("0x{:04X}  {}", address, hexBytesText(bytes)), 4);
        }
    }
    if (options.trace) {
        fmt::print(out, "    requests\n");
        for (const sim::RequestRecord& request : device.trace) {
            std::string data;
            if (!request.data.empty()) {
                std::vector<uint8_t> head(request.data.begin(), request.data.begin() + std::min<size_t>(request.data.size(), 16));
                data = "  " + hexBytesText(head) + (request.data.size() > 16 ? " ..." : "");
            }
            fmt::print(out, "      {}{}\n", sim::describeRequest(request), data);
        }
    }
}

void printLines(std::FILE* out, const std::string& label, const std::vector<std::string>& lines, const char* none)
{
    if (lines.empty()) {
        line(out, label, none);
        return;
    }
    for (size_t i = 0; i < lines.size(); ++i) line(out, i == 0 ? label : "", trimmedMessage(lines[i]));
}

}  // namespace

void printTextReport(std::FILE* out, const ScenarioResult& result, const RunOptions& options)
{
    if (!result.invalid.empty()) {
        fmt::print(out, "INVALID  {}\n", result.invalid);
        return;
    }
    if (!result.labError.empty()) {
        fmt::print(out, "LAB ERROR  {}: {}\n", result.file, result.labError);
        return;
    }
    const Scenario& scenario = *result.scenario;
    const RunRecord& record = result.record;
    fmt::print(out, "{}{}\n", result.file, scenario.description.empty() ? "" : " - " + scenario.description);
    fmt::print(out, "  steps\n");
    size_t width = 0;
    for (const StepRecord& step : record.steps) width = std::max(width, std::min<size_t>(step.title.size(), 72));
    for (size_t i = 0; i < record.steps.size(); ++i) {
        const StepRecord& step = record.steps[i];
        std::string outcome = !step.problem.empty() ? "not taken: " + step.problem : step.resultText;
        fmt::print(out, "    {:>2}. {:<{}}  {}\n", i + 1, step.title, width, outcome.empty() ? "done" : "-> " + outcome);
    }
    for (size_t i = 0; i < record.devices.size(); ++i) printDevice(out, record, static_cast<int>(i), options);

    std::vector<std::string> log;
    for (const LogRecord& entry : record.eventLog) {
        std::string who = entry.owner.device >= 0 ? record.devices[static_cast<size_t>(entry.owner.device)].name + ": " : "";
        log.push_back(fmt::format("{}{}{}", who, entry.entry.location, entry.entry.message));
    }
    printLines(out, "event log", log, "empty");
    printLines(out, "debug output", record.debugLines, "none");
    std::vector<std::string> findings;
    for (const Finding& finding : record.findings) {
        bool named = finding.device.empty() || finding.text.rfind(finding.device + " ", 0) == 0;
        findings.push_back(named ? finding.text : finding.device + ": " + finding.text);
    }
    printLines(out, "lab found", findings, "nothing the module could not see");
    if (!record.createdKeys.empty()) printLines(out, "keys created", record.createdKeys, "");
    printLines(out, "left behind", record.leftovers, "nothing");

    const ExpectationOutcome& expectations = result.expectations;
    if (expectations.failures.empty()) {
        fmt::print(out, "PASS  {} ({} expectation(s) met)\n", result.file, expectations.checked);
        return;
    }
    fmt::print(out, "FAIL  {}: {} of {} expectation(s) not met\n", result.file, expectations.failures.size(),
               expectations.checked);
    for (const ExpectationFailure& failure : expectations.failures) fmt::print(out, "  {}: {}\n", failure.place, failure.what);
}

}  // namespace lab
