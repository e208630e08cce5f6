#include "busTimeline.h"

#include "deviceStory.h"

namespace lab {

namespace {

constexpr uint16_t kIdentityBlock = 0x1F0;  // within the identity page
constexpr uint16_t kMarkerOffset = 6;       // from the firmware base

}  // namespace

const char* busPhaseName(BusPhase phase)
{
    switch (phase) {
    case BusPhase::identity:
        return "identity";
    case BusPhase::erase:
        return "erase";
    case BusPhase::program:
        return "program";
    case BusPhase::verify:
        return "verify";
    case BusPhase::marker:
        return "marker";
    case BusPhase::restart:
        return "restart";
    case BusPhase::other:
        break;
    }
    return "other";
}

const sim::TimingModel& busModelOf(const DeviceRecord& device)
{
    static const sim::TimingModel fullSpeed = sim::TimingModel::fullSpeed();
    return device.options.timing ? *device.options.timing : fullSpeed;
}

const char* busModelName(const DeviceRecord& device)
{
    if (!device.options.timing) return "full-speed bus, assumed";
    return device.timingName == "highSpeed" ? "high-speed bus" : "full-speed bus";
}

// Reads before the first erase or block write of an update are the identity
// check's (block and signatures); reads after it are the read-back of blocks.
std::vector<BusPhase> requestPhases(const DeviceRecord& device)
{
    std::vector<BusPhase> phases(device.trace.size(), BusPhase::other);
    if (device.layout == nullptr) return phases;
    const sim::LoaderFlashLayout& layout = *device.layout;
    const uint32_t identityBlock = layout.identityPage + kIdentityBlock;
    int update = -1;
    bool programming = false;
    for (size_t r = 0; r < device.trace.size(); ++r) {
        const sim::RequestRecord& request = device.trace[r];
        int owner = r < device.updateOf.size() ? device.updateOf[r] : 0;
        if (owner != update) {
            update = owner;
            programming = false;
        }
        BusPhase& phase = phases[r];
        switch (request.kind) {
        case sim::RequestKind::Erase:
            phase = BusPhase::erase;
            programming = true;
            break;
        case sim::RequestKind::Restart:
            phase = BusPhase::restart;
            break;
        case sim::RequestKind::Write:
            if (request.wIndex >= identityBlock && request.wIndex < identityBlock + 16) {
                phase = BusPhase::identity;
            } else if (request.wIndex == layout.firmwareBase + kMarkerOffset && request.length == 2) {
                phase = BusPhase::marker;
            } else {
                phase = BusPhase::program;
                programming = true;
            }
            break;
        case sim::RequestKind::Read:
            phase = programming ? BusPhase::verify : BusPhase::identity;
            break;
        case sim::RequestKind::Unknown:
            break;
        }
    }
    return phases;
}

BusTimeline layOutBusTimeline(const RunRecord& record)
{
    BusTimeline timeline;
    std::vector<std::vector<BusPhase>> phases;
    for (const DeviceRecord& device : record.devices) phases.push_back(requestPhases(device));

    // The run's order of requests; a record without it is taken device by device.
    std::vector<int> order = record.requestOrder;
    if (order.empty()) {
        for (size_t d = 0; d < record.devices.size(); ++d) order.insert(order.end(), record.devices[d].trace.size(), static_cast<int>(d));
    }
    std::vector<size_t> next(record.devices.size(), 0);
    for (int d : order) {
        if (d < 0 || static_cast<size_t>(d) >= record.devices.size()) continue;
        const DeviceRecord& device = record.devices[static_cast<size_t>(d)];
        size_t r = next[static_cast<size_t>(d)]++;
        if (r >= device.trace.size()) continue;
        const sim::RequestRecord& request = device.trace[r];
        TimedRequest timed;
        timed.device = d;
        timed.traceIndex = r;
        timed.update = r < device.updateOf.size() ? device.updateOf[r] : 0;
        timed.phase = phases[static_cast<size_t>(d)][r];
        timed.failed = request.outcome < 0;
        timed.start = timeline.total;
        timed.duration = requestDuration(busModelOf(device), request);
        timeline.total += timed.duration;
        timeline.requests.push_back(timed);
    }
    return timeline;
}

}  // namespace lab
