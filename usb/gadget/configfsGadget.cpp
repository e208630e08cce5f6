#include "configfsGadget.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <stdexcept>

namespace usbgadget {

namespace {

constexpr const char* kEnglish = "strings/0x409";
constexpr const char* kConfiguration = "configs/c.1";

std::string systemError(const std::string& what)
{
    return what + ": " + std::strerror(errno);
}

// configfs attributes take one write of the whole value.
void writeAttribute(const std::string& path, const std::string& value)
{
    int fd = open(path.c_str(), O_WRONLY | O_CLOEXEC);
    if (fd < 0) throw std::runtime_error(systemError("cannot open " + path));
    std::string text = value.empty() ? "\n" : value;
    ssize_t written = write(fd, text.data(), text.size());
    int error = errno;
    close(fd);
    if (written != static_cast<ssize_t>(text.size())) {
        errno = error;
        throw std::runtime_error(systemError("cannot write " + value + " to " + path));
    }
}

void makeFolder(const std::string& path)
{
    if (mkdir(path.c_str(), 0755) != 0 && errno != EEXIST) throw std::runtime_error(systemError("cannot make " + path));
}

std::string hex16(uint16_t value)
{
    char text[8];
    std::snprintf(text, sizeof text, "0x%04x", value);
    return text;
}

}  // namespace

ConfigfsGadget::ConfigfsGadget(std::string configfsRoot, std::string name, uint16_t vendorId, uint16_t productId,
                               const std::string& serial)
    : folder_(configfsRoot + "/usb_gadget/" + name), name_(std::move(name))
{
    try {
        makeFolder(folder_);
        writeAttribute(folder_ + "/bcdUSB", "0x0200");
        writeAttribute(folder_ + "/bcdDevice", "0x0100");
        setIds(vendorId, productId);
        makeFolder(folder_ + "/" + kEnglish);
        writeAttribute(folder_ + "/" + kEnglish + "/manufacturer", "morvanek");
        writeAttribute(folder_ + "/" + kEnglish + "/product", "emulated loader-mode device");
        if (!serial.empty()) writeAttribute(folder_ + "/" + kEnglish + "/serialnumber", serial);
        makeFolder(folder_ + "/" + kConfiguration);
        writeAttribute(folder_ + "/" + kConfiguration + "/MaxPower", "100");
        makeFolder(folder_ + "/functions/ffs." + name_);
        std::string link = folder_ + "/" + kConfiguration + "/ffs." + name_;
        if (symlink((folder_ + "/functions/ffs." + name_).c_str(), link.c_str()) != 0 && errno != EEXIST)
            throw std::runtime_error(systemError("cannot link " + link));
        linked_ = true;
    } catch (...) {
        takeDown();
        throw;
    }
}

ConfigfsGadget::~ConfigfsGadget()
{
    takeDown();
}

void ConfigfsGadget::takeDown() noexcept
{
    // Taken down in the reverse order; a part never made is simply not there.
    try {
        unbind();
    } catch (const std::exception&) {
    }
    if (linked_) unlink((folder_ + "/" + kConfiguration + "/ffs." + name_).c_str());
    linked_ = false;
    rmdir((folder_ + "/functions/ffs." + name_).c_str());
    rmdir((folder_ + "/" + kConfiguration).c_str());
    rmdir((folder_ + "/" + kEnglish).c_str());
    rmdir(folder_.c_str());
}

void ConfigfsGadget::setIds(uint16_t vendorId, uint16_t productId)
{
    writeAttribute(folder_ + "/idVendor", hex16(vendorId));
    writeAttribute(folder_ + "/idProduct", hex16(productId));
}

void ConfigfsGadget::bind(const std::string& udc)
{
    writeAttribute(folder_ + "/UDC", udc);
    bound_ = true;
}

void ConfigfsGadget::unbind()
{
    if (!bound_) return;
    bound_ = false;
    writeAttribute(folder_ + "/UDC", "");
}

std::string firstDeviceController()
{
    std::error_code error;
    std::string first;
    for (const auto& entry : std::filesystem::directory_iterator("/sys/class/udc", error)) {
        std::string name = entry.path().filename().string();
        if (first.empty() || name < first) first = name;
    }
    return first;
}

}  // namespace usbgadget
