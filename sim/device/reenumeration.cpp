// How the device comes and goes: plugged in, pulled out, and restarted out of
// loader mode into its firmware, or back into the loader when the firmware is
// not marked complete.
#include "enumeratedDevice.h"

namespace sim {

DeviceTreeSim& PhysicalDevice::treeOf(const EnumeratedDevice& enumeration) const
{
    return enumeration.tree != nullptr ? *enumeration.tree : *Host::get().tree();
}

void PhysicalDevice::disconnect()
{
    if (current_ == nullptr) return;
    EnumeratedDevice& leaving = *current_;
    current_ = nullptr;
    leaving.markGone();
    if (leaving.present) treeOf(leaving).queueRemoval(leaving);
}

LoaderModeDevice& PhysicalDevice::plugIn(DeviceTreeSim& tree)
{
    disconnect();
    if (unplugged_) {
        // A device that stopped answering answers again once it is plugged back in.
        faults.unplugAtRequest = 0;
        unplugged_ = false;
    }
    loaderComebacks_ = 0;
    auto loader = std::make_unique<LoaderModeDevice>(shared_from_this());
    return static_cast<LoaderModeDevice&>(tree.plugIn(std::move(loader)));
}

void PhysicalDevice::unplug()
{
    if (current_ == nullptr) return;
    DeviceTreeSim& tree = treeOf(*current_);
    disconnect();
    unplugged_ = true;
    tree.deliverPendingEvents();
}

// Runs inside the restart request: arrivals and removals are only queued, and
// the host delivers them once the call that caused them has returned.
void PhysicalDevice::leaveLoaderMode()
{
    if (current_ == nullptr) return;
    DeviceTreeSim& tree = treeOf(*current_);
    std::string who = current_->describe();
    disconnect();

    std::unique_ptr<EnumeratedDevice> next;
    bool announce = true;
    if (completionMarkerInPlace()) {
        loaderComebacks_ = 0;
        IdentityValues identity = this->identity();
        next = std::make_unique<ProductDevice>(shared_from_this(), identity.vendorId, identity.productId);
    } else {
        ++loaderComebacks_;
        next = std::make_unique<LoaderModeDevice>(shared_from_this());
        announce = loaderComebacks_ <= options_.maxLoaderComebacks;
        notes.push_back(who + " restarted without the completion marker and came back in loader mode (" +
                        std::to_string(loaderComebacks_) + " in a row)" +
                        (announce ? "" : "; the host no longer announces it"));
    }
    EnumeratedDevice& arriving = *next;
    tree.adopt(std::move(next));
    if (announce) {
        tree.queueArrival(arriving);
    } else {
        arriving.present = true;  // still on the bus, found by a search, but no arrival is delivered
    }
}

}  // namespace sim
