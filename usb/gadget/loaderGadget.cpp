#include "loaderGadget.h"

#include <endian.h>
#include <poll.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <stdexcept>

#include "sim/device/enumeratedDevice.h"
#include "usb/emulated/loaderControlRequest.h"

namespace usbgadget {

LoaderGadget::LoaderGadget(std::shared_ptr<sim::PhysicalDevice> hardware, sim::PhysicalDevice::PowerUp startsIn,
                           GadgetSettings settings)
    : hardware_(std::move(hardware)), settings_(std::move(settings))
{
    if (settings_.udc.empty()) settings_.udc = firstDeviceController();
    if (settings_.udc.empty()) throw std::runtime_error("there is no USB device controller (/sys/class/udc is empty)");
    sim::EnumeratedDevice& first = hardware_->plugIn(tree_, startsIn);
    gadget_ = std::make_unique<ConfigfsGadget>(settings_.configfsRoot, settings_.name, usbemulated::vendorIdOf(first),
                                               usbemulated::productIdOf(first), settings_.serial);
    endpoint_ = std::make_unique<FunctionFsEndpoint>(gadget_->functionName(),
                                                     settings_.mountFolder + "/" + settings_.name);
    connect();
}

LoaderGadget::~LoaderGadget()
{
    // Pulled out: the host sees the device go before FunctionFS is closed.
    if (gadget_) {
        try {
            gadget_->unbind();
        } catch (const std::exception&) {
        }
    }
    endpoint_.reset();
    gadget_.reset();
    if (hardware_->current() != nullptr) hardware_->unplug();
}

void LoaderGadget::connect()
{
    sim::EnumeratedDevice* now = hardware_->current();
    uint16_t vendorId = usbemulated::vendorIdOf(*now);
    uint16_t productId = usbemulated::productIdOf(*now);
    gadget_->setIds(vendorId, productId);
    gadget_->bind(settings_.udc);
    enumeration_ = now;
    history_.push_back("connected " + usbemulated::idText(vendorId, productId));
}

void LoaderGadget::leaveBus(bool comesBack)
{
    gadget_->unbind();
    enumeration_ = nullptr;
    history_.push_back(comesBack ? "disconnected (restart)" : "disconnected");
    if (!comesBack) return;
    // Announced again as the emulated bus does: a loader that keeps coming
    // back is given up after a number of tries.
    sim::EnumeratedDevice* next = hardware_->current();
    auto* loader = dynamic_cast<sim::LoaderModeDevice*>(next);
    if (next == nullptr || (loader != nullptr && hardware_->loaderComebacks() > hardware_->options().maxLoaderComebacks))
        return;
    comebackDue_ = true;
    comebackAt_ = std::chrono::steady_clock::now() + settings_.comeback;
}

void LoaderGadget::answer(const usb_ctrlrequest& setup)
{
    bool in = (setup.bRequestType & USB_DIR_IN) != 0;
    size_t length = le16toh(setup.wLength);
    std::vector<uint8_t> data(length);
    uint8_t packet[usbemulated::kSetupSize];
    static_assert(sizeof setup == sizeof packet, "a setup packet is eight bytes");
    std::memcpy(packet, &setup, sizeof packet);

    bool dataTaken = false;
    auto takeOutData = [&] { return dataTaken = endpoint_->receiveOut(data.data(), length); };
    usbemulated::ControlOutcome outcome =
        usbemulated::serveVendorRequest(*hardware_, enumeration_, packet, data.data(), takeOutData);
    if (outcome.error == ECONNRESET) return;  // the host gave up on it meanwhile

    if (outcome.leftTheBus && outcome.error != 0) {
        leaveBus(false);  // stopped answering: the request never completes
        return;
    }
    if (outcome.error != 0) {
        if (dataTaken) {
            // The controller acknowledged the data stage as it arrived.
            notes_.push_back("request " + std::to_string(hardware_->requestCount()) +
                             " failed after its OUT data stage was acknowledged; the host saw it succeed");
        } else {
            endpoint_->stall(in);
        }
    } else if (in) {
        endpoint_->sendIn(data.data(), static_cast<size_t>(outcome.actualLength));
    } else if (!dataTaken) {
        endpoint_->acknowledge();
    }
    if (outcome.leftTheBus) leaveBus(true);
}

void LoaderGadget::serve(int stopFd)
{
    for (;;) {
        int timeoutMs = -1;
        if (comebackDue_) {
            auto left = std::chrono::duration_cast<std::chrono::milliseconds>(comebackAt_ - std::chrono::steady_clock::now());
            timeoutMs = left.count() > 0 ? static_cast<int>(left.count()) : 0;
        }
        pollfd watched[2] = {{endpoint_->descriptor(), POLLIN, 0}, {stopFd, POLLIN, 0}};
        int ready = poll(watched, 2, timeoutMs);
        if (ready < 0 && errno != EINTR) throw std::runtime_error("cannot wait for the host");
        if (watched[1].revents != 0) return;
        if (comebackDue_ && std::chrono::steady_clock::now() >= comebackAt_) {
            comebackDue_ = false;
            connect();
        }
        if ((watched[0].revents & POLLIN) == 0) {
            if ((watched[0].revents & (POLLERR | POLLHUP | POLLNVAL)) != 0)
                throw std::runtime_error("FunctionFS closed the control endpoint");
            continue;
        }
        FunctionFsEndpoint::Event event = endpoint_->next();
        if (event.kind != FunctionFsEndpoint::EventKind::setup) continue;
        if (enumeration_ != nullptr) {
            answer(event.setup);
        } else {
            endpoint_->stall((event.setup.bRequestType & USB_DIR_IN) != 0);  // a request from before the unbind
        }
    }
}

}  // namespace usbgadget
