// The host stand-in: what karvelk.sys provides to the module, and the controls
// tests and the lab use to set the world up and see what happened.
#pragma once

#include <cstdarg>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "../../host/deviceTree.h"
#include "../../host/karvelk.h"
#include "../../host/moduleRecords.h"
#include "formatDirective.h"

namespace sim {

// Failure statuses the stand-in reports; distinct so tests can tell them apart.
constexpr tStatus kHostFailure = -52000;          // an operation told to fail
constexpr tStatus kHostAllocationFailed = -52001;
constexpr tStatus kHostTransferStalled = -52002;  // the device refused a request
constexpr tStatus kHostDeviceGone = -52003;       // unplugged, or a stale stream
constexpr tStatus kHostBadArgument = -52004;

struct LogEntry {
    std::string component;
    std::string location;
    uint32_t level = 0;
    std::string tag;
    std::string format;
    std::string message;  // formatted
};

struct PackageEvent {
    uint32_t event = 0;
    std::string firstName;
    std::string secondName;
    std::string mainName;
    tModuleMain moduleMain = nullptr;
    size_t liveBlocks = 0;  // host allocations live when the event came, which shows what ran before it
};

// Counts live blocks; can be told to fail the Nth allocation from now on, or all.
class Allocator {
public:
    // purpose: what the block is for, as reports name it ("the transfer buffer of bench").
    void* allocate(size_t size, tStatus* status, const char* purpose = nullptr);
    void release(void* pointer);

    size_t liveBlocks() const { return live_.size(); }
    size_t liveBytes() const;
    size_t totalAllocations() const { return total_; }
    // Every attempt since the last reset, failed ones included, by purpose; the
    // numbers failNth counts.
    const std::vector<std::string>& attempts() const { return attemptPurposes_; }
    void failNth(size_t nth);  // 1 = the next allocation
    void failAll(bool fail) { failAll_ = fail; }
    void clearFaults();
    void reset();

private:
    std::map<void*, size_t> live_;
    size_t total_ = 0;
    size_t attempts_ = 0;
    std::set<size_t> failAt_;
    std::vector<std::string> attemptPurposes_;
    bool failAll_ = false;
};

class UsbDeviceSim;

// A call told to fail: every call with one status, or chosen calls (numbered
// from 1 over the tree's life, calls with a failed incoming status included)
// each with its own.
struct CallFailures {
    tStatus everyCall = 0;
    std::map<int, tStatus> byNumber;

    tStatus statusFor(int call) const
    {
        auto it = byNumber.find(call);
        return it != byNumber.end() ? it->second : everyCall;
    }
};

// Which operations of the tree fail.
struct TreeFaults {
    CallFailures createQuery;  // it has no status to fail: a failing call returns no query
    CallFailures setAttribute; // on any query of the tree
    CallFailures findDevices;
    CallFailures addListener;
    bool removeListener = false;
};

class DeviceTreeSim final : public iDeviceTree {
public:
    DeviceTreeSim();
    ~DeviceTreeSim();

    void addListener(ListenerRecord* record, tStatus& status) override;
    void releaseQuery(DeviceQuery** query) override;
    void removeListener(ListenerRecord* record, tStatus* status) override;
    DeviceQuery* createQuery() override;
    void findDevices(DeviceList* list, uint32_t selector, DeviceQuery* query, uint32_t flags,
                     tStatus& status) override;

    TreeFaults faults;

    // Adds a device. Once listeners exist its arrival is delivered at once
    // (the caller is the host's own thread, outside any module call).
    UsbDeviceSim& plugIn(std::unique_ptr<UsbDeviceSim> device);
    void unplug(UsbDeviceSim& device);

    // Devices announce arrivals and removals here; they are delivered by
    // deliverPendingEvents(), never from inside the call that caused them.
    void queueArrival(UsbDeviceSim& device);
    void queueRemoval(UsbDeviceSim& device);
    // Kept alive, not yet present; placed in the search order right after
    // `after` (an earlier enumeration of the same device) when given.
    void adopt(std::unique_ptr<UsbDeviceSim> device, const UsbDeviceSim* after = nullptr);
    void deliverPendingEvents();

    std::vector<UsbDeviceSim*> presentDevices() const;
    std::vector<UsbDeviceSim*> allDevices() const;
    size_t liveQueries() const;
    size_t liveListeners() const { return listeners_.size(); }
    int createQueryCalls() const { return createQueryCalls_; }
    int setAttributeCalls() const { return setAttributeCalls_; }
    int findDevicesCalls() const { return findDevicesCalls_; }
    // The records now registered, in the order they were added.
    const std::vector<ListenerRecord*>& listenerRecords() const { return listeners_; }
    int queryIdReads() const { return queryIdReads_; }
    int addListenerCalls() const { return addListenerCalls_; }
    int removeListenerCalls() const { return removeListenerCalls_; }
    std::vector<std::string> describeLeftovers() const;

private:
    struct Event {
        bool arrival;
        UsbDeviceSim* device;
    };
    class Query;
    void deliver(const Event& event);

