#include <algorithm>
#include <array>

#include <fmt/format.h>

#include "deviceStory.h"
#include "pictures.h"
#include "svgCanvas.h"

namespace lab {

namespace {

constexpr double kWidth = 980;
constexpr size_t kPageSize = sim::FlashMemory::kPageSize;
constexpr size_t kPages = sim::FlashMemory::kPages;
constexpr size_t kColumns = 16;
constexpr size_t kStripBytes = 64;  // one strip of a page cell
constexpr double kGridLeft = 70;
constexpr double kCellWidth = 54;
constexpr double kCellHeight = 30;
constexpr double kCellGap = 2;
constexpr uint16_t kIdentityBlock = 0x1F0;

// What the run did to a byte, last event winning, except that a byte whose
// write did not take or that read back wrong stays marked until an erase.
enum class ByteState : uint8_t { untouched, erased, written, verified, identity, marker, wrong };
constexpr size_t kStates = 7;

const char* stateColour(ByteState state)
{
    switch (state) {
    case ByteState::untouched:
        return "#eeeeee";
    case ByteState::erased:
        return "#fbe2b0";
    case ByteState::written:
        return "#a9c8ef";
    case ByteState::verified:
        return "#8fd48a";
    case ByteState::identity:
        return "#c6b0ea";
    case ByteState::marker:
        return "#f08cb4";
    case ByteState::wrong:
        break;
    }
    return "#d62728";
}

const char* stateName(ByteState state)
{
    switch (state) {
    case ByteState::untouched:
        return "untouched";
    case ByteState::erased:
        return "erased";
    case ByteState::written:
        return "written, not read back";
    case ByteState::verified:
        return "written and verified";
    case ByteState::identity:
        return "identity written";
    case ByteState::marker:
        return "completion marker";
    case ByteState::wrong:
        break;
    }
    return "did not take / read back wrong";
}

const char* legendName(ByteState state)
{
    switch (state) {
    case ByteState::written:
        return "written, not verified";
    case ByteState::verified:
        return "verified";
    case ByteState::marker:
        return "marker";
    case ByteState::wrong:
        return "did not take or read back wrong";
    default:
        return stateName(state);
    }
}

// Which state shows when a strip holds several: the rarer and more telling wins.
int weight(ByteState state)
{
    static constexpr std::array<int, kStates> weights = {0, 1, 3, 2, 4, 5, 6};
    return weights[static_cast<size_t>(state)];
}

struct ByteMap {
    std::vector<ByteState> state = std::vector<ByteState>(sim::FlashMemory::kSize, ByteState::untouched);
    std::vector<uint8_t> written = std::vector<uint8_t>(sim::FlashMemory::kSize, 0xFF);
};

ByteMap mapBytes(const DeviceRecord& device)
{
    ByteMap map;
    std::vector<BusPhase> phases = requestPhases(device);
    for (size_t r = 0; r < device.trace.size(); ++r) {
        const sim::RequestRecord& request = device.trace[r];
        if (request.outcome < 0) continue;
        auto at = [&](size_t i) { return static_cast<uint16_t>(request.wIndex + i); };
        switch (request.kind) {
        case sim::RequestKind::Erase:
            for (size_t i = 0; i < kPageSize; ++i)
                map.state[(request.wValue * kPageSize + i) % sim::FlashMemory::kSize] = ByteState::erased;
            break;
        case sim::RequestKind::Write: {
            ByteState state = phases[r] == BusPhase::identity ? ByteState::identity
                              : phases[r] == BusPhase::marker ? ByteState::marker
                                                              : ByteState::written;
            for (size_t i = 0; i < request.data.size(); ++i) {
                if (map.state[at(i)] != ByteState::wrong) map.state[at(i)] = state;
                map.written[at(i)] = request.data[i];
            }
            for (const WriteNotTaken& write : device.writesNotTaken) {
                if (write.sequence != request.sequence) continue;
                for (size_t i = 0; i < write.written.size() && i < write.stored.size(); ++i) {
                    if (write.written[i] != write.stored[i]) map.state[at(i)] = ByteState::wrong;
                }
            }
            break;
        }
        case sim::RequestKind::Read:
            for (size_t i = 0; i < request.data.size(); ++i) {
                ByteState& state = map.state[at(i)];
                if (state == ByteState::written)
                    state = request.data[i] == map.written[at(i)] ? ByteState::verified : ByteState::wrong;
            }
            break;
        case sim::RequestKind::Restart:
        case sim::RequestKind::Unknown:
            break;
        }
    }
    return map;
}

ByteState strongest(const ByteMap& map, size_t from, size_t count)
{
    ByteState best = ByteState::untouched;
    for (size_t i = from; i < from + count; ++i) {
        if (weight(map.state[i]) > weight(best)) best = map.state[i];
    }
    return best;
}

std::string pageTooltip(const ByteMap& map, size_t page, const DeviceRecord& device)
{
    std::array<size_t, kStates> counts{};
    for (size_t i = page * kPageSize; i < (page + 1) * kPageSize; ++i) ++counts[static_cast<size_t>(map.state[i])];
    std::vector<std::string> parts;
    for (size_t s = 0; s < kStates; ++s) {
        if (counts[s] != 0) parts.push_back(fmt::format("{} byte(s) {}", counts[s], stateName(static_cast<ByteState>(s))));
    }
    std::string role;
    if (device.layout != nullptr) {
        size_t base = device.layout->firmwareBase / kPageSize;
        size_t identity = device.layout->identityPage / kPageSize;
        role = page < base ? " (the loader's own)" : page < identity ? " (firmware area)" : page == identity ? " (identity page)" : "";
    }
    return fmt::format("page {}{}, 0x{:04X} to 0x{:04X}: {}", page, role, page * kPageSize, (page + 1) * kPageSize - 1,
                       fmt::join(parts, ", "));
}

class FlashMapDrawing {
public:
    FlashMapDrawing(const RunRecord& record, int index)
        : record_(record), index_(index), device_(record.devices[static_cast<size_t>(index)]), map_(mapBytes(device_))
    {
    }

