#include "faultExpectation.h"

#include <fmt/format.h>

namespace lab {

namespace {

std::string linesText(const std::vector<const LogRecord*>& lines)
{
    if (lines.empty()) return "nothing";
    std::vector<std::string> parts;
    for (const LogRecord* line : lines) {
        std::string part = std::to_string(logLineNumber(line->entry.location));
        if (auto status = loggedStatus(line->entry.message)) part += fmt::format(" (status {})", *status);
        parts.push_back(part);
    }
    return fmt::format("line {}", fmt::join(parts, ", "));
}

}  // namespace

std::vector<InvariantViolation> checkFaultExpectation(const RunRecord& record, const FaultExpectation& expected)
{
    std::vector<InvariantViolation> out;
    if (expected.device < 0 || static_cast<size_t>(expected.device) >= record.devices.size()) return out;
    const DeviceRecord& device = record.devices[static_cast<size_t>(expected.device)];
    auto add = [&](const char* rule, const std::string& what) { out.push_back({rule, device.name, what}); };

    bool updatedAgain = device.updates > expected.update + 1;
    bool modeDue = expected.finalMode && (updatedAgain || !expected.finalModeAfterAnotherUpdate);
    if (modeDue && device.mode != *expected.finalMode)
        add("did not recover", fmt::format("it ended in {} mode; without the fault it ends in {} mode", device.mode,
                                           *expected.finalMode));
    if (expected.ending == FaultExpectation::Ending::any) return out;

    bool restarted = false;
    for (size_t r = 0; r < device.trace.size(); ++r) {
        bool inUpdate = r < device.updateOf.size() && device.updateOf[r] == expected.update;
        if (inUpdate && device.trace[r].kind == sim::RequestKind::Restart && device.trace[r].outcome >= 0) restarted = true;
    }
    std::vector<const LogRecord*> lines;
    for (const LogRecord& line : record.eventLog) {
        if (line.owner.device == expected.device && line.owner.update == expected.update) lines.push_back(&line);
    }
    std::string update = fmt::format("update {}", expected.update + 1);
    if (restarted) {
        add("fault not reported", update + " restarted the device as if the fault had not happened");
        return out;
    }
    if (expected.ending == FaultExpectation::Ending::failsSilently) {
        if (!lines.empty())
            add("failure message", fmt::format("{} should have ended without a message at this place; it logged {}",
                                               update, linesText(lines)));
        return out;
    }
    bool lastRight = !lines.empty() && logLineNumber(lines.back()->entry.location) == expected.line;
    bool statusRight = lastRight && (!expected.status || loggedStatus(lines.back()->entry.message) == expected.status);
    bool verificationRight = expected.verificationLine == 0;
    if (expected.verificationLine != 0 && lines.size() == 2) {
        const LogRecord& first = *lines.front();
        verificationRight = logLineNumber(first.entry.location) == expected.verificationLine &&
                            first.entry.message.find(fmt::format("page {}.", expected.verificationBlock)) !=
                                std::string::npos;
    }
    if (!statusRight || !verificationRight) {
        std::string wanted = expected.verificationLine != 0
                                 ? fmt::format("line {} naming page {}, then ", expected.verificationLine,
                                               expected.verificationBlock)
                                 : std::string();
        wanted += fmt::format("line {}", expected.line) +
                  (expected.status ? fmt::format(" with status {}", *expected.status) : std::string());
        add("failure message", fmt::format("{} should have logged {}; it logged {}", update, wanted, linesText(lines)));
    }
    return out;
}

}  // namespace lab
