// An emulated device of the family (sim/device, as the lab uses it) behind
// a FunctionFS gadget on a device controller, so that the kernel's USB stack
// on the controller's host side enumerates it and talks to it as to real
// hardware. A restart unbinds the gadget and binds it again with the IDs of
// the new enumeration, so the host sees a real disconnect and re-enumeration;
// a device that stops answering is unbound and stays away.
#pragma once

#include <chrono>
#include <memory>
#include <string>
#include <vector>

#include "configfsGadget.h"
#include "functionFsEndpoint.h"
#include "sim/device/physicalDevice.h"

namespace usbgadget {

struct GadgetSettings {
    std::string configfsRoot = "/sys/kernel/config";
    std::string name = "morvanek";                 // gadget and FunctionFS instance name
    std::string mountFolder = "/run/morvanek-gadget";  // FunctionFS is mounted at mountFolder/name
    std::string udc;                               // empty: the first controller
    std::string serial;                            // the USB serial-number string; empty: none
    // How long a restarted device takes to enumerate again.
    std::chrono::milliseconds comeback{100};
};

class LoaderGadget {
  public:
    // Plugs the device in (as its plan says) and connects the gadget.
    LoaderGadget(std::shared_ptr<sim::PhysicalDevice> hardware, sim::PhysicalDevice::PowerUp startsIn,
                 GadgetSettings settings);
    ~LoaderGadget();

    // Answers the host until `stopFd` becomes readable.
    void serve(int stopFd);

    // What the bus saw, in order: "connected 5C1D:4A10", "disconnected (restart)".
    const std::vector<std::string>& history() const { return history_; }
    // Limits of the gadget met while serving: not errors of the device.
    const std::vector<std::string>& notes() const { return notes_; }
    const std::string& controller() const { return settings_.udc; }

  private:
    void connect();
    void answer(const usb_ctrlrequest& setup);
    void leaveBus(bool comesBack);

    std::shared_ptr<sim::PhysicalDevice> hardware_;
    GadgetSettings settings_;
    sim::DeviceTreeSim tree_;  // the device's own idea of where it is plugged in
    std::unique_ptr<ConfigfsGadget> gadget_;
    std::unique_ptr<FunctionFsEndpoint> endpoint_;
    const sim::EnumeratedDevice* enumeration_ = nullptr;  // what the host enumerated, while connected
    bool comebackDue_ = false;
    std::chrono::steady_clock::time_point comebackAt_;
    std::vector<std::string> history_;
    std::vector<std::string> notes_;
};

}  // namespace usbgadget