    void legend(double y)
    {
        double at = kGridLeft;
        for (size_t s = 0; s < kStates; ++s) {
            auto state = static_cast<ByteState>(s);
            canvas_.rect(at, y - 9, 12, 10, stateColour(state), "", "#999999", 0.5);
            canvas_.text(at + 16, y, legendName(state), {10.5});
            at += 16 + 6.3 * static_cast<double>(std::string(legendName(state)).size()) + 16;
        }
    }

    double grid(double top)
    {
        const sim::LoaderFlashLayout* layout = device_.layout;
        for (size_t page = 0; page < kPages; ++page) {
            size_t row = page / kColumns;
            size_t column = page % kColumns;
            double x = kGridLeft + static_cast<double>(column) * (kCellWidth + kCellGap);
            double y = top + static_cast<double>(row) * (kCellHeight + kCellGap);
            if (column == 0) canvas_.text(kGridLeft - 6, y + 19, fmt::format("0x{:04X}", page * kPageSize), {10, "end", "#555555"});
            // Strips of one state make one rectangle: most pages are all of one kind.
            constexpr size_t strips = kPageSize / kStripBytes;
            double strip = kCellWidth / static_cast<double>(strips);
            for (size_t s = 0; s < strips;) {
                ByteState state = strongest(map_, page * kPageSize + s * kStripBytes, kStripBytes);
                size_t end = s + 1;
                while (end < strips && strongest(map_, page * kPageSize + end * kStripBytes, kStripBytes) == state) ++end;
                canvas_.rect(x + static_cast<double>(s) * strip, y, static_cast<double>(end - s) * strip + 0.05,
                             kCellHeight, stateColour(state));
                s = end;
            }
            const char* border = "#bbbbbb";
            double borderWidth = 0.8;
            if (layout != nullptr && page == layout->identityPage / kPageSize) {
                border = "#6a3fb5";
                borderWidth = 2.5;
            } else if (layout != nullptr && page >= layout->firmwareBase / kPageSize && page < layout->identityPage / kPageSize) {
                border = "#2f7ed8";
                borderWidth = 1.2;
            }
            canvas_.rect(x, y, kCellWidth, kCellHeight, "none", pageTooltip(map_, page, device_), border, borderWidth);
            canvas_.text(x + 3, y + 11, std::to_string(page), {9, "start", "#333333"});
        }
        double bottom = top + static_cast<double>(kPages / kColumns) * (kCellHeight + kCellGap);
        canvas_.text(kGridLeft, bottom + 12,
                     "Each cell is one 512-byte page, numbered; its eight strips are 64 bytes each. Blue frames: the "
                     "firmware area; purple frame: the identity page.",
                     {10.5, "start", "#555555"});
        return bottom + 20;
    }

    // The identity block's 16 bytes, before and after, each coloured by what was written to it.
    double identityRow(double top)
    {
        const size_t size = sim::FlashMemory::kSize;
        if (device_.layout == nullptr || device_.flashBefore.size() < size || device_.flashAfter.size() < size) return top;
        const size_t block = device_.layout->identityPage + kIdentityBlock;
        canvas_.text(10, top + 14, fmt::format("identity block at 0x{:04X}, before and after the run", block),
                     {12.5, "start", "#222222", true});
        struct Field {
            size_t offset;
            size_t length;
            const char* name;
        };
        static const Field fields[] = {{0, 2, "product ID"},  {2, 2, "product copy"}, {4, 4, "(unused)"},
                                       {8, 2, "vendor ID"},   {10, 2, "alt. product"}, {12, 4, "serial number"}};
        const double cell = 54;
        const double left = kGridLeft;
        double y = top + 24;
        for (const Field& field : fields) {
            double x = left + static_cast<double>(field.offset) * cell;
            canvas_.rect(x + 1, y, static_cast<double>(field.length) * cell - 2, 14, "#f0f0f0");
            canvas_.text(x + static_cast<double>(field.length) * cell / 2, y + 11, field.name, {10, "middle", "#333333"});
        }
        y += 17;
        for (size_t i = 0; i < 16; ++i) {
            size_t address = block + i;
            uint8_t before = device_.flashBefore.at(address);
            uint8_t after = device_.flashAfter.at(address);
            ByteState state = map_.state[address];
            double x = left + static_cast<double>(i) * cell;
            std::string tooltip = fmt::format("0x{:04X}: {:02X} before, {:02X} after ({})", address, before, after, stateName(state));
            if (state == ByteState::wrong) tooltip += fmt::format("; {:02X} was written", map_.written[address]);
            canvas_.rect(x + 1, y, cell - 2, 34, stateColour(state),
                         tooltip, "#999999", 0.5);
            canvas_.text(x + cell / 2, y + 14, fmt::format("{:02X}", before), {10.5, "middle", "#666666"});
            canvas_.text(x + cell / 2, y + 28, fmt::format("{:02X}", after),
                         {12, "middle", before == after ? "#333333" : "#000000", before != after});
        }
        canvas_.text(left - 6, y + 14, "before", {10, "end", "#666666"});
        canvas_.text(left - 6, y + 28, "after", {10, "end", "#333333"});
        return y + 44;
    }

