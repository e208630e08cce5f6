#include "runObserver.h"

#include <filesystem>

#include <fmt/format.h>

#include "sim/kernel/fileSim.h"
#include "sim/kernel/registrySim.h"

namespace lab {

void RunObserver::watch(sim::PhysicalDevice& device, int index)
{
    if (static_cast<size_t>(index) >= devices_.size()) devices_.resize(static_cast<size_t>(index) + 1);
    devices_[static_cast<size_t>(index)].name = device.options().name;
    device.requestObserver = [this, index](const sim::PhysicalDevice& hardware, const sim::RequestRecord& record) {
        onRequest(index, hardware, record);
    };
}

// Log lines and file opens since the last request were the last requester's.
// Only the update's own log lines count; the frame's are nobody's.
void RunObserver::catchUp()
{
    const auto& log = sim::Host::get().eventLog;
    while (logOwners_.size() < log.size()) {
        bool updateLine = log[logOwners_.size()].component == "morvanek";
        logOwners_.push_back(updateLine ? last_ : Owner{});
    }
    const auto& opens = sim::kernel::files().opens();
    while (openOwners_.size() < opens.size()) openOwners_.push_back(last_);
    const auto& calls = sim::kernel::registry().calls();
    while (registryOwners_.size() < calls.size()) registryOwners_.push_back(last_);
}

void RunObserver::stepBegins()
{
    catchUp();
    last_ = Owner{};
}

void RunObserver::stepEnds()
{
    catchUp();
    last_ = Owner{};
    if (progress_ != nullptr) progress_->clear();
}

void RunObserver::onRequest(int index, const sim::PhysicalDevice& device, const sim::RequestRecord& record)
{
    catchUp();
    Watched& watched = devices_[static_cast<size_t>(index)];
    const sim::EnumeratedDevice* enumeration = device.current();
    if (enumeration != nullptr && enumeration != watched.enumeration) {
        watched.enumeration = enumeration;
        ++watched.updates;
    }
    int update = std::max(watched.updates - 1, 0);
    watched.updateOf.push_back(update);
    requestOrder_.push_back(index);
    last_ = Owner{index, update};

    if (record.kind == sim::RequestKind::Write && record.outcome >= 0 && !record.data.empty()) {
        std::vector<uint8_t> stored = device.readMemory(record.wIndex, record.data.size());
        if (stored != record.data)
            watched.writesNotTaken.push_back({record.sequence, update, record.wIndex, record.data, stored});
    }
    if (progress_ != nullptr) {
        countProgress(watched, update, device, record);
        showProgress(watched);
    }
}

// Where an update stands, counted as its requests go by, with totals taken
// from the size of the image the update opened.
void RunObserver::countProgress(Watched& watched, int update, const sim::PhysicalDevice& device,
                                const sim::RequestRecord& record)
{
    UpdateProgress& progress = watched.progress;
    if (progress.update != update) {
        progress = UpdateProgress{};
        progress.update = update;
    }
    const sim::LoaderFlashLayout* layout = device.layout();
    if (layout == nullptr || record.outcome < 0) return;
    if (record.kind == sim::RequestKind::Erase) {
        if (progress.erased == 0) imageTotals(progress, *layout);
        ++progress.erased;
        progress.phase = "erasing page";
        progress.done = progress.erased;
        progress.total = progress.pages;
    } else if (record.kind == sim::RequestKind::Write && record.wIndex == layout->firmwareBase + 6 && record.length == 2 &&
               progress.erased != 0 && progress.written == progress.blocks) {
        progress.phase = "completion marker";
        progress.total = 0;
    } else if (record.kind == sim::RequestKind::Write && record.wIndex < layout->identityPage && progress.erased != 0) {
        ++progress.written;
        progress.phase = "programming block";
        progress.done = progress.written;
        progress.total = progress.blocks;
    } else if (record.kind == sim::RequestKind::Read && progress.written != 0) {
        progress.phase = "verifying block";
    } else if (record.kind == sim::RequestKind::Restart) {
        progress.phase = "restart";
        progress.total = 0;
    } else if (progress.erased == 0) {
        progress.phase = "identity check";
        progress.total = 0;
    }
}

void RunObserver::imageTotals(UpdateProgress& progress, const sim::LoaderFlashLayout& layout)
{
    // The image the update opened is the last file opened before its first erase.
    const auto& opens = sim::kernel::files().opens();
    for (auto it = opens.rbegin(); it != opens.rend(); ++it) {
        if (it->status < 0 || it->hostPath.empty()) continue;
        std::error_code error;
        uintmax_t size = std::filesystem::file_size(it->hostPath, error);
        if (error || size == 0) return;
        uintmax_t first = layout.firmwareBase >> 9;
        uintmax_t last = (layout.firmwareBase + size - 1) >> 9;
        progress.pages = static_cast<size_t>(last - first + 1);
        progress.blocks = static_cast<size_t>((size + 511) / 512);
        return;
    }
}

void RunObserver::showProgress(const Watched& watched)
{
    const UpdateProgress& progress = watched.progress;
    if (progress.phase.empty() || !progress_->due()) return;
    std::string line = prefix_.empty() ? "" : prefix_ + " ";
    line += fmt::format("{}: {}", watched.name, progress.phase);
    if (progress.total != 0) line += fmt::format(" {} of {}", progress.done, progress.total);
    progress_->show(line);
}

}  // namespace lab
