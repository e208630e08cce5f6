#include "busNode.h"

#include <linux/ioctl.h>
#include <linux/usbdevice_fs.h>
#include <umockdev.h>

#include <algorithm>
#include <cerrno>
#include <cstddef>
#include <cstdio>
#include <cstring>

#include "emulatedBus.h"
#include "usb/emulated/loaderControlRequest.h"

namespace usbtestbed {

namespace {

using usbemulated::kSetupSize;
constexpr uint8_t kRequestTypeMask = 0x60;
constexpr uint8_t kStandardType = 0x00;
constexpr uint8_t kGetDescriptor = 6;
constexpr uint8_t kSerialStringIndex = 3;

std::string hex(const std::vector<uint8_t>& bytes)
{
    std::string text;
    char pair[3];
    for (uint8_t byte : bytes) {
        std::snprintf(pair, sizeof pair, "%02x", byte);
        text += pair;
    }
    return text;
}

}  // namespace

struct Node::Urb {
    UMockdevIoctlClient* client = nullptr;
    UMockdevIoctlData* urb = nullptr;     // the client's struct usbdevfs_urb, resolved
    UMockdevIoctlData* buffer = nullptr;  // its buffer: setup packet, then the data stage
    bool done = false;

    ~Urb()
    {
        if (buffer != nullptr) g_object_unref(buffer);
        if (urb != nullptr) g_object_unref(urb);
        if (client != nullptr) g_object_unref(client);
    }
    usbdevfs_urb& fields() { return *reinterpret_cast<usbdevfs_urb*>(urb->data); }
};

Node::Node(EmulatedBus& bus, std::string path, int deviceAddress, std::shared_ptr<sim::PhysicalDevice> hardware,
           std::string serial)
    : busPath(std::move(path)), address(deviceAddress), devNode([&] {
          char name[32];
          std::snprintf(name, sizeof name, "/dev/bus/usb/001/%03d", deviceAddress);
          return std::string(name);
      }()),
      sysPath("/sys/devices/pci0000:00/usb1/" + busPath), bus_(bus), hardware_(std::move(hardware)),
      enumeration_(hardware_->current()), serial_(std::move(serial)), handler_(umockdev_ioctl_base_new())
{
    vendorId_ = usbemulated::vendorIdOf(*enumeration_);
    productId_ = usbemulated::productIdOf(*enumeration_);
    g_signal_connect(handler_, "handle-ioctl", G_CALLBACK(onIoctl), this);
    g_signal_connect(handler_, "client-vanished", G_CALLBACK(onVanished), this);
    worker_ = std::thread([this] { work(); });
}

Node::~Node()
{
    stop();
    g_object_unref(handler_);
}

void Node::stop()
{
    {
        std::lock_guard<std::mutex> lock(mutex_);
        stopping_ = true;
        dead_ = true;
    }
    wake_.notify_all();
    if (worker_.joinable()) worker_.join();
    std::lock_guard<std::mutex> lock(mutex_);
    for (auto& urb : flying_) {
        if (!urb->done) finish(*urb, -ESHUTDOWN, 0);
    }
    answerReaps();
    queue_.clear();
}

void Node::goDead()
{
    std::lock_guard<std::mutex> lock(mutex_);
    dead_ = true;
    for (auto& urb : flying_) {
        if (!urb->done) finish(*urb, -ESHUTDOWN, 0);
    }
    queue_.clear();
    answerReaps();
}

std::vector<uint8_t> Node::deviceDescriptor() const
{
    uint8_t serialIndex = serial_.empty() ? 0 : kSerialStringIndex;
    return {18,
            1,
            0x00,
            0x02,
            0xFF,
            0x00,
            0x00,
            64,
            static_cast<uint8_t>(vendorId_),
            static_cast<uint8_t>(vendorId_ >> 8),
            static_cast<uint8_t>(productId_),
            static_cast<uint8_t>(productId_ >> 8),
            0x00,
            0x01,
            0,
            0,
            serialIndex,
            1};
}

std::vector<uint8_t> Node::configurationDescriptor() const
{
    // One configuration with one vendor interface and no endpoints: the
    // loader speaks only on the default control pipe.
    return {9, 2, 18, 0, 1, 1, 0, 0x80, 50, 9, 4, 0, 0, 0, 0xFF, 0, 0, 0};
}

std::string Node::description() const
{
    char numbers[160];
    std::snprintf(numbers, sizeof numbers,
                  "E: BUSNUM=001\nE: DEVNUM=%03d\nA: busnum=1\\n\nA: devnum=%d\\n\n"
                  "A: idVendor=%04x\\n\nA: idProduct=%04x\\n\n",
                  address, address, vendorId_, productId_);
    std::string text = "P: /devices/pci0000:00/usb1/" + busPath + "\nN: " + devNode.substr(5) + "\n" +
                       "E: SUBSYSTEM=usb\nE: DEVTYPE=usb_device\nE: DRIVER=usb\nE: DEVNAME=" + devNode + "\n" +
                       numbers + "A: bConfigurationValue=1\\n\nA: speed=12\\n\n";
    if (!serial_.empty()) text += "A: serial=" + serial_ + "\\n\n";
    std::vector<uint8_t> descriptors = deviceDescriptor();
    std::vector<uint8_t> configuration = configurationDescriptor();
    descriptors.insert(descriptors.end(), configuration.begin(), configuration.end());
    return text + "H: descriptors=" + hex(descriptors) + "\n";
}

int Node::onIoctl(UMockdevIoctlBase*, UMockdevIoctlClient* client, void* self)
{
    return static_cast<Node*>(self)->handle(client) ? TRUE : FALSE;
}

void Node::onVanished(UMockdevIoctlBase*, UMockdevIoctlClient* client, void* self)
{
    auto* node = static_cast<Node*>(self);
    std::lock_guard<std::mutex> lock(node->mutex_);
    auto mine = [client](const std::shared_ptr<Urb>& urb) { return urb->client == client; };
    node->flying_.erase(std::remove_if(node->flying_.begin(), node->flying_.end(), mine), node->flying_.end());
    node->queue_.erase(std::remove_if(node->queue_.begin(), node->queue_.end(), mine), node->queue_.end());
    auto& waiting = node->waitingReaps_;
    for (auto it = waiting.begin(); it != waiting.end();) {
        if (it->client != client) {
            ++it;
            continue;
        }
        g_object_unref(it->slot);
        g_object_unref(it->client);
        it = waiting.erase(it);
    }
}

// Runs on umockdev's handler thread; nothing here waits for a device.
bool Node::handle(UMockdevIoctlClient* client)
{
    unsigned long request = umockdev_ioctl_client_get_request(client);
    UMockdevIoctlData* argument = umockdev_ioctl_client_get_arg(client);
    std::unique_lock<std::mutex> lock(mutex_);
    if (request == USBDEVFS_GET_CAPABILITIES) {
        UMockdevIoctlData* capabilities = umockdev_ioctl_data_resolve(argument, 0, sizeof(uint32_t), nullptr);
        *reinterpret_cast<uint32_t*>(capabilities->data) = USBDEVFS_CAP_REAP_AFTER_DISCONNECT;
        g_object_unref(capabilities);
        umockdev_ioctl_client_complete(client, 0, 0);
    } else if (request == USBDEVFS_CLAIMINTERFACE || request == USBDEVFS_RELEASEINTERFACE ||
               request == USBDEVFS_SETCONFIGURATION || request == USBDEVFS_CLEAR_HALT) {
        umockdev_ioctl_client_complete(client, dead_ ? -1 : 0, dead_ ? ENODEV : 0);
    } else if (request == USBDEVFS_SUBMITURB) {
        if (dead_) {
            umockdev_ioctl_client_complete(client, -1, ENODEV);
            return true;
        }
        auto urb = std::make_shared<Urb>();
        urb->urb = umockdev_ioctl_data_resolve(argument, 0, sizeof(usbdevfs_urb), nullptr);
        int length = urb->fields().buffer_length;
        if (urb->fields().type != USBDEVFS_URB_TYPE_CONTROL || length < kSetupSize) {
            umockdev_ioctl_client_complete(client, -1, EINVAL);
            return true;
        }
        urb->buffer = umockdev_ioctl_data_resolve(urb->urb, offsetof(usbdevfs_urb, buffer), length, nullptr);
        urb->client = static_cast<UMockdevIoctlClient*>(g_object_ref(client));
        flying_.push_back(urb);
        queue_.push_back(urb);
        wake_.notify_all();
        umockdev_ioctl_client_complete(client, 0, 0);
    } else if (request == USBDEVFS_REAPURB || request == USBDEVFS_REAPURBNDELAY) {
        bool anyMine = std::any_of(flying_.begin(), flying_.end(), [&](const auto& u) { return u->client == client; });
        if (!anyMine) {
            umockdev_ioctl_client_complete(client, -1, dead_ ? ENODEV : EAGAIN);
            return true;
        }
        // The client's poll cannot wait on this socket, so its reap is held
        // until the URB completes: that is the wait poll would have done.
        UMockdevIoctlData* slot = umockdev_ioctl_data_resolve(argument, 0, sizeof(void*), nullptr);
        waitingReaps_.push_back({static_cast<UMockdevIoctlClient*>(g_object_ref(client)), slot});
        answerReaps();
    } else if (request == USBDEVFS_DISCARDURB) {
        unsigned long address = reinterpret_cast<unsigned long>(*reinterpret_cast<void**>(argument->data));
        auto it = std::find_if(flying_.begin(), flying_.end(),
                               [&](const auto& u) { return u->urb->client_addr == address && u->client == client; });
        if (it == flying_.end() || (*it)->done) {
            umockdev_ioctl_client_complete(client, -1, EINVAL);
            return true;
        }
        queue_.erase(std::remove(queue_.begin(), queue_.end(), *it), queue_.end());
        finish(**it, -ENOENT, 0);
        umockdev_ioctl_client_complete(client, 0, 0);
        answerReaps();
    } else {
        return false;
    }
    return true;
}

void Node::finish(Urb& urb, int status, int actualLength)
{
    urb.fields().status = status;
    urb.fields().actual_length = actualLength;
    urb.done = true;
}

// Hands each waiting reaper one of its completed URBs; the caller holds the mutex.
void Node::answerReaps()
{
    for (auto reaper = waitingReaps_.begin(); reaper != waitingReaps_.end();) {
        UMockdevIoctlClient* client = reaper->client;
        auto done =
            std::find_if(flying_.begin(), flying_.end(), [&](const auto& u) { return u->client == client && u->done; });
        bool nothingLeft =
            std::none_of(flying_.begin(), flying_.end(), [&](const auto& u) { return u->client == client; });
        if (done == flying_.end() && !nothingLeft) {
            ++reaper;
            continue;
        }
        if (done != flying_.end()) {
            umockdev_ioctl_data_set_ptr(reaper->slot, 0, (*done)->urb);
            umockdev_ioctl_client_complete(client, 0, 0);
            flying_.erase(done);
        } else {
            umockdev_ioctl_client_complete(client, -1, dead_ ? ENODEV : EAGAIN);
        }
        g_object_unref(reaper->slot);
        g_object_unref(client);
        reaper = waitingReaps_.erase(reaper);
    }
}

void Node::work()
{
    std::unique_lock<std::mutex> lock(mutex_);
    for (;;) {
        wake_.wait(lock, [&] { return stopping_ || !queue_.empty(); });
        if (stopping_) return;
        std::shared_ptr<Urb> urb = queue_.front();
        queue_.pop_front();
        uint8_t* bytes = static_cast<uint8_t*>(urb->buffer->data);
        std::vector<uint8_t> stage(bytes, bytes + urb->fields().buffer_length);
        lock.unlock();

        int actualLength = 0;
        const uint8_t* setup = stage.data();
        uint8_t* data = stage.data() + kSetupSize;
        int status = (setup[0] & kRequestTypeMask) == kStandardType ? standardRequest(setup, data, actualLength)
                                                                    : vendorRequest(setup, data, actualLength);
        lock.lock();
        if (urb->done) continue;  // discarded meanwhile
        std::memcpy(bytes + kSetupSize, data, stage.size() - kSetupSize);
        finish(*urb, status, actualLength);
        answerReaps();
    }
}

int Node::standardRequest(const uint8_t* setup, uint8_t* data, int& actualLength) const
{
    uint16_t value = static_cast<uint16_t>(setup[2] | setup[3] << 8);
    uint16_t wanted = static_cast<uint16_t>(setup[6] | setup[7] << 8);
    if ((setup[0] & 0x80) == 0) return 0;  // SET_* requests: accepted
    if (setup[1] != kGetDescriptor) return -EPIPE;
    std::vector<uint8_t> answer;
    switch (value >> 8) {
    case 1:
        answer = deviceDescriptor();
        break;
    case 2:
        answer = configurationDescriptor();
        break;
    case 3:
        if ((value & 0xFF) == 0) {
            answer = {4, 3, 0x09, 0x04};  // English (US)
        } else if ((value & 0xFF) == kSerialStringIndex && !serial_.empty()) {
            answer = {static_cast<uint8_t>(2 + 2 * serial_.size()), 3};
            for (char c : serial_) answer.insert(answer.end(), {static_cast<uint8_t>(c), 0});
        } else {
            return -EPIPE;
        }
        break;
    default:
        return -EPIPE;
    }
    actualLength = std::min<int>(wanted, static_cast<int>(answer.size()));
    std::memcpy(data, answer.data(), static_cast<size_t>(actualLength));
    return 0;
}

int Node::vendorRequest(const uint8_t* setup, uint8_t* data, int& actualLength)
{
    usbemulated::ControlOutcome outcome;
    {
        std::lock_guard<std::mutex> deviceLock(bus_.deviceMutex);
        outcome = usbemulated::serveVendorRequest(*hardware_, enumeration_, setup, data);
    }
    if (bus_.timeScale > 0 && outcome.spent.count() > 0)
        std::this_thread::sleep_for(std::chrono::duration<double, std::micro>(outcome.spent.count() * bus_.timeScale));
    if (outcome.leftTheBus) {
        if (outcome.error != 0) {
            bus_.disconnect(busPath);
        } else {
            bus_.reenumerate(busPath);
        }
    }
    actualLength = outcome.actualLength;
    return -outcome.error;
}

}  // namespace usbtestbed
