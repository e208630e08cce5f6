// A USB bus for tests, made with umockdev: emulated loader-mode devices
// (sim/device, as the lab uses them) behind device nodes whose usbfs ioctls
// are answered live, with udev events for arrivals and removals. A program run
// under umockdev's preload with this bus's folder (UMOCKDEV_DIR) sees them
// through libusb as real devices: enumeration, hotplug, control transfers,
// stalls, disconnects, and the restart's re-enumeration as the product.
#pragma once

#include <chrono>
#include <condition_variable>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "sim/device/physicalDevice.h"

typedef struct _UMockdevTestbed UMockdevTestbed;

namespace usbtestbed {

class Node;

class EmulatedBus {
  public:
    // Real time per virtual time of the devices' timing models: 1 makes each
    // request take as long as the model says; 0 (the default) waits for nothing.
    explicit EmulatedBus(double timeScale = 0);
    ~EmulatedBus();
    EmulatedBus(const EmulatedBus&) = delete;
    EmulatedBus& operator=(const EmulatedBus&) = delete;

    // The folder a program must find in UMOCKDEV_DIR.
    std::string folder() const;

    // Plugs the device into the next free port of bus 1 in loader mode and
    // announces it; returns its bus path ("1-3"). The USB serial string is
    // the given one, or none.
    std::string plugIn(std::shared_ptr<sim::PhysicalDevice> device, const std::string& serial = "");
    // Pulls it out: the node goes, a removal is announced.
    void unplug(const std::string& busPath);

    // What the bus did, in order: "add 1-1 5C1D:4A10", "remove 1-1".
    std::vector<std::string> history() const;
    // Waits until the history has at least that many entries; false on time-out.
    bool waitForHistory(size_t entries, int timeoutMs) const;

    // For nodes, from their work threads: the device restarted into another
    // enumeration, or stopped answering. The bus acts a moment later, on its
    // own thread, as a hub reports a port change.
    void reenumerate(const std::string& busPath);
    void disconnect(const std::string& busPath);

    // Serialises the devices' own work (the lab's device code is single-threaded).
    std::mutex deviceMutex;
    const double timeScale;

  private:
    struct Action {
        std::chrono::steady_clock::time_point due;
        std::function<void()> work;
    };
    void later(int delayMs, std::function<void()> work);
    void runActions();
    void addNode(const std::string& busPath, std::shared_ptr<sim::PhysicalDevice> device, const std::string& serial);
    void removeNode(const std::string& busPath);

    sim::DeviceTreeSim tree_;  // the devices' own idea of where they are plugged in
    UMockdevTestbed* testbed_;
    mutable std::mutex mutex_;  // the testbed, the nodes and the history
    std::map<std::string, std::unique_ptr<Node>> nodes_;
    std::vector<std::unique_ptr<Node>> retired_;  // removed nodes, kept until their work threads end
    std::vector<std::string> history_;
    std::map<std::string, std::string> serials_;  // by bus path, kept across enumerations
    int nextPort_ = 1;
    int nextAddress_ = 2;

    std::mutex actionsMutex_;
    std::condition_variable actionsChanged_;
    std::vector<Action> actions_;
    bool stopping_ = false;
    std::thread actionThread_;
};

}  // namespace usbtestbed
