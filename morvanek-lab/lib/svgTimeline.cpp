#include <algorithm>
#include <array>

#include <fmt/format.h>

#include "deviceStory.h"
#include "pictures.h"
#include "svgCanvas.h"

namespace lab {

namespace {

using std::chrono::microseconds;

constexpr double kWidth = 980;
constexpr double kPlotLeft = 150;
constexpr double kPlotRight = kWidth - 30;
constexpr double kLaneHeight = 13;
constexpr double kLaneStep = 17;
constexpr const char* kFailedColour = "#d62728";
// With more devices than this, each gets one row with its phases in colour
// rather than a lane per phase, so that a long queue stays one screen tall.
constexpr size_t kMostDevicesInFull = 6;

// The lanes drawn, top to bottom, in the order an update goes through them.
constexpr std::array<BusPhase, 6> kLanes = {BusPhase::identity, BusPhase::erase,  BusPhase::program,
                                            BusPhase::verify,   BusPhase::marker, BusPhase::restart};

const char* phaseColour(BusPhase phase)
{
    switch (phase) {
    case BusPhase::identity:
        return "#8e6ac8";
    case BusPhase::erase:
        return "#e39b2d";
    case BusPhase::program:
        return "#2f7ed8";
    case BusPhase::verify:
        return "#33a02c";
    case BusPhase::marker:
        return "#d6336c";
    case BusPhase::restart:
        return "#444444";
    case BusPhase::other:
        break;
    }
    return "#999999";
}

int laneOf(BusPhase phase)
{
    auto at = std::find(kLanes.begin(), kLanes.end(), phase);
    return at == kLanes.end() ? -1 : static_cast<int>(at - kLanes.begin());
}

std::string timeText(microseconds time, microseconds scale)
{
    double ms = static_cast<double>(time.count()) / 1000.0;
    if (scale >= std::chrono::seconds(2)) return fmt::format("{:g} s", ms / 1000.0);
    return fmt::format("{:g} ms", ms);
}

// A round step for about eight ticks: 1, 2 or 5 times a power of ten.
microseconds tickStep(microseconds total)
{
    int64_t wanted = std::max<int64_t>(total.count() / 8, 1);
    int64_t power = 1;
    while (power * 10 <= wanted) power *= 10;
    for (int64_t factor : {1, 2, 5, 10}) {
        if (power * factor >= wanted) return microseconds(power * factor);
    }
    return microseconds(power * 10);
}

// What became of one update, in a few words.
std::string outcomeText(const UpdateStory& story)
{
    std::string what;
    if (story.restarted && story.markerTook) {
        what = fmt::format("programmed {} block(s), all verified, marker written, restarted", story.blocksWritten);
    } else if (!story.logLines.empty()) {
        std::string line = story.logLines.front();
        while (!line.empty() && (line.back() == '\n' || line.back() == '\r')) line.pop_back();
        what = "failed: " + line;
    } else if (story.failedRequests != 0) {
        what = fmt::format("stopped after {} failed request(s), nothing logged", story.failedRequests);
    } else if (story.restarted) {
        what = "restarted, but the marker did not take";
    } else {
        what = "ended without a restart, nothing logged";
    }
    return what;
}

class TimelineDrawing {
public:
    TimelineDrawing(const RunRecord& record, const BusTimeline& timeline) : record_(record), timeline_(timeline) {}

    double x(microseconds time) const
    {
        if (timeline_.total.count() == 0) return kPlotLeft;
        return kPlotLeft + (kPlotRight - kPlotLeft) * static_cast<double>(time.count()) /
                               static_cast<double>(timeline_.total.count());
    }

    void legend(double y)
    {
        double at = kPlotLeft;
        for (BusPhase phase : kLanes) {
            canvas_.rect(at, y - 9, 12, 10, phaseColour(phase));
            canvas_.text(at + 16, y, busPhaseName(phase), {11});
            at += 86;
        }
        canvas_.rect(at, y - 9, 12, 10, kFailedColour);
        canvas_.text(at + 16, y, "failed request", {11});
    }

    void axis(double y)
    {
        microseconds step = tickStep(timeline_.total);
        for (microseconds t{0}; t <= timeline_.total; t += step) {
            canvas_.line(x(t), y, x(t), y + 4, "#888888");
            canvas_.text(x(t), y - 3, timeText(t, timeline_.total), {10, "middle", "#555555"});
        }
        canvas_.line(kPlotLeft, y + 4, kPlotRight, y + 4, "#888888");
    }

