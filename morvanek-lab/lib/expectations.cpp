#include "expectations.h"

#include <algorithm>
#include <cctype>
#include <fstream>
#include <iterator>

#include <fmt/format.h>

#include "deviceStory.h"

namespace lab {

namespace {

struct Line {
    std::string message;
    std::string location;
    std::string component;
    std::string tag;
    std::string format;
    std::optional<uint32_t> level;
};

bool contains(const std::string& text, const std::optional<std::string>& part)
{
    return !part || text.find(*part) != std::string::npos;
}

bool matches(const LineMatcher& matcher, const Line& line)
{
    return contains(line.message, matcher.message) && contains(line.location, matcher.location) &&
           contains(line.component, matcher.component) && contains(line.tag, matcher.tag) &&
           contains(line.format, matcher.format) && (!matcher.level || matcher.level == line.level);
}

std::string describe(const LineMatcher& matcher)
{
    std::vector<std::string> parts;
    if (matcher.message) parts.push_back(fmt::format("message containing \"{}\"", *matcher.message));
    if (matcher.location) parts.push_back(fmt::format("location containing \"{}\"", *matcher.location));
    if (matcher.component) parts.push_back(fmt::format("component containing \"{}\"", *matcher.component));
    if (matcher.tag) parts.push_back(fmt::format("tag containing \"{}\"", *matcher.tag));
    if (matcher.format) parts.push_back(fmt::format("format containing \"{}\"", *matcher.format));
    if (matcher.level) parts.push_back(fmt::format("level {}", *matcher.level));
    return parts.empty() ? "any line" : fmt::format("a line with {}", fmt::join(parts, " and "));
}

std::string quoteLines(const std::vector<Line>& lines)
{
    if (lines.empty()) return "no lines at all";
    std::vector<std::string> quoted;
    for (const Line& line : lines) {
        std::string message = line.message;
        while (!message.empty() && message.back() == '\n') message.pop_back();
        quoted.push_back("\"" + message + "\"");
    }
    return fmt::format("{} line(s): {}", lines.size(), fmt::join(quoted, ", "));
}

std::string quoteTexts(const std::vector<std::string>& texts)
{
    if (texts.empty()) return "nothing";
    return fmt::format("[{}]", fmt::join(texts, ", "));
}

class Checker {
public:
    Checker(const Scenario& scenario, const RunRecord& record, const World& world)
        : scenario_(scenario), record_(record), world_(world)
    {
    }

    ExpectationOutcome run()
    {
        for (size_t i = 0; i < record_.steps.size(); ++i) checkStep(record_.steps[i]);
        const Expectations& expect = scenario_.expect;
        if (expect.eventLog) checkLines(*expect.eventLog, eventLogLines(), "event log");
        if (expect.debugLines) checkLines(*expect.debugLines, plainLines(record_.debugLines), "debug output");
        if (expect.findings) {
            std::vector<std::string> texts;
            for (const Finding& finding : record_.findings)
                texts.push_back(finding.device.empty() ? finding.text : finding.device + ": " + finding.text);
            checkLines(*expect.findings, plainLines(texts), "lab's findings");
        }
        for (const DeviceExpectation& device : expect.devices) checkDevice(device);
        if (expect.nothingLeft) checkNothingLeft(*expect.nothingLeft);
        if (expect.createdKeys) checkCreatedKeys(*expect.createdKeys);
        return std::move(outcome_);
    }

private:
    void expectThat(bool holds, const std::string& place, const std::string& what)
    {
        ++outcome_.checked;
        if (!holds) outcome_.failures.push_back({place, what});
    }

    // For messages that quote a whole trace: made only when they are shown.
    template <typename Message>
    void expectThatLazily(bool holds, const std::string& place, const Message& what)
    {
        ++outcome_.checked;
        if (!holds) outcome_.failures.push_back({place, what()});
    }