    std::vector<std::unique_ptr<UsbDeviceSim>> devices_;
    std::vector<std::unique_ptr<Query>> queries_;
    std::vector<ListenerRecord*> listeners_;
    std::deque<Event> pending_;
    uint32_t nextQueryId_ = 0x51;
    int createQueryCalls_ = 0;
    int setAttributeCalls_ = 0;
    int findDevicesCalls_ = 0;
    int queryIdReads_ = 0;
    int addListenerCalls_ = 0;
    int removeListenerCalls_ = 0;
    bool delivering_ = false;
};

// A USB device as the host presents it: attributes, a descriptor, and (for
// the emulated loader) control streams.
class UsbDeviceSim : public UsbDevice {
public:
    UsbDeviceSim(uint32_t vendorId, uint32_t productId, uint32_t attribute21 = 0);
    virtual ~UsbDeviceSim();

    uint32_t getAttribute(uint32_t id, tStatus* status) override;
    ControlStream* openStream(nQVKORD100::tControlStreamParameterUSB* parameter, tStatus& status) override;
    void closeStream(ControlStream* stream, tStatus& status) override;
    void getDescriptor(nQVKORD100::tUSBDeviceDescriptorProxy* proxy, tStatus& status) override;

    std::string name;
    bool present = false;
    std::map<uint32_t, uint32_t> attributes;
    std::set<uint32_t> failingAttributes;
    bool failDescriptor = false;
    int descriptorReads = 0;
    int attributeReads = 0;
    int streamOpenAttempts = 0;  // a plain device: how often the module tried to talk to it

    // Open control streams of this device (the emulated loader has some).
    virtual size_t openStreams() const { return 0; }
    virtual std::string describe() const;

    DeviceTreeSim* tree = nullptr;  // set when the tree takes the device
};

class Host {
public:
    static Host& get();

    // A fresh world: new tree, nothing allocated, logged or registered.
    void reset();

    bool ready = true;
    Allocator allocator;
    std::vector<LogEntry> eventLog;
    std::vector<std::string> debugLines;
    std::vector<PackageEvent> packageEvents;

    // Registration.
    _tLibModuleInfo* registeredModule = nullptr;
    int registrations = 0;
    int unregistrations = 0;
    tStatus registrationFailure = 0;    // negative: libRegisterModuleWithKARVEL fails with it
    tStatus unregistrationFailure = 0;  // negative: libUnregisterModuleWithKARVEL fails with it
    std::vector<std::string> registrationProblems;  // what was wrong with the records

    // Calls the module main through the registered record, as the host does,
    // then delivers the device events that the call caused.
    tStatus callModuleMain(uint32_t reason);

    // The device tree the tests drive. Whether the module can get it is
    // setTreePresent's to say.
    DeviceTreeSim* tree() { return tree_.get(); }
    void setTreePresent(bool present);
    bool treePresent() const { return treePresent_; }

    // Misuse of the host's interfaces by the module, reported loudly.
    void reportMisuse(const std::string& what);
    std::vector<std::string> misuse;

    // Live allocations, listeners, queries and streams, described; empty
    // when nothing was left behind.
    std::vector<std::string> leftovers() const;

private:
    Host();
    std::unique_ptr<DeviceTreeSim> tree_;
    bool treePresent_ = true;
};

// Where a format's arguments come from, one per directive that takes one.
class FormatArguments {
public:
    virtual long long nextSigned(hostformat::Argument kind) = 0;
    virtual unsigned long long nextUnsigned(hostformat::Argument kind) = 0;
    virtual const void* nextPointer() = 0;
    virtual std::string nextText() = 0;    // "(null)" for a null text
    virtual std::string nextText16() = 0;  // UTF-16, as UTF-8

protected:
    ~FormatArguments() = default;
};

// printf-style formatting as the host does it: %S takes a UTF-16 string.
std::string formatHostMessage(const char* format, va_list arguments);
std::string formatHostMessage(const char* format, FormatArguments& arguments);
std::string utf16ToUtf8(const char16_t* text);
std::string utf16ToUtf8(const char16_t* text, size_t length);
std::u16string utf8ToUtf16(const std::string& text);

}  // namespace sim
