#include "runInvariants.h"

#include <algorithm>
#include <cstdlib>

#include <fmt/format.h>

#include "deviceStory.h"

namespace lab {

namespace {

constexpr uint16_t kIdentityBlockOffset = 0x1F0;
constexpr uint16_t kIdentityBlockSize = 16;
constexpr uint16_t kMarkerOffset = 6;
constexpr uint32_t kPageSize = 512;
constexpr uint32_t kMemorySize = 0x10000;

// One update of one device: its requests, its event-log lines, the image it
// opened last (the one it programs from).
struct UpdateView {
    int index = 0;
    std::vector<size_t> requests;  // into the device's trace
    std::vector<const LogRecord*> lines;
    const FileOpenSeen* image = nullptr;
};

std::vector<UpdateView> viewUpdates(const RunRecord& record, int device)
{
    const DeviceRecord& entry = record.devices[static_cast<size_t>(device)];
    std::vector<UpdateView> views(static_cast<size_t>(std::max(entry.updates, entry.trace.empty() ? 0 : 1)));
    for (size_t u = 0; u < views.size(); ++u) views[u].index = static_cast<int>(u);
    if (views.empty()) return views;
    auto viewOf = [&](int update) -> UpdateView& {
        return views[std::min(static_cast<size_t>(std::max(update, 0)), views.size() - 1)];
    };
    for (size_t r = 0; r < entry.trace.size(); ++r) viewOf(r < entry.updateOf.size() ? entry.updateOf[r] : 0).requests.push_back(r);
    for (const LogRecord& line : record.eventLog) {
        if (line.owner.device == device) viewOf(line.owner.update).lines.push_back(&line);
    }
    for (const FileOpenSeen& open : record.fileOpens) {
        if (open.owner.device == device && open.open.status >= 0) viewOf(open.owner.update).image = &open;
    }
    return views;
}

class UpdateCheck {
public:
    UpdateCheck(const DeviceRecord& device, const UpdateView& view, std::vector<InvariantViolation>& out)
        : device_(device), layout_(*device.layout), view_(view), out_(out), written_(kMemorySize, 0),
          state_(kMemorySize, kUnwritten)
    {
    }

    void run()
    {
        for (size_t index : view_.requests) {
            const sim::RequestRecord& request = device_.trace[index];
            if (firstFailure_ != nullptr) {
                add("request after a failure", fmt::format("{} was sent after request #{} failed", describe(request),
                                                           firstFailure_->sequence));
                break;
            }
            take(request);
            if (request.outcome < 0) {
                firstFailure_ = &request;
                failedBeforeProgramming_ = !programming_;
            }
        }
        checkEnding();
    }

private:
    void add(const char* rule, const std::string& what)
    {
        out_.push_back({rule, device_.name, fmt::format("update {}: {}", view_.index + 1, what)});
    }

    static std::string describe(const sim::RequestRecord& request)
    {
        return fmt::format("request #{} ({})", request.sequence, requestText(request));
    }

    uint32_t identityBlock() const { return static_cast<uint32_t>(layout_.identityPage) + kIdentityBlockOffset; }

    void take(const sim::RequestRecord& request)
    {
        switch (request.kind) {
        case sim::RequestKind::Erase:
            programming_ = true;
            erase(request);
            break;
        case sim::RequestKind::Write:
            write(request);
            break;
        case sim::RequestKind::Read:
            if (programming_ && request.outcome >= 0) readBack(request);
            break;
        case sim::RequestKind::Restart:
            if (!markerWritten_)
                add("restart before the marker",
                    describe(request) + " restarts the device although no completion marker was written");
            if (request.outcome >= 0) restarted_ = true;
            break;
        case sim::RequestKind::Unknown:
            break;
        }
    }

    void erase(const sim::RequestRecord& request)
    {
        uint32_t page = request.wValue;
        uint32_t first = layout_.firmwareBase / kPageSize;
        uint32_t end = layout_.identityPage / kPageSize;
        if (page == end) {
            add("identity page", describe(request) + " erases the identity page");
            return;
        }
        if (page < first || page >= end) {
            add("flash outside the firmware area",
                fmt::format("{} erases page {}, outside the firmware area (pages {} to {})", describe(request), page,
                            first, end - 1));
            return;
        }
        std::fill(state_.begin() + page * kPageSize, state_.begin() + (page + 1) * kPageSize, kUnwritten);
    }