    void checkStep(const StepRecord& step)
    {
        const StepPlan& plan = step.plan;
        std::string place = plan.pointer + "/expect";
        if (!step.problem.empty()) {
            expectThat(false, plan.pointer, "the step could not be taken: " + step.problem);
            return;
        }
        bool isNtStatus = plan.kind == StepKind::load || plan.kind == StepKind::unload;
        bool isVersion = plan.kind == StepKind::getCurrentVersion || plan.kind == StepKind::getOldestCompatibleVersion;
        if (plan.expectResult) {
            auto show = [&](int64_t value) {
                if (isNtStatus) return fmt::format("0x{:08X}", static_cast<uint32_t>(value));
                if (isVersion) return fmt::format("0x{:08X}", static_cast<uint32_t>(value));
                return std::to_string(value);
            };
            bool same = step.result && (isNtStatus || isVersion ? static_cast<uint32_t>(*step.result) ==
                                                                      static_cast<uint32_t>(*plan.expectResult)
                                                                : *step.result == *plan.expectResult);
            expectThat(same, place + "/result",
                       fmt::format("{} should return {}, returned {}", step.title, show(*plan.expectResult),
                                   step.result ? show(*step.result) : "nothing"));
        }
        if (plan.expectStatus) {
            expectThat(step.status == plan.expectStatus, place + "/status",
                       fmt::format("{} should leave status {}, left {}", step.title, *plan.expectStatus,
                                   step.status ? std::to_string(*step.status) : "none"));
        }
        if (plan.expectGuid) {
            auto upper = [](std::string text) {
                for (char& c : text) c = static_cast<char>(std::toupper(static_cast<unsigned char>(c)));
                return text;
            };
            expectThat(step.guid && upper(*step.guid) == upper(*plan.expectGuid), place + "/guid",
                       fmt::format("{} should return the GUID {}, returned {}", step.title, *plan.expectGuid,
                                   step.guid.value_or("nothing")));
        }
    }

    std::vector<Line> eventLogLines() const
    {
        std::vector<Line> lines;
        for (const LogRecord& entry : record_.eventLog) {
            lines.push_back({entry.entry.message, entry.entry.location, entry.entry.component, entry.entry.tag,
                             entry.entry.format, entry.entry.level});
        }
        return lines;
    }

    static std::vector<Line> plainLines(const std::vector<std::string>& texts)
    {
        std::vector<Line> lines;
        for (const std::string& text : texts) lines.push_back({text, "", "", "", "", std::nullopt});
        return lines;
    }

    void checkLines(const LinesExpectation& expect, const std::vector<Line>& lines, const std::string& what)
    {
        if (expect.count) {
            expectThat(lines.size() == *expect.count, expect.pointer + "/count",
                       fmt::format("the {} should have {} line(s); it has {}", what, *expect.count, quoteLines(lines)));
        }
        for (size_t i = 0; i < expect.contains.size(); ++i) {
            const LineMatcher& matcher = expect.contains[i];
            bool found = std::any_of(lines.begin(), lines.end(), [&](const Line& line) { return matches(matcher, line); });
            expectThat(found, fmt::format("{}/contains/{}", expect.pointer, i),
                       fmt::format("the {} should hold {}; it has {}", what, describe(matcher), quoteLines(lines)));
        }
        for (size_t i = 0; i < expect.absent.size(); ++i) {
            const LineMatcher& matcher = expect.absent[i];
            auto found = std::find_if(lines.begin(), lines.end(), [&](const Line& line) { return matches(matcher, line); });
            expectThat(found == lines.end(), fmt::format("{}/absent/{}", expect.pointer, i),
                       fmt::format("the {} should not hold {}; it does: \"{}\"", what, describe(matcher),
                                   found == lines.end() ? "" : found->message));
        }
        if (expect.exactly) {
            const auto& wanted = *expect.exactly;
            size_t agree = 0;
            while (agree < std::min(wanted.size(), lines.size()) && matches(wanted[agree], lines[agree])) ++agree;
            bool same = wanted.size() == lines.size() && agree == wanted.size();
            std::string detail = agree < std::min(wanted.size(), lines.size())
                                     ? fmt::format("line {} should be {}", agree + 1, describe(wanted[agree]))
                                     : fmt::format("{} line(s) were expected", wanted.size());
            expectThat(same, expect.pointer + "/exactly",
                       fmt::format("the {} is not as expected: {}; it has {}", what, detail, quoteLines(lines)));
        }
    }

