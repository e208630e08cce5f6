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

EnumeratedDevice& PhysicalDevice::plugIn(DeviceTreeSim& tree, PowerUp how)
{
    disconnect();
    if (unplugged_) {
        // Pulled out by its fault, it comes back for good; pulled out by hand, its fault still waits.
        if (unplugFired_) faults.unplugAtRequest = 0;
        unplugFired_ = false;
        unplugged_ = false;
    }
    loaderComebacks_ = 0;
    bool firmware = how == PowerUp::firmware || (how == PowerUp::asFlashSays && completionMarkerInPlace());
    std::unique_ptr<EnumeratedDevice> next;
    if (firmware) {
        IdentityValues identity = this->identity();
        next = std::make_unique<ProductDevice>(shared_from_this(), identity.vendorId, identity.productId);
    } else {
        next = std::make_unique<LoaderModeDevice>(shared_from_this());
    }
    EnumeratedDevice& arriving = *next;
    tree.adopt(std::move(next), lastEnumeration_);
    lastEnumeration_ = &arriving;
    tree.queueArrival(arriving);
    tree.deliverPendingEvents();
    return arriving;
}

LoaderModeDevice& PhysicalDevice::plugIn(DeviceTreeSim& tree)
{
    return static_cast<LoaderModeDevice&>(plugIn(tree, PowerUp::loader));
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
        if (findLoaderFlashLayout(identity.productId) != nullptr && identity.vendorId == kDeviceFamilyVendorId) {
            // The firmware takes its IDs from the identity block, loader IDs or not; it speaks no loader protocol.
            notes.push_back(who + " restarted into its firmware, which enumerates with the loader IDs of its identity "
                                  "block and does not answer the loader's requests");
        }
    } else {
        ++loaderComebacks_;
        next = std::make_unique<LoaderModeDevice>(shared_from_this());
        announce = loaderComebacks_ <= options_.maxLoaderComebacks;
        notes.push_back(who + " restarted without the completion marker and came back in loader mode (" +
                        std::to_string(loaderComebacks_) + " in a row)" +
                        (announce ? "" : "; the host no longer announces it"));
    }
    EnumeratedDevice& arriving = *next;
    tree.adopt(std::move(next), lastEnumeration_);
    lastEnumeration_ = &arriving;
    if (announce) {
        tree.queueArrival(arriving);
    } else {
        arriving.present = true;  // still on the bus, found by a search, but no arrival is delivered
    }
}

}  // namespace sim