    void write(const sim::RequestRecord& request)
    {
        uint32_t start = request.wIndex;
        uint32_t end = start + request.length;
        if (!programming_) {
            // Before the first erase only the identity repair writes, and only into the block.
            if (start < identityBlock() || end > identityBlock() + kIdentityBlockSize)
                add("identity page", fmt::format("{} writes outside the identity block before programming began",
                                                 describe(request)));
            return;
        }
        if (start == static_cast<uint32_t>(layout_.firmwareBase + kMarkerOffset) && request.length == 2) {
            markerWritten_ = true;
            checkMarker(request);
            return;
        }
        if (start < layout_.firmwareBase || end > layout_.identityPage) {
            add(end > layout_.identityPage && start < layout_.identityPage + kPageSize ? "identity page"
                                                                                       : "flash outside the firmware area",
                fmt::format("{} writes outside the firmware area 0x{:04X} to 0x{:04X}", describe(request),
                            layout_.firmwareBase, layout_.identityPage - 1));
            return;
        }
        if (request.data.size() != request.length) return;  // refused before the data stage
        std::copy(request.data.begin(), request.data.end(), written_.begin() + start);
        std::fill(state_.begin() + start, state_.begin() + end, kWritten);
    }

    void readBack(const sim::RequestRecord& request)
    {
        for (size_t i = 0; i < request.data.size(); ++i) {
            uint16_t address = static_cast<uint16_t>(request.wIndex + i);
            if (state_[address] == kUnwritten) continue;
            bool equal = request.data[i] == written_[address];
            state_[address] = equal ? kVerified : kWritten;
            if (!equal) readBackDiffered_ = true;
        }
        // What a short data stage left out was not read back either.
        if (request.data.size() < request.length) readBackDiffered_ = true;
    }

    // The marker says "this image is complete and verified": every byte of the
    // image must have been programmed as the file holds it and read back equal.
    void checkMarker(const sim::RequestRecord& request)
    {
        if (view_.image == nullptr) {
            add("marker before verification", describe(request) + " writes the completion marker, but the update "
                                                                  "opened no image");
            return;
        }
        const std::vector<uint8_t>& image = view_.image->open.bytes;
        for (size_t i = 0; i < image.size(); ++i) {
            uint16_t address = static_cast<uint16_t>(layout_.firmwareBase + i);
            if (state_[address] == kUnwritten) {
                add("marker before verification",
                    fmt::format("{} writes the completion marker, but image byte {} (0x{:04X}) was never programmed",
                                describe(request), i, address));
                return;
            }
            if (written_[address] != image[i]) {
                add("image not programmed as read",
                    fmt::format("{} writes the completion marker, but image byte {} went to 0x{:04X} as 0x{:02X} where "
                                "the file holds 0x{:02X}",
                                describe(request), i, address, written_[address], image[i]));
                return;
            }
            if (state_[address] != kVerified) {
                add("marker before verification",
                    fmt::format("{} writes the completion marker before block {} was read back equal (0x{:04X})",
                                describe(request), i / kPageSize, address));
                return;
            }
        }
    }

    void checkEnding()
    {
        std::vector<int> lines;
        for (const LogRecord* line : view_.lines) lines.push_back(logLineNumber(line->entry.location));
        std::string listed = lines.empty() ? std::string("none") : fmt::format("{}", fmt::join(lines, ", "));
        if (restarted_) {
            if (!lines.empty())
                add("success with a message", "the update restarted the device and still logged line(s) " + listed);
            return;
        }
        if (view_.requests.empty()) return;

        bool verification = lines.size() == 2 && (lines[0] == 421 || lines[0] == 436);
        bool with451 = !lines.empty() && lines.back() == 451 && (lines.size() == 1 || verification);
        bool alone = lines.size() == 1 && (lines[0] == 355 || lines[0] == 385);
        if (!lines.empty() && !with451 && !alone) {
            add("failure message", "the update failed and logged lines " + listed);
            return;
        }
        if (firstFailure_ != nullptr && failedBeforeProgramming_ && !lines.empty()) {
            add("failure message", fmt::format("{} failed before programming began, which ends the update without a "
                                               "message, but it logged line(s) {}",
                                               describe(*firstFailure_), listed));
        }
        if (programming_ && !with451) {
            add("failure message",
                "programming began and did not end in a restart, but line 451 was not logged (logged: " + listed + ")");
        }
        if (with451 && firstFailure_ != nullptr && !failedBeforeProgramming_) {
            std::optional<int32_t> status = loggedStatus(view_.lines.back()->entry.message);
            if (status != firstFailure_->outcome)
                add("failure message",
                    fmt::format("line 451 reports status {}, but the first failure was {} with {}",
                                status ? std::to_string(*status) : std::string("none"), describe(*firstFailure_),
                                firstFailure_->outcome));
        }
        if (verification && !readBackDiffered_)
            add("failure message", fmt::format("line {} reports a verification failure, but every block read back in full "
                                               "as written",
                                               lines[0]));
    }

