#include "reporter.h"

#include <chrono>
#include <cstdio>

#include <fmt/format.h>
#include <nlohmann/json.hpp>

namespace usbapp {

namespace {

using Kind = usbhost::HostEvent::Kind;

std::string oneLine(std::string text)
{
    while (!text.empty() && (text.back() == '\n' || text.back() == '\r')) text.pop_back();
    for (char& c : text) {
        if (c == '\n' || c == '\r') c = ' ';
    }
    return text;
}

std::string deviceName(const usbhost::DeviceInfo& device)
{
    return fmt::format("{} {:04X}:{:04X}", device.busPath, device.vendorId, device.productId);
}

nlohmann::json deviceJson(const usbhost::DeviceInfo& device)
{
    return {{"busPath", device.busPath},
            {"vendorId", fmt::format("{:04X}", device.vendorId)},
            {"productId", fmt::format("{:04X}", device.productId)},
            {"serial", device.serial}};
}

const char* kindName(Kind kind)
{
    switch (kind) {
    case Kind::arrived:
        return "arrived";
    case Kind::left:
        return "left";
    case Kind::skipped:
        return "skipped";
    case Kind::progress:
        return "progress";
    case Kind::update:
        return "update";
    case Kind::log:
        return "log";
    case Kind::debug:
        return "debug";
    case Kind::problem:
        return "problem";
    case Kind::misuse:
        return "misuse";
    }
    return "?";
}

std::string updateText(const usbhost::UpdateRecord& update)
{
    switch (update.outcome) {
    case usbhost::Outcome::updated:
        return fmt::format("updated: {} page(s) erased, {} block(s) written and verified, restarted ({:.2f} s)",
                           update.pagesErased, update.blocksWritten, update.seconds);
    case usbhost::Outcome::failed:
        return fmt::format("update failed after {} request(s); the device stays in loader mode{}", update.requests,
                           update.firstFailure < 0 ? "; first failure: " + statusText(update.firstFailure) : "");
    case usbhost::Outcome::abandoned:
        return fmt::format("update abandoned after {} request(s); the device stays in loader mode", update.requests);
    case usbhost::Outcome::ignored:
        return "not a loader-mode device; the loader left it alone";
    }
    return "";
}

}  // namespace

std::string statusText(int32_t status)
{
    switch (status) {
    case usbhost::kStalled:
        return fmt::format("{} (the device refused a request)", status);
    case usbhost::kDeviceGone:
        return fmt::format("{} (the device left the bus)", status);
    case usbhost::kTimedOut:
        return fmt::format("{} (the device did not answer in time)", status);
    case usbhost::kTransferFailed:
        return fmt::format("{} (USB transfer error)", status);
    case usbhost::kShortTransfer:
        return fmt::format("{} (the device sent fewer bytes than asked)", status);
    case usbhost::kAccessDenied:
        return fmt::format("{} (no access to the device node)", status);
    case usbhost::kOutOfMemory:
        return fmt::format("{} (out of memory)", status);
    case usbhost::kBadArgument:
        return fmt::format("{} (misuse of the host's interfaces)", status);
    case usbhost::kAbandoned:
        return fmt::format("{} (abandoned: the program is stopping)", status);
    default:
        return std::to_string(status);
    }
}

Reporter::Reporter(bool json, bool progress) : json_(json), progress_(progress && !json) {}

void Reporter::line(const std::string& text)
{
    clearProgress();
    if (json_) {
        std::fputs(text.c_str(), stdout);
        std::fputc('\n', stdout);
        std::fflush(stdout);
    } else {
        std::fprintf(stderr, "morvanek-usb: %s\n", text.c_str());
    }
    drawProgress();
}

void Reporter::clearProgress()
{
    if (!progressShown_) return;
    std::fputs("\r\033[K", stderr);
    progressShown_ = false;
}

void Reporter::drawProgress()
{
    if (!progress_ || progressByDevice_.empty()) return;
    std::string text;
    for (const auto& entry : progressByDevice_) text += (text.empty() ? "" : "  ") + entry.first + " " + entry.second;
    std::fprintf(stderr, "\r\033[K%s", text.c_str());
    std::fflush(stderr);
    progressShown_ = true;
}

void Reporter::event(const usbhost::HostEvent& event)
{
    std::lock_guard<std::mutex> lock(mutex_);
    const std::string who = event.hasDevice ? deviceName(event.device) : std::string();
    if (event.kind == Kind::progress) {
        if (!progress_) return;
        const usbhost::UpdateRecord& counts = event.update;
        progressByDevice_[event.device.busPath] =
            counts.blocksWritten == 0 ? fmt::format("erasing {}", counts.pagesErased)
                                      : fmt::format("block {}/{}", counts.blocksWritten, counts.pagesErased);
        clearProgress();
        drawProgress();
        return;
    }
    if (event.kind == Kind::update) progressByDevice_.erase(event.device.busPath);

    if (json_) {
        nlohmann::json out = {{"event", kindName(event.kind)}};
        if (event.hasDevice) out["device"] = deviceJson(event.device);
        switch (event.kind) {
        case Kind::log:
            out["component"] = event.component;
            out["location"] = event.location;
            out["level"] = event.level;
            out["tag"] = event.tag;
            out["format"] = event.format;
            out["message"] = oneLine(event.text);
            break;
        case Kind::update:
            out["outcome"] = usbhost::outcomeName(event.update.outcome);
            out["firstFailure"] = event.update.firstFailure;
            out["requests"] = event.update.requests;
            out["pagesErased"] = event.update.pagesErased;
            out["blocksWritten"] = event.update.blocksWritten;
            out["seconds"] = event.update.seconds;
            break;
        default:
            out["text"] = oneLine(event.text);
        }
        line(out.dump());
        return;
    }

    std::string prefix = who.empty() ? "" : who + ": ";
    switch (event.kind) {
    case Kind::arrived:
        line(prefix + event.text + (event.device.serial.empty() ? "" : " (serial " + event.device.serial + ")"));
        break;
    case Kind::log:
        line(prefix + "event log: " + event.component + " " + event.location + event.tag + " " + oneLine(event.text));
        break;
    case Kind::debug:
        line(prefix + "debug: " + oneLine(event.text));
        break;
    case Kind::update:
        line(prefix + updateText(event.update));
        break;
    case Kind::misuse:
        line(prefix + "misuse of the host by the module: " + event.text);
        break;
    default:
        line(prefix + event.text);
    }
}

void Reporter::note(const std::string& text)
{
    std::lock_guard<std::mutex> lock(mutex_);
    line(json_ ? nlohmann::json{{"event", "note"}, {"text", text}}.dump() : text);
}

void Reporter::error(const std::string& text)
{
    std::lock_guard<std::mutex> lock(mutex_);
    // Errors always reach a person, also with --json.
    if (json_) line(nlohmann::json{{"event", "error"}, {"text", text}}.dump());
    clearProgress();
    std::fprintf(stderr, "morvanek-usb: error: %s\n", text.c_str());
}

void Reporter::summary(int exitCode, const std::vector<usbhost::UpdateRecord>& updates,
                       const std::vector<usbhost::Comeback>& comebacks, const std::vector<std::string>& leftovers)
{
    std::lock_guard<std::mutex> lock(mutex_);
    size_t updated = 0, failed = 0;
    for (const auto& update : updates) {
        if (update.outcome == usbhost::Outcome::updated) ++updated;
        if (update.outcome == usbhost::Outcome::failed || update.outcome == usbhost::Outcome::abandoned) ++failed;
    }
    size_t backInLoader = 0;
    for (const auto& comeback : comebacks) backInLoader += comeback.inLoaderMode ? 1 : 0;
    if (json_) {
        nlohmann::json out = {{"event", "summary"},
                              {"exitCode", exitCode},
                              {"updated", updated},
                              {"failed", failed},
                              {"backInLoaderMode", backInLoader},
                              {"leftovers", leftovers}};
        line(out.dump());
        return;
    }
    line(fmt::format("{} device(s) updated, {} failed{}; exit code {}", updated, failed,
                     backInLoader != 0 ? fmt::format(", {} came back in loader mode", backInLoader) : "", exitCode));
    for (const std::string& item : leftovers) line("left behind: " + item);
}

}  // namespace usbapp