    const DeviceRecord* findDevice(const std::string& name, int& index) const
    {
        for (size_t i = 0; i < record_.devices.size(); ++i) {
            if (record_.devices[i].name == name) {
                index = static_cast<int>(i);
                return &record_.devices[i];
            }
        }
        return nullptr;
    }

    void checkDevice(const DeviceExpectation& expect)
    {
        int index = -1;
        const DeviceRecord* found = findDevice(expect.device, index);
        if (found == nullptr) return;
        const DeviceRecord& device = *found;
        const std::string& at = expect.pointer;
        std::string who = device.name;
        if (expect.mode) {
            std::string seen = device.mode;
            if (device.mode != "unplugged")
                seen += fmt::format(" (enumerated as {:04X}:{:04X})", device.enumeratedVendorId, device.enumeratedProductId);
            expectThat(device.mode == *expect.mode, at + "/mode",
                       fmt::format("{} should end in {} mode; it is in {}", who, *expect.mode, seen));
        }
        if (expect.enumeratesAs) {
            expectThat(device.mode != "unplugged" && device.enumeratedProductId == *expect.enumeratesAs,
                       at + "/enumeratesAs",
                       device.mode == "unplugged"
                           ? fmt::format("{} should enumerate as product ID {:04X}; it is unplugged", who, *expect.enumeratesAs)
                           : fmt::format("{} should enumerate as product ID {:04X}; it enumerates as {:04X}:{:04X} ({} mode)",
                                         who, *expect.enumeratesAs, device.enumeratedVendorId,
                                         device.enumeratedProductId, device.mode));
        }
        if (expect.identity) checkIdentity(*expect.identity, device, at + "/identity");
        if (expect.markerInPlace) {
            expectThat(device.markerInPlace == *expect.markerInPlace, at + "/markerInPlace",
                       fmt::format("{}'s completion marker should {}be in place; it is{}", who,
                                   *expect.markerInPlace ? "" : "not ", device.markerInPlace ? "" : " not"));
        }
        if (expect.programmedWith) checkProgrammedWith(*expect.programmedWith, device, at + "/programmedWith");
        for (const MemoryExpectation& memory : expect.memory) {
            std::vector<uint8_t> seen(device.flashAfter.begin() + memory.address,
                                      device.flashAfter.begin() + memory.address + memory.bytes.size());
            expectThat(seen == memory.bytes, memory.pointer,
                       fmt::format("{}'s memory at 0x{:04X} should hold {}; it holds {}", who, memory.address,
                                   hexBytesText(memory.bytes), hexBytesText(seen)));
        }
        if (expect.requests) checkRequests(*expect.requests, device);
        if (expect.findings) {
            std::vector<std::string> texts;
            for (const Finding& finding : record_.findings) {
                if (finding.device == device.name) texts.push_back(finding.text);
            }
            checkLines(*expect.findings, plainLines(texts), "lab's findings about " + who);
        }
    }

