#include "functionFsEndpoint.h"

#include <endian.h>
#include <fcntl.h>
#include <linux/usb/functionfs.h>
#include <sys/mount.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <stdexcept>

namespace usbgadget {

namespace {

std::string systemError(const std::string& what)
{
    return what + ": " + std::strerror(errno);
}

struct __attribute__((packed)) FunctionDescriptors {
    usb_functionfs_descs_head_v2 header;
    uint32_t fullSpeedCount;
    uint32_t highSpeedCount;
    usb_interface_descriptor fullSpeed;
    usb_interface_descriptor highSpeed;
};

struct __attribute__((packed)) FunctionStrings {
    usb_functionfs_strings_head header;
};

usb_interface_descriptor vendorInterface()
{
    usb_interface_descriptor interface{};
    interface.bLength = USB_DT_INTERFACE_SIZE;
    interface.bDescriptorType = USB_DT_INTERFACE;
    interface.bInterfaceNumber = 0;
    interface.bNumEndpoints = 0;  // the loader speaks only on the default control pipe
    interface.bInterfaceClass = USB_CLASS_VENDOR_SPEC;
    return interface;
}

// Writes the whole buffer in one call, as ep0 wants its blobs.
void writeBlob(int fd, const void* blob, size_t size, const char* what)
{
    if (write(fd, blob, size) != static_cast<ssize_t>(size)) throw std::runtime_error(systemError(what));
}

// The host abandoned the request the call was for: EIDRM from a newer setup
// or a reset, ESHUTDOWN or ENODEV from a disconnect, EL2HLT after an unbind.
bool requestAbandoned(int error)
{
    return error == EIDRM || error == ESHUTDOWN || error == ENODEV || error == EL2HLT || error == ECONNRESET;
}

bool finished(ssize_t result, const char* what)
{
    if (result >= 0) return true;
    if (errno == EINTR || requestAbandoned(errno)) return false;
    throw std::runtime_error(systemError(what));
}

}  // namespace

FunctionFsEndpoint::FunctionFsEndpoint(const std::string& instance, const std::string& mountPoint)
    : mountPoint_(mountPoint)
{
    std::error_code made;
    std::filesystem::create_directories(mountPoint, made);
    if (made) throw std::runtime_error("cannot make " + mountPoint + ": " + made.message());
    if (mount(instance.c_str(), mountPoint.c_str(), "functionfs", 0, nullptr) != 0)
        throw std::runtime_error(systemError("cannot mount FunctionFS " + instance + " at " + mountPoint));
    mounted_ = true;
    ep0_ = open((mountPoint + "/ep0").c_str(), O_RDWR | O_CLOEXEC);
    if (ep0_ < 0) {
        std::string message = systemError("cannot open " + mountPoint + "/ep0");
        umount(mountPoint_.c_str());
        throw std::runtime_error(message);
    }
    FunctionDescriptors descriptors{};
    descriptors.header.magic = htole32(FUNCTIONFS_DESCRIPTORS_MAGIC_V2);
    descriptors.header.length = htole32(sizeof descriptors);
    descriptors.header.flags = htole32(FUNCTIONFS_HAS_FS_DESC | FUNCTIONFS_HAS_HS_DESC | FUNCTIONFS_ALL_CTRL_RECIP |
                                       FUNCTIONFS_CONFIG0_SETUP);
    descriptors.fullSpeedCount = htole32(1);
    descriptors.highSpeedCount = htole32(1);
    descriptors.fullSpeed = vendorInterface();
    descriptors.highSpeed = vendorInterface();
    FunctionStrings strings{};
    strings.header.magic = htole32(FUNCTIONFS_STRINGS_MAGIC);
    strings.header.length = htole32(sizeof strings);
    try {
        writeBlob(ep0_, &descriptors, sizeof descriptors, "FunctionFS refused the descriptors");
        writeBlob(ep0_, &strings, sizeof strings, "FunctionFS refused the strings");
    } catch (...) {
        close(ep0_);
        umount(mountPoint_.c_str());
        throw;
    }
}

FunctionFsEndpoint::~FunctionFsEndpoint()
{
    if (ep0_ >= 0) close(ep0_);
    if (mounted_) umount(mountPoint_.c_str());
}

FunctionFsEndpoint::Event FunctionFsEndpoint::next()
{
    usb_functionfs_event raw{};
    Event event;
    ssize_t got = read(ep0_, &raw, sizeof raw);
    if (got < 0) {
        if (errno == EINTR || requestAbandoned(errno)) return event;
        throw std::runtime_error(systemError("cannot read the events of ep0"));
    }
    if (got != static_cast<ssize_t>(sizeof raw)) return event;
    switch (raw.type) {
    case FUNCTIONFS_SETUP:
        event.kind = EventKind::setup;
        event.setup = raw.u.setup;
        break;
    case FUNCTIONFS_BIND:
        event.kind = EventKind::bound;
        break;
    case FUNCTIONFS_UNBIND:
        event.kind = EventKind::unbound;
        break;
    case FUNCTIONFS_ENABLE:
        event.kind = EventKind::enabled;
        break;
    case FUNCTIONFS_DISABLE:
        event.kind = EventKind::disabled;
        break;
    case FUNCTIONFS_SUSPEND:
        event.kind = EventKind::suspended;
        break;
    case FUNCTIONFS_RESUME:
        event.kind = EventKind::resumed;
        break;
    default:
        break;
    }
    return event;
}

bool FunctionFsEndpoint::sendIn(const uint8_t* data, size_t length)
{
    return finished(write(ep0_, data, length), "cannot send an IN data stage");
}

bool FunctionFsEndpoint::receiveOut(uint8_t* data, size_t length)
{
    return finished(read(ep0_, data, length), "cannot receive an OUT data stage");
}

bool FunctionFsEndpoint::acknowledge()
{
    return finished(read(ep0_, nullptr, 0), "cannot acknowledge a request");
}

// FunctionFS stalls a request when it is answered in the wrong direction.
bool FunctionFsEndpoint::stall(bool directionIn)
{
    ssize_t result = directionIn ? read(ep0_, nullptr, 0) : write(ep0_, nullptr, 0);
    if (result < 0 && errno == EL2HLT) return true;  // the stall itself is reported so
    return finished(result, "cannot stall a request");
}

}  // namespace usbgadget