    const DeviceRecord& device_;
    const sim::LoaderFlashLayout& layout_;
    const UpdateView& view_;
    std::vector<InvariantViolation>& out_;
    // Per address: the byte programmed in this update, and whether it was, and was read back equal since.
    enum : uint8_t { kUnwritten, kWritten, kVerified };
    std::vector<uint8_t> written_;
    std::vector<uint8_t> state_;
    const sim::RequestRecord* firstFailure_ = nullptr;
    bool failedBeforeProgramming_ = false;
    bool programming_ = false;  // the first erase was sent
    bool markerWritten_ = false;
    bool restarted_ = false;
    bool readBackDiffered_ = false;  // a read-back differed from what was written, or came short
};

// A device that runs its firmware after an update marked it complete holds,
// from the firmware base, that update's image with the marker over bytes 6
// and 7. (A device may also start in firmware it had before the run.)
void checkFirmwareRunning(const DeviceRecord& device, const std::vector<UpdateView>& views,
                          std::vector<InvariantViolation>& out)
{
    if (device.mode != "product") return;
    const UpdateView* programming = nullptr;
    bool marked = false;
    const uint16_t marker = static_cast<uint16_t>(device.layout->firmwareBase + kMarkerOffset);
    for (const UpdateView& view : views) {
        bool erased = false;
        bool wroteMarker = false;
        for (size_t index : view.requests) {
            const sim::RequestRecord& request = device.trace[index];
            if (request.kind == sim::RequestKind::Erase) erased = true;
            if (erased && request.kind == sim::RequestKind::Write && request.wIndex == marker && request.length == 2)
                wroteMarker = true;
        }
        if (!erased) continue;
        programming = &view;
        marked = wroteMarker;
    }
    if (programming == nullptr || !marked || programming->image == nullptr) return;
    std::vector<uint8_t> expected = programming->image->open.bytes;
    if (expected.size() > kMarkerOffset + 1) {
        expected[kMarkerOffset] = 0xAA;
        expected[kMarkerOffset + 1] = 0x55;
    }
    for (size_t i = 0; i < expected.size(); ++i) {
        uint16_t address = static_cast<uint16_t>(device.layout->firmwareBase + i);
        if (device.flashAfter[address] == expected[i]) continue;
        out.push_back({"firmware not as programmed", device.name,
                       fmt::format("it runs its firmware, but 0x{:04X} holds 0x{:02X} where the image of update {} "
                                   "(with the marker) has 0x{:02X}",
                                   address, device.flashAfter[address], programming->index + 1, expected[i])});
        return;
    }
}

}  // namespace

int logLineNumber(const std::string& location)
{
    size_t colon = location.rfind(':');
    if (colon == std::string::npos) return 0;
    return std::atoi(location.c_str() + colon + 1);
}

std::optional<int32_t> loggedStatus(const std::string& message)
{
    const std::string label = "Status = ";
    size_t at = message.rfind(label);
    if (at == std::string::npos) return std::nullopt;
    char* end = nullptr;
    long value = std::strtol(message.c_str() + at + label.size(), &end, 10);
    if (end == message.c_str() + at + label.size()) return std::nullopt;
    return static_cast<int32_t>(value);
}

std::vector<InvariantViolation> checkRunInvariants(const RunRecord& record, bool moduleUnloaded)
{
    std::vector<InvariantViolation> out;
    for (size_t d = 0; d < record.devices.size(); ++d) {
        const DeviceRecord& device = record.devices[d];
        if (device.layout == nullptr) continue;
        std::vector<UpdateView> views = viewUpdates(record, static_cast<int>(d));
        for (const UpdateView& view : views) UpdateCheck(device, view, out).run();
        checkFirmwareRunning(device, views, out);
    }
    for (const std::string& misuse : record.misuse) out.push_back({"misuse", "", misuse});
    if (moduleUnloaded) {
        for (const std::string& leftover : record.leftovers) out.push_back({"left behind", "", leftover});
    }
    return out;
}

std::vector<InvariantViolation> checkResultInvariants(const ScenarioResult& result)
{
    if (!result.labError.empty()) return {{"lab error", "", result.labError}};
    if (!result.invalid.empty()) return {{"scenario refused", "", result.invalid}};
    bool unloaded = result.scenario && !result.scenario->steps.empty() &&
                    result.scenario->steps.back().kind == StepKind::unload;
    return checkRunInvariants(result.record, unloaded);
}

}  // namespace lab