    // The update-by-update story in words, and each write that did not take.
    double story(double top)
    {
        double y = top;
        std::vector<UpdateStory> stories = tellDeviceStory(record_, index_);
        for (const UpdateStory& story : stories) {
            std::vector<std::string> parts;
            if (!story.pagesErased.empty()) parts.push_back("erased pages " + pageRanges(story.pagesErased));
            if (story.blocksWritten != 0)
                parts.push_back(fmt::format("{} block(s) written, {} verified", story.blocksWritten, story.blocksVerified));
            for (const IdentityWrite& write : story.identityWrites)
                parts.push_back(fmt::format("{} {} at 0x{:04X}{}", write.field.empty() ? "bytes" : write.field,
                                            hexBytesText(write.bytes), write.address, write.took ? "" : " (did not take)"));
            if (story.markerWritten)
                parts.push_back(fmt::format("marker {}", story.markerTook ? "written" : "did not take"));
            parts.push_back(story.restarted ? "restarted" : "no restart");
            canvas_.text(10, y, fmt::format("update {}: {}", story.index + 1, fmt::join(parts, "; ")), {11});
            y += 15;
            std::vector<std::string> troubles = story.readBackDifferences;
            for (std::string line : story.logLines) {
                while (!line.empty() && (line.back() == '\n' || line.back() == '\r')) line.pop_back();
                troubles.push_back("logged: " + line);
            }
            for (const std::string& trouble : troubles) {
                canvas_.text(24, y, trouble, {11, "start", "#d62728"});
                y += 15;
            }
        }
        const size_t shown = 6;
        for (size_t i = 0; i < device_.writesNotTaken.size() && i < shown; ++i) {
            const WriteNotTaken& write = device_.writesNotTaken[i];
            canvas_.text(10, y,
                         fmt::format("did not take: wrote {} at 0x{:04X}, the flash holds {}", hexBytesText(write.written),
                                     write.address, hexBytesText(write.stored)),
                         {11, "start", "#d62728"});
            y += 15;
        }
        if (device_.writesNotTaken.size() > shown) {
            canvas_.text(10, y, fmt::format("and {} more write(s) that did not take", device_.writesNotTaken.size() - shown),
                         {11, "start", "#d62728"});
            y += 15;
        }
        return y;
    }

    SvgCanvas& canvas() { return canvas_; }
    const DeviceRecord& device() const { return device_; }

private:
    const RunRecord& record_;
    int index_;
    const DeviceRecord& device_;
    ByteMap map_;
    SvgCanvas canvas_{kWidth};
};

std::string nowText(const DeviceRecord& device)
{
    if (device.mode == "unplugged") return "unplugged at the end";
    return fmt::format("ends {} as {:04X}:{:04X}", device.mode == "product" ? "running its firmware" : "in loader mode",
                       device.enumeratedVendorId, device.enumeratedProductId);
}

}  // namespace

std::string flashMapSvg(const RunRecord& record, int index, const std::string& title)
{
    FlashMapDrawing drawing(record, index);
    SvgCanvas& canvas = drawing.canvas();
    const DeviceRecord& device = drawing.device();
    canvas.text(10, 22, title, {15, "start", "#111111", true});
    std::string loader = device.layout != nullptr
                             ? fmt::format("loader {:04X}:{:04X}, firmware from 0x{:04X}, identity page 0x{:04X}",
                                           device.options.vendorId, device.options.loaderProductId,
                                           device.layout->firmwareBase, device.layout->identityPage)
                             : fmt::format("USB {:04X}:{:04X}, not a loader of the family", device.options.vendorId,
                                           device.options.loaderProductId);
    canvas.text(10, 40, fmt::format("{}; {}", loader, nowText(device)), {11.5, "start", "#444444"});
    drawing.legend(60);
    double y = drawing.grid(76);
    y = drawing.identityRow(y);
    y = drawing.story(y + 4);
    return canvas.document(y + 10, title);
}

}  // namespace lab
