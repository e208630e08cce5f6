#include "runObserver.h"

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
    ++step_;
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
    // By the enumeration the request came through: a device unplugged at a
    // request has none by the time it is observed.
    if (record.enumeration != watched.enumeration) {
        watched.enumeration = record.enumeration;
        ++watched.updates;
    }
    int update = std::max(watched.updates - 1, 0);
    watched.updateOf.push_back(update);
    watched.stepOf.push_back(step_);
    last_ = Owner{index, update};

    if (record.kind == sim::RequestKind::Write && record.outcome >= 0 && !record.data.empty()) {
        std::vector<uint8_t> stored = device.readMemory(record.wIndex, record.data.size());
        if (stored != record.data)
            watched.writesNotTaken.push_back({record.sequence, update, record.wIndex, record.data, stored});
    }
    if (progress_ != nullptr) showProgress(index, device, record);
}

// Blocks programmed of the pages erased in this update: each erased page takes one block.
void RunObserver::showProgress(int index, const sim::PhysicalDevice& device, const sim::RequestRecord& latest)
{
    const Watched& watched = devices_[static_cast<size_t>(index)];
    const sim::LoaderFlashLayout* layout = device.layout();
    if (layout == nullptr) return;
    int update = watched.updateOf.back();
    size_t erased = 0;
    size_t written = 0;
    auto count = [&](const sim::RequestRecord& request) {
        if (request.outcome < 0) return;
        if (request.kind == sim::RequestKind::Erase) ++erased;
        bool blockStart = ((request.wIndex - layout->firmwareBase) & 0x1FF) == 0;
        if (request.kind == sim::RequestKind::Write && blockStart && request.wIndex < layout->identityPage) ++written;
    };
    // The request being observed is not in the trace yet.
    for (size_t i = 0; i < device.trace.size() && i < watched.updateOf.size(); ++i) {
        if (watched.updateOf[i] == update) count(device.trace[i]);
    }
    count(latest);
    if (erased == 0) return;
    if (written == 0) {
        progress_->show(fmt::format("  erasing {}: {} page(s)", watched.name, erased));
    } else {
        progress_->show(fmt::format("  programming {}: block {} of {}", watched.name, written, erased));
    }
}

}  // namespace lab
