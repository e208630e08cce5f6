#include "emulatedBus.h"

#include <umockdev.h>

#include <algorithm>
#include <cstdio>
#include <stdexcept>

#include "busNode.h"
#include "usb/emulated/loaderControlRequest.h"

namespace usbtestbed {

namespace {
// How long a hub takes to report the port change after a device let go of
// the bus, and how long a restarted device takes to enumerate again.
constexpr int kReportDelayMs = 5;
constexpr int kComebackDelayMs = 40;
}  // namespace

EmulatedBus::EmulatedBus(double scale) : timeScale(scale), testbed_(umockdev_testbed_new())
{
    if (testbed_ == nullptr) throw std::runtime_error("umockdev cannot make a test bed");
    actionThread_ = std::thread([this] { runActions(); });
}

EmulatedBus::~EmulatedBus()
{
    {
        std::lock_guard<std::mutex> lock(actionsMutex_);
        stopping_ = true;
    }
    actionsChanged_.notify_all();
    actionThread_.join();
    std::lock_guard<std::mutex> lock(mutex_);
    for (auto& entry : nodes_) {
        umockdev_testbed_detach_ioctl(testbed_, entry.second->devNode.c_str(), nullptr);
        entry.second->stop();
    }
    nodes_.clear();
    retired_.clear();
    g_object_unref(testbed_);
}

std::string EmulatedBus::folder() const
{
    gchar* root = umockdev_testbed_get_root_dir(testbed_);
    std::string text = root;
    g_free(root);
    return text;
}

std::string EmulatedBus::plugIn(std::shared_ptr<sim::PhysicalDevice> device, const std::string& serial)
{
    {
        std::lock_guard<std::mutex> deviceLock(deviceMutex);
        device->plugIn(tree_);
    }
    std::string busPath;
    {
        std::lock_guard<std::mutex> lock(mutex_);
        busPath = "1-" + std::to_string(nextPort_++);
        serials_[busPath] = serial;
    }
    addNode(busPath, std::move(device), serial);
    return busPath;
}

void EmulatedBus::unplug(const std::string& busPath)
{
    std::shared_ptr<sim::PhysicalDevice> hardware;
    {
        std::lock_guard<std::mutex> lock(mutex_);
        auto it = nodes_.find(busPath);
        if (it == nodes_.end()) return;
        it->second->goDead();
    }
    removeNode(busPath);
}

void EmulatedBus::addNode(const std::string& busPath, std::shared_ptr<sim::PhysicalDevice> device,
                          const std::string& serial)
{
    std::lock_guard<std::mutex> lock(mutex_);
    auto node = std::make_unique<Node>(*this, busPath, nextAddress_++, std::move(device), serial);
    // The handler must be in place before the device is announced.
    GError* error = nullptr;
    if (!umockdev_testbed_attach_ioctl(testbed_, node->devNode.c_str(), node->handler(), &error)) {
        std::string what = error != nullptr ? error->message : "unknown error";
        g_clear_error(&error);
        throw std::runtime_error("umockdev cannot answer " + node->devNode + ": " + what);
    }
    if (!umockdev_testbed_add_from_string(testbed_, node->description().c_str(), &error)) {
        std::string what = error != nullptr ? error->message : "unknown error";
        g_clear_error(&error);
        throw std::runtime_error("umockdev cannot add " + busPath + ": " + what);
    }
    history_.push_back("add " + busPath + " " + usbemulated::idText(node->vendorId(), node->productId()));
    nodes_[busPath] = std::move(node);
}

void EmulatedBus::removeNode(const std::string& busPath)
{
    std::lock_guard<std::mutex> lock(mutex_);
    auto it = nodes_.find(busPath);
    if (it == nodes_.end()) return;
    Node& node = *it->second;
    umockdev_testbed_uevent(testbed_, node.sysPath.c_str(), "remove");
    umockdev_testbed_remove_device(testbed_, node.sysPath.c_str());
    umockdev_testbed_detach_ioctl(testbed_, node.devNode.c_str(), nullptr);
    node.goDead();
    history_.push_back("remove " + busPath);
    // Kept until the bus goes: its handler may still be finishing a call.
    retired_.push_back(std::move(it->second));
    nodes_.erase(it);
}

void EmulatedBus::reenumerate(const std::string& busPath)
{
    later(kReportDelayMs, [this, busPath] {
        std::shared_ptr<sim::PhysicalDevice> hardware;
        {
            std::lock_guard<std::mutex> lock(mutex_);
            auto it = nodes_.find(busPath);
            if (it == nodes_.end()) return;
            hardware = it->second->hardwareShared();
        }
        removeNode(busPath);
        later(kComebackDelayMs, [this, busPath, hardware] {
            bool announced;
            {
                std::lock_guard<std::mutex> deviceLock(deviceMutex);
                auto* loader = dynamic_cast<sim::LoaderModeDevice*>(hardware->current());
                announced =
                    hardware->current() != nullptr &&
                    (loader == nullptr || hardware->loaderComebacks() <= hardware->options().maxLoaderComebacks);
            }
            std::string serial;
            {
                std::lock_guard<std::mutex> lock(mutex_);
                serial = serials_[busPath];
            }
            if (announced) addNode(busPath, hardware, serial);
        });
    });
}

void EmulatedBus::disconnect(const std::string& busPath)
{
    later(kReportDelayMs, [this, busPath] { removeNode(busPath); });
}

std::vector<std::string> EmulatedBus::history() const
{
    std::lock_guard<std::mutex> lock(mutex_);
    return history_;
}

bool EmulatedBus::waitForHistory(size_t entries, int timeoutMs) const
{
    auto deadline = std::chrono::steady_clock::now() + std::chrono::milliseconds(timeoutMs);
    while (std::chrono::steady_clock::now() < deadline) {
        if (history().size() >= entries) return true;
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    return history().size() >= entries;
}

void EmulatedBus::later(int delayMs, std::function<void()> work)
{
    {
        std::lock_guard<std::mutex> lock(actionsMutex_);
        actions_.push_back({std::chrono::steady_clock::now() + std::chrono::milliseconds(delayMs), std::move(work)});
    }
    actionsChanged_.notify_all();
}

void EmulatedBus::runActions()
{
    std::unique_lock<std::mutex> lock(actionsMutex_);
    while (!stopping_) {
        if (actions_.empty()) {
            actionsChanged_.wait(lock);
            continue;
        }
        auto next = std::min_element(actions_.begin(), actions_.end(),
                                     [](const Action& a, const Action& b) { return a.due < b.due; });
        if (next->due > std::chrono::steady_clock::now()) {
            auto due = next->due;  // a copy: the list may grow while this waits
            actionsChanged_.wait_until(lock, due);
            continue;
        }
        std::function<void()> work = std::move(next->work);
        actions_.erase(next);
        lock.unlock();
        work();
        lock.lock();
    }
}

}  // namespace usbtestbed
