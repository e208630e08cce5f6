// A USB gadget made through configfs: one configuration with one FunctionFS
// function, bound to a device controller (UDC) so that the host side of the
// controller sees a device. Everything made is taken down again when it goes.
#pragma once

#include <cstdint>
#include <string>

namespace usbgadget {

class ConfigfsGadget {
  public:
    // Makes the gadget `name` under the configfs gadget folder, showing the
    // given IDs and serial-number string (none when empty). Throws
    // std::runtime_error naming the file that could not be written.
    ConfigfsGadget(std::string configfsRoot, std::string name, uint16_t vendorId, uint16_t productId,
                   const std::string& serial);
    ~ConfigfsGadget();
    ConfigfsGadget(const ConfigfsGadget&) = delete;
    ConfigfsGadget& operator=(const ConfigfsGadget&) = delete;

    // The FunctionFS instance name, for mounting: mount -t functionfs NAME DIR.
    const std::string& functionName() const { return name_; }

    // While unbound: the IDs the next enumeration shows.
    void setIds(uint16_t vendorId, uint16_t productId);
    // Connects the gadget to the controller's bus, or disconnects it, as a
    // cable plugged in or pulled out would.
    void bind(const std::string& udc);
    void unbind();
    bool bound() const { return bound_; }

  private:
    void takeDown() noexcept;

    std::string folder_;  // configs/functions live below it
    std::string name_;
    bool bound_ = false;
    bool linked_ = false;
};

// The first device controller the kernel offers (/sys/class/udc), or empty.
std::string firstDeviceController();

}  // namespace usbgadget