    void grid(double top, double bottom)
    {
        microseconds step = tickStep(timeline_.total);
        for (microseconds t{0}; t <= timeline_.total; t += step) canvas_.line(x(t), top, x(t), bottom, "#dddddd", 0.8);
    }

    // One device's band: heading, lanes, its requests, and what each update came to.
    double band(int index, double top)
    {
        const DeviceRecord& device = record_.devices[static_cast<size_t>(index)];
        std::vector<UpdateStory> stories = tellDeviceStory(record_, index);
        microseconds busy{0};
        for (const TimedRequest& request : timeline_.requests) busy += request.device == index ? request.duration : microseconds(0);
        std::string loader = device.layout != nullptr ? fmt::format("loader {:04X}", device.options.loaderProductId)
                                                      : fmt::format("USB {:04X}:{:04X}", device.options.vendorId,
                                                                    device.options.loaderProductId);
        canvas_.text(10, top + 12,
                     fmt::format("{}  ({}, {}): {} request(s), {} on the bus", device.name, loader,
                                 busModelName(device), device.trace.size(), durationText(busy)),
                     {12.5, "start", "#222222", true});
        double lanesTop = top + 30;
        for (size_t lane = 0; lane < kLanes.size(); ++lane) {
            double y = lanesTop + static_cast<double>(lane) * kLaneStep;
            canvas_.rect(kPlotLeft, y, kPlotRight - kPlotLeft, kLaneHeight, "#f5f5f5");
            canvas_.text(kPlotLeft - 8, y + 10, busPhaseName(kLanes[lane]), {10.5, "end", "#444444"});
        }
        double lanesBottom = lanesTop + static_cast<double>(kLanes.size()) * kLaneStep;
        grid(lanesTop, lanesBottom);
        requests(index, device, lanesTop, lanesBottom);
        double y = lanesBottom + 12;
        for (const UpdateStory& story : stories) {
            std::string when = updateSpan(index, story.index);
            bool done = story.restarted && story.markerTook;
            bool identityTook = std::all_of(story.identityWrites.begin(), story.identityWrites.end(),
                                            [](const IdentityWrite& write) { return write.took; });
            std::string text = fmt::format("update {}{}: {}", story.index + 1, when, outcomeText(story));
            if (done && !identityTook) text += "; but the identity repair did not take";
            canvas_.text(kPlotLeft, y, text, {11, "start", !done ? kFailedColour : identityTook ? "#1d6b1a" : "#b35900"});
            y += 15;
        }
        if (stories.empty()) {
            canvas_.text(kPlotLeft, y, "the module made no request to it", {11, "start", "#555555"});
            y += 15;
        }
        return y + 8;
    }

    // One device in one row: its phases in colour, and a square at the end that
    // says how it ended, with every update's outcome in its hover text.
    double row(int index, double top)
    {
        const DeviceRecord& device = record_.devices[static_cast<size_t>(index)];
        std::vector<std::string> outcomes;
        bool ended = true;
        for (const UpdateStory& story : tellDeviceStory(record_, index)) {
            outcomes.push_back(fmt::format("update {}: {}", story.index + 1, outcomeText(story)));
            ended = story.restarted && story.markerTook;
        }
        std::string name = device.name.size() > 22 ? device.name.substr(0, 21) + "..." : device.name;
        canvas_.text(kPlotLeft - 8, top + 10, name, {10.5, "end", "#333333"});
        canvas_.rect(kPlotLeft, top, kPlotRight - kPlotLeft, kLaneHeight, "#f5f5f5");
        grid(top, top + kLaneHeight);
        compact_ = true;
        requests(index, device, top, top + kLaneHeight);
        compact_ = false;
        std::string summary = fmt::format("{}: {}", device.name, outcomes.empty() ? "no request" : fmt::format("{}", fmt::join(outcomes, "; ")));
        canvas_.rect(kPlotRight + 6, top + 2, 9, 9, outcomes.empty() ? "#bbbbbb" : ended ? "#33a02c" : kFailedColour, summary);
        return top + kLaneStep;
    }

