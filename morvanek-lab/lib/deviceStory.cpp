#include "deviceStory.h"

#include <algorithm>

#include <fmt/format.h>

#include "sim/device/timingModel.h"

namespace lab {

namespace {

constexpr uint16_t kIdentityBlock = 0x1F0;
constexpr uint16_t kMarkerOffset = 6;

std::string identityField(uint16_t offset)
{
    switch (offset) {
    case 0x1F0:
        return "product ID";
    case 0x1F2:
        return "product ID copy";
    case 0x1F8:
        return "vendor ID";
    case 0x1FA:
        return "alternative product ID";
    case 0x1FC:
        return "serial number";
    default:
        return "";
    }
}

}  // namespace

// The device's clock as another bus would have run it: the same requests, the other speed's costs.
std::chrono::microseconds requestDuration(const sim::TimingModel& model, const sim::RequestRecord& request)
{
    if (request.outcome == sim::kHostDeviceGone) return std::chrono::microseconds(0);  // never reached the device
    bool done = request.outcome >= 0;
    uint32_t length = done ? request.length : 0;
    bool erased = done && request.kind == sim::RequestKind::Erase;
    uint32_t programmed = done && request.kind == sim::RequestKind::Write ? request.length : 0;
    return model.duration(length, erased, programmed);
}

namespace {

// The module opens "\??\C:\..."; people know the file as "C:\...".
std::string withoutObjectPrefix(const std::string& path)
{
    return path.rfind("\\??\\", 0) == 0 ? path.substr(4) : path;
}

uint16_t offsetFrom(uint16_t base, uint16_t address)
{
    return static_cast<uint16_t>(address - base);
}

}  // namespace

std::string requestText(const sim::RequestRecord& request)
{
    std::string text;
    switch (request.kind) {
    case sim::RequestKind::Read:
        text = fmt::format("read 0x{:04X} {}", request.wIndex, request.length);
        break;
    case sim::RequestKind::Write:
        text = fmt::format("write 0x{:04X} {}", request.wIndex, request.length);
        break;
    case sim::RequestKind::Erase:
        text = fmt::format("erase {}", request.wValue);
        break;
    case sim::RequestKind::Restart:
        text = "restart";
        break;
    case sim::RequestKind::Unknown:
        text = fmt::format("request {:02X} {:02X} 0x{:04X} 0x{:04X} {}", request.bmRequestType, request.bRequest,
                           request.wValue, request.wIndex, request.length);
        break;
    }
    if (request.outcome < 0) text += " failed";
    return text;
}

std::string pageRanges(const std::vector<uint16_t>& pages)
{
    std::vector<std::string> parts;
    for (size_t i = 0; i < pages.size();) {
        size_t j = i;
        while (j + 1 < pages.size() && pages[j + 1] == pages[j] + 1) ++j;
        parts.push_back(j == i ? std::to_string(pages[i]) : fmt::format("{}-{}", pages[i], pages[j]));
        i = j + 1;
    }
    return fmt::format("{}", fmt::join(parts, ", "));
}

// Reports of large runs format whole traces: one pass, no formatting call per byte.
std::string hexBytesText(const std::vector<uint8_t>& bytes)
{
    static constexpr char kDigits[] = "0123456789ABCDEF";
    std::string text(bytes.empty() ? 0 : bytes.size() * 3 - 1, ' ');
    for (size_t i = 0; i < bytes.size(); ++i) {
        text[i * 3] = kDigits[bytes[i] >> 4];
        text[i * 3 + 1] = kDigits[bytes[i] & 0xF];
    }
    return text;
}

std::string durationText(std::chrono::microseconds duration)
{
    double ms = static_cast<double>(duration.count()) / 1000.0;
    return ms >= 1000 ? fmt::format("{:.2f} s", ms / 1000.0) : fmt::format("{:.1f} ms", ms);
}

std::optional<sim::IdentityValues> identityIn(const DeviceRecord& device, const std::vector<uint8_t>& flash)
{
    if (device.layout == nullptr) return std::nullopt;
    size_t at = static_cast<size_t>(device.layout->identityPage) + kIdentityBlock;
    auto word = [&](size_t offset) { return static_cast<uint16_t>((flash[at + offset] << 8) | flash[at + offset + 1]); };
    sim::IdentityValues identity;
    identity.productId = word(0);
    identity.productIdCopy = word(2);
    identity.vendorId = word(8);
    identity.altProductId = word(10);
    identity.serialNumber = (static_cast<uint32_t>(word(12)) << 16) | word(14);
    return identity;
}

std::string identityText(const sim::IdentityValues& identity)
{
    std::string text;
    if (identity.vendorId == identity.productId && (identity.vendorId == 0xFFFF || identity.vendorId == 0))
        text = identity.vendorId == 0 ? "zeroed " : "blank ";
    text += fmt::format("vendor {:04X}, product {:04X}, serial {:08X}", identity.vendorId, identity.productId,
                        identity.serialNumber);
    if (identity.productIdCopy != 0xFFFF) text += fmt::format(", product copy {:04X}", identity.productIdCopy);
    if (identity.altProductId != 0xFFFF) text += fmt::format(", alternative product {:04X}", identity.altProductId);
    return text;
}

std::vector<UpdateStory> tellDeviceStory(const RunRecord& record, int deviceIndex)
{
    const DeviceRecord& device = record.devices.at(static_cast<size_t>(deviceIndex));
    std::vector<UpdateStory> stories(static_cast<size_t>(std::max(device.updates, device.trace.empty() ? 0 : 1)));
    for (size_t i = 0; i < stories.size(); ++i) stories[i].index = static_cast<int>(i);
    if (stories.empty() || device.layout == nullptr) return stories;
    const sim::LoaderFlashLayout& layout = *device.layout;
    const sim::TimingModel fullSpeed = sim::TimingModel::fullSpeed();
    const sim::TimingModel highSpeed = sim::TimingModel::highSpeed();
    const uint16_t identityBlock = static_cast<uint16_t>(layout.identityPage + kIdentityBlock);

    for (size_t r = 0; r < device.trace.size(); ++r) {
        const sim::RequestRecord& request = device.trace[r];
        size_t update = r < device.updateOf.size() ? static_cast<size_t>(device.updateOf[r]) : 0;
        UpdateStory& story = stories.at(std::min(update, stories.size() - 1));
        ++story.requests;
        story.fullSpeed += requestDuration(fullSpeed, request);
        story.highSpeed += requestDuration(highSpeed, request);
        if (request.outcome < 0) {
            ++story.failedRequests;
            continue;
        }
        switch (request.kind) {
        case sim::RequestKind::Erase:
            story.pagesErased.push_back(request.wValue);
            break;
        case sim::RequestKind::Restart:
            story.restarted = true;
            break;
        case sim::RequestKind::Write: {
            bool took = std::none_of(device.writesNotTaken.begin(), device.writesNotTaken.end(),
                                     [&](const WriteNotTaken& w) { return w.sequence == request.sequence; });
            uint16_t fromBase = offsetFrom(layout.firmwareBase, request.wIndex);
            if (request.wIndex >= identityBlock && request.wIndex < identityBlock + 16) {
                story.identityWrites.push_back(
                    {request.wIndex, identityField(offsetFrom(layout.identityPage, request.wIndex)), request.data, took});
            } else if (fromBase == kMarkerOffset && request.length == 2) {
                story.markerWritten = true;
                story.markerTook = took && request.data == std::vector<uint8_t>{0xAA, 0x55};
            } else if ((fromBase & 0x1FF) == 0) {
                ++story.blocksWritten;
                // The reads that follow, up to the next write, are the read-back of this block.
                std::vector<uint8_t> readBack;
                for (size_t k = r + 1; k < device.trace.size(); ++k) {
                    const sim::RequestRecord& next = device.trace[k];
                    if (next.kind != sim::RequestKind::Read || next.outcome < 0) break;
                    readBack.insert(readBack.end(), next.data.begin(), next.data.end());
                }
                if (readBack == request.data) {
                    ++story.blocksVerified;
                } else {
                    for (size_t b = 0; b < std::min(readBack.size(), request.data.size()); ++b) {
                        if (readBack[b] == request.data[b]) continue;
                        story.readBackDifferences.push_back(
                            fmt::format("block {} read back 0x{:02X} at 0x{:04X} where 0x{:02X} was written",
                                        fromBase / 512, readBack[b], static_cast<uint16_t>(request.wIndex + b),
                                        request.data[b]));
                        break;
                    }
                }
            }
            break;
        }
        case sim::RequestKind::Read:
        case sim::RequestKind::Unknown:
            break;
        }
    }
    for (const LogRecord& line : record.eventLog) {
        if (line.owner.device == deviceIndex && line.owner.update >= 0 &&
            static_cast<size_t>(line.owner.update) < stories.size())
            stories[static_cast<size_t>(line.owner.update)].logLines.push_back(line.entry.message);
    }
    for (size_t i = 0; i < record.registryCalls.size() && i < record.registryCallOwners.size(); ++i) {
        const Owner& owner = record.registryCallOwners[i];
        const sim::kernel::RegistryCall& call = record.registryCalls[i];
        if (owner.device != deviceIndex || owner.update < 0 || static_cast<size_t>(owner.update) >= stories.size()) continue;
        if (call.kind == sim::kernel::RegistryCall::Kind::queryValue)
            stories[static_cast<size_t>(owner.update)].registryValuesRead.push_back(
                call.valueName + (call.result == 0 ? "" : fmt::format(" (0x{:08X})", static_cast<uint32_t>(call.result))));
    }
    for (const FileOpenSeen& seen : record.fileOpens) {
        if (seen.owner.device != deviceIndex || seen.owner.update < 0 ||
            static_cast<size_t>(seen.owner.update) >= stories.size())
            continue;
        UpdateStory& story = stories[static_cast<size_t>(seen.owner.update)];
        if (seen.open.status >= 0) {
            std::string path = withoutObjectPrefix(seen.open.dosPath);
            if (std::find(story.imagesOpened.begin(), story.imagesOpened.end(), path) == story.imagesOpened.end())
                story.imagesOpened.push_back(path);
            story.imageSize = seen.size;
        } else {
            story.opensRefused.push_back(
                fmt::format("{} (status 0x{:08X})", withoutObjectPrefix(seen.open.dosPath), static_cast<uint32_t>(seen.open.status)));
        }
    }
    return stories;
}

}  // namespace lab