    void checkIdentity(const IdentityExpectation& expect, const DeviceRecord& device, const std::string& at)
    {
        std::optional<sim::IdentityValues> identity = identityIn(device, device.flashAfter);
        if (!identity) {
            expectThat(false, at, device.name + " has no identity block: it is not a loader of the family");
            return;
        }
        auto check = [&](const char* field, auto wanted, auto seen, int digits) {
            if (!wanted) return;
            expectThat(*wanted == seen, at + "/" + field,
                       fmt::format("{}'s identity block should hold {} {:0{}X}; it holds {:0{}X}", device.name, field,
                                   *wanted, digits, seen, digits));
        };
        check("vendorId", expect.vendorId, identity->vendorId, 4);
        check("productId", expect.productId, identity->productId, 4);
        check("serialNumber", expect.serialNumber, identity->serialNumber, 8);
        check("productIdCopy", expect.productIdCopy, identity->productIdCopy, 4);
        check("altProductId", expect.altProductId, identity->altProductId, 4);
    }

    void checkProgrammedWith(const std::string& dosPath, const DeviceRecord& device, const std::string& at)
    {
        std::optional<std::filesystem::path> path = world_.hostPath(dosPath);
        if (!path || device.layout == nullptr) {
            expectThat(false, at, fmt::format("{} is not a file of this world's drives", dosPath));
            return;
        }
        std::ifstream in(*path, std::ios::binary);
        std::vector<uint8_t> image((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
        // The loader puts its completion marker over the image's bytes 6 and 7.
        for (size_t i = 6; i < 8 && i < image.size(); ++i) image[i] = i == 6 ? 0xAA : 0x55;
        size_t base = device.layout->firmwareBase;
        size_t length = std::min(image.size(), device.flashAfter.size() - base);
        size_t difference = 0;
        while (difference < length && device.flashAfter[base + difference] == image[difference]) ++difference;
        expectThat(difference == image.size(), at,
                   difference == image.size()
                       ? ""
                       : fmt::format("{}'s firmware area should hold {} ({} bytes) with the completion marker; it "
                                     "differs first at 0x{:04X} (flash 0x{:02X}, image 0x{:02X})",
                                     device.name, dosPath, image.size(), base + difference,
                                     device.flashAfter[base + difference], image[difference]));
    }

    // Lower case, single spaces: how request texts compare.
    static std::string normalised(const std::string& text)
    {
        std::string out;
        bool space = false;
        for (char c : text) {
            if (std::isspace(static_cast<unsigned char>(c)) != 0) {
                space = !out.empty();
                continue;
            }
            if (space) out += ' ';
            space = false;
            out += static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
        }
        return out;
    }

    // Request texts are made only for the requests an expectation looks at,
    // and the whole trace is quoted only when an expectation fails.
    void checkRequests(const RequestsExpectation& expect, const DeviceRecord& device)
    {
        const std::vector<sim::RequestRecord>& trace = device.trace;
        size_t reads = 0, writes = 0, erases = 0, restarts = 0, failed = 0;
        for (const sim::RequestRecord& request : trace) {
            reads += request.kind == sim::RequestKind::Read;
            writes += request.kind == sim::RequestKind::Write;
            erases += request.kind == sim::RequestKind::Erase;
            restarts += request.kind == sim::RequestKind::Restart;
            failed += request.outcome < 0;
        }
        for (const RequestCountExpectation& count : expect.counts) {
            size_t value = count.what == "total"   ? trace.size()
                           : count.what == "read"  ? reads
                           : count.what == "write" ? writes
                           : count.what == "erase" ? erases
                           : count.what == "restart" ? restarts
                                                     : failed;
            std::string kind = count.what == "total" ? "" : count.what == "failed" ? " failed" : " " + count.what;
            expectThat(value == count.count, expect.pointer + "/" + count.what,
                       fmt::format("{} should have received {}{} request(s); it received {}", device.name, count.count,
                                   kind, value));
        }
        auto texts = [&](size_t from, size_t to) {
            std::vector<std::string> out;
            for (size_t i = from; i < to && i < trace.size(); ++i) out.push_back(requestText(trace[i]));
            return out;
        };
        // requestText is already single-spaced; only its case differs from the normalised form.
        auto same = [&](const std::vector<std::string>& wanted, size_t from) {
            for (size_t i = 0; i < wanted.size(); ++i) {
                if (normalised(requestText(trace[from + i])) != normalised(wanted[i])) return false;
            }
            return true;
        };
        if (expect.sequence) {
            bool holds = expect.sequence->size() == trace.size() && same(*expect.sequence, 0);
            expectThatLazily(holds, expect.pointer + "/sequence", [&] {
                return fmt::format("{}'s requests should be {}; they were {}", device.name,
                                   quoteTexts(*expect.sequence), quoteTexts(texts(0, trace.size())));
            });
        }
        if (expect.startsWith) {
            size_t n = expect.startsWith->size();
            bool holds = n <= trace.size() && same(*expect.startsWith, 0);
            expectThatLazily(holds, expect.pointer + "/startsWith", [&] {
                return fmt::format("{}'s requests should start {}; they start {}", device.name,
                                   quoteTexts(*expect.startsWith), quoteTexts(texts(0, n)));
            });
        }
        if (expect.endsWith) {
            size_t n = expect.endsWith->size();
            bool holds = n <= trace.size() && same(*expect.endsWith, trace.size() - n);
            expectThatLazily(holds, expect.pointer + "/endsWith", [&] {
                return fmt::format("{}'s requests should end {}; they end {}", device.name,
                                   quoteTexts(*expect.endsWith), quoteTexts(texts(trace.size() - std::min(n, trace.size()), trace.size())));
            });
        }
        if (expect.contains.empty() && expect.absent.empty()) return;
        std::vector<std::string> seenNormalised;
        for (const sim::RequestRecord& request : trace) seenNormalised.push_back(normalised(requestText(request)));
        auto received = [&](const std::string& wanted) {
            return std::find(seenNormalised.begin(), seenNormalised.end(), normalised(wanted)) != seenNormalised.end();
        };
        for (size_t i = 0; i < expect.contains.size(); ++i) {
            expectThatLazily(received(expect.contains[i]), fmt::format("{}/contains/{}", expect.pointer, i), [&] {
                return fmt::format("{} should have received \"{}\"; it received {}", device.name, expect.contains[i],
                                   quoteTexts(texts(0, trace.size())));
            });
        }
        for (size_t i = 0; i < expect.absent.size(); ++i) {
            expectThat(!received(expect.absent[i]), fmt::format("{}/absent/{}", expect.pointer, i),
                       fmt::format("{} should not have received \"{}\", but did", device.name, expect.absent[i]));
        }
    }

    void checkNothingLeft(bool wanted)
    {
        bool nothing = record_.leftovers.empty();
        expectThat(nothing == wanted, "/expect/nothingLeft",
                   wanted ? fmt::format("nothing should be left allocated or open; left: {}", quoteTexts(record_.leftovers))
                          : "something should be left allocated or open; nothing was");
    }

    void checkCreatedKeys(const std::vector<std::string>& wanted)
    {
        auto folded = [](std::vector<std::string> keys) {
            for (std::string& key : keys) {
                for (char& c : key) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
            }
            return keys;
        };
        expectThat(folded(wanted) == folded(record_.createdKeys), "/expect/createdKeys",
                   fmt::format("the module should have created the keys {}; it created {}", quoteTexts(wanted),
                               quoteTexts(record_.createdKeys)));
    }

    const Scenario& scenario_;
    const RunRecord& record_;
    const World& world_;
    ExpectationOutcome outcome_;
};

}  // namespace

ExpectationOutcome checkExpectations(const Scenario& scenario, const RunRecord& record, const World& world)
{
    ExpectationOutcome outcome = Checker(scenario, record, world).run();
    // Misuse of the host's or kernel's interfaces is always wrong, whatever the scenario expects.
    for (const std::string& misuse : record.misuse)
        outcome.failures.push_back({"(always checked)", "the module misused the host or kernel: " + misuse});
    return outcome;
}

}  // namespace lab