    SvgCanvas& canvas() { return canvas_; }

private:
    std::string updateSpan(int device, int update) const
    {
        microseconds from{-1};
        microseconds to{0};
        for (const TimedRequest& request : timeline_.requests) {
            if (request.device != device || request.update != update) continue;
            if (from.count() < 0) from = request.start;
            to = request.start + request.duration;
        }
        if (from.count() < 0) return "";
        return fmt::format(" ({} to {})", durationText(from), durationText(to));
    }

    // Requests of one lane that follow one another on the clock make one bar.
    void requests(int index, const DeviceRecord& device, double lanesTop, double lanesBottom)
    {
        const TimedRequest* first = nullptr;
        const TimedRequest* last = nullptr;
        int lastUpdate = -1;
        auto flush = [&]() {
            if (first == nullptr) return;
            bar(device, *first, *last, lanesTop);
            first = last = nullptr;
        };
        for (const TimedRequest& request : timeline_.requests) {
            if (request.device != index) continue;
            if (request.update != lastUpdate) {
                // Where an update begins: a dashed line and its number, when there are several.
                if (device.updates > 1 && !compact_) {
                    canvas_.line(x(request.start), lanesTop - 3, x(request.start), lanesBottom, "#777777", 1, true);
                    canvas_.text(x(request.start) + 3, lanesTop - 3, fmt::format("update {}", request.update + 1),
                                 {9.5, "start", "#555555"});
                }
                lastUpdate = request.update;
            }
            bool joins = first != nullptr && request.phase == last->phase && request.failed == last->failed &&
                         request.update == last->update && request.start == last->start + last->duration &&
                         request.traceIndex == last->traceIndex + 1;
            if (!joins) flush();
            if (first == nullptr) first = &request;
            last = &request;
            if (request.failed) {
                canvas_.line(x(request.start), lanesTop - 2, x(request.start), lanesBottom, kFailedColour, 1.5);
            }
        }
        flush();
    }

    void bar(const DeviceRecord& device, const TimedRequest& first, const TimedRequest& last, double lanesTop)
    {
        int lane = laneOf(first.phase);
        if (lane < 0) lane = static_cast<int>(kLanes.size()) - 1;
        double left = x(first.start);
        double right = x(last.start + last.duration);
        const sim::RequestRecord& from = device.trace[first.traceIndex];
        const sim::RequestRecord& to = device.trace[last.traceIndex];
        size_t count = last.traceIndex - first.traceIndex + 1;
        std::string what = count == 1 ? requestText(from)
                                      : fmt::format("{} requests, {} to {}", count, requestText(from), requestText(to));
        std::string tooltip = fmt::format("{} {}: {}; {} from {}", device.name, busPhaseName(first.phase), what,
                                          durationText(last.start + last.duration - first.start),
                                          durationText(first.start));
        canvas_.rect(left, compact_ ? lanesTop : lanesTop + lane * kLaneStep, std::max(right - left, 1.0), kLaneHeight,
                     first.failed ? kFailedColour : phaseColour(first.phase), tooltip);
    }

    const RunRecord& record_;
    const BusTimeline& timeline_;
    SvgCanvas canvas_{kWidth};
    bool compact_ = false;
};

}  // namespace

std::string timelineSvg(const RunRecord& record, const BusTimeline& timeline, const std::vector<int>& devices,
                        const std::string& title)
{
    TimelineDrawing drawing(record, timeline);
    SvgCanvas& canvas = drawing.canvas();
    canvas.text(10, 22, title, {15, "start", "#111111", true});
    canvas.text(10, 40,
                fmt::format("modelled bus time of the whole run, devices served one after another: {}",
                            durationText(timeline.total)),
                {11.5, "start", "#444444"});
    drawing.legend(60);
    drawing.axis(88);
    double y = 98;
    bool compact = devices.size() > kMostDevicesInFull;
    if (compact) {
        canvas.text(10, y + 12, fmt::format("{} devices, one row each; hover over a row's end for how it ended", devices.size()),
                    {11.5, "start", "#444444"});
        y += 22;
    }
    for (int device : devices) y = compact ? drawing.row(device, y) : drawing.band(device, y);
    if (devices.empty()) {
        canvas.text(10, y + 12, "no device in this scenario", {12, "start", "#555555"});
        y += 24;
    }
    return canvas.document(y, title);
}

}  // namespace lab
