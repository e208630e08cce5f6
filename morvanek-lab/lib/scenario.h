// One scenario as the lab understands it: the world to build, the steps to
// take in it, and what must be seen afterwards.
#pragma once

#include <cstdint>
#include <filesystem>
#include <optional>
#include <string>
#include <vector>

#include "sim/device/physicalDevice.h"

namespace lab {

// A failure injected into one kind of call: the Nth call, counted from 1 over
// the run, or every call when the number is 0.
struct CallFailurePlan {
    std::string pointer;  // where it stands in the scenario, for messages
    uint64_t number = 0;
    int32_t status = 0;
    std::optional<std::string> file;  // file calls: only those of this DOS path ("C:\...")
};

struct HostPlan {
    bool ready = true;
    bool deviceTree = true;
    std::vector<size_t> failAllocations;  // 1 = the first allocation of the run
    bool failAllAllocations = false;
    int32_t registrationFailure = 0;
    int32_t unregistrationFailure = 0;
    // The device tree's calls.
    std::vector<CallFailurePlan> failCreateQuery;
    std::vector<CallFailurePlan> failSetAttribute;
    std::vector<CallFailurePlan> failFindDevices;
    std::vector<CallFailurePlan> failAddListener;
};

struct RegistryValuePlan {
    std::string name;
    uint32_t type = 0;
    std::vector<uint8_t> data;
};

struct RegistryKeyPlan {
    std::string path;  // kernel form, "\Registry\Machine\..."
    std::vector<RegistryValuePlan> values;
};

struct RegistryFaultPlan {
    std::string keyPath;
    std::optional<std::string> valueName;  // set: the query of that value fails; unset: opening the key fails
    int32_t status = 0;
};

struct RegistryPlan {
    std::vector<std::filesystem::path> imports;  // .reg files, imported first
    std::vector<RegistryKeyPlan> keys;
    std::vector<RegistryFaultPlan> faults;
};

struct FilePlan {
    std::string path;  // inside the drive, backslashes, no drive letter: "WINDOWS\system32\drivers\QVUSB4B01.bin"
    std::vector<uint8_t> bytes;
    bool heldOpenElsewhere = false;
};

struct DrivePlan {
    char letter = 'C';
    std::optional<std::filesystem::path> folder;  // a real folder the drive stands for
    std::vector<FilePlan> files;                  // written to a fresh temporary folder
};

struct FileFaultPlan {
    int32_t everyRead = 0;
    std::vector<std::pair<unsigned, int32_t>> readNumbers;
    int32_t sizeQuery = 0;  // every size query of every file
    int32_t setPosition = 0;
    std::vector<CallFailurePlan> opens;
    std::vector<CallFailurePlan> sizeQueries;
};

struct DevicePlan {
    std::string name;
    sim::EmulatedDeviceOptions options;  // loader product ID, USB vendor ID, attribute 21, faults, timing
    std::string timingName;              // "fullSpeed", "highSpeed" or empty
    bool present = true;
    // How it starts the first time it is plugged in: held in its loader, or
    // running its firmware (enumerating with its identity block's IDs).
    sim::PhysicalDevice::PowerUp startsIn = sim::PhysicalDevice::PowerUp::loader;
    std::vector<uint8_t> flashDump;  // loaded at address 0 first
    std::optional<sim::IdentityValues> identity;
    std::vector<sim::MemoryBytes> memory;  // last, over the dump and the identity
};

enum class StepKind {
    load,
    start,
    stop,
    moduleMain,
    plugIn,
    unplug,
    setWdmLoadState,
    setLegacyLoadState,
    getCurrentVersion,
    getOldestCompatibleVersion,
    compareVersion,
    compareFirmwareVersion,
    unload,
};

enum class MainRoute { moduleMain, wrapper };

struct StepPlan {
    StepKind kind = StepKind::load;
    std::string pointer;  // where the step stands in the scenario, for messages
    std::string registryPath;
    MainRoute route = MainRoute::moduleMain;
    uint32_t reason = 0;
    std::string device;
    // plugIn: how the device starts; unset: as the device's startsIn the
    // first time, as its flash says after that.
    std::optional<sim::PhysicalDevice::PowerUp> startsIn;
    uint32_t state = 0;
    int32_t statusIn = 0;
    uint32_t newest = 0;
    uint32_t oldest = 0;
    std::optional<std::string> component;
    uint32_t version = 0;
    uint16_t productId = 0;

    std::optional<int64_t> expectResult;
    std::optional<int32_t> expectStatus;
    std::optional<std::string> expectGuid;
};

// Fields left unset are not checked.
struct LineMatcher {
    std::optional<std::string> message;  // all of these are "contains" matches
    std::optional<std::string> location;
    std::optional<std::string> component;
    std::optional<std::string> tag;
    std::optional<std::string> format;
    std::optional<uint32_t> level;
};

struct LinesExpectation {
    std::string pointer;
    std::optional<size_t> count;
    std::vector<LineMatcher> contains;
    std::vector<LineMatcher> absent;
    std::optional<std::vector<LineMatcher>> exactly;
};

struct RequestCountExpectation {
    std::string what;  // "total", "read", "write", "erase", "restart", "failed"
    size_t count = 0;
};

struct RequestsExpectation {
    std::string pointer;
    std::vector<RequestCountExpectation> counts;
    std::optional<std::vector<std::string>> sequence;
    std::optional<std::vector<std::string>> startsWith;
    std::optional<std::vector<std::string>> endsWith;
    std::vector<std::string> contains;
    std::vector<std::string> absent;
};

struct MemoryExpectation {
    std::string pointer;
    uint16_t address = 0;
    std::vector<uint8_t> bytes;
};

struct IdentityExpectation {
    std::optional<uint16_t> vendorId;
    std::optional<uint16_t> productId;
    std::optional<uint32_t> serialNumber;
    std::optional<uint16_t> productIdCopy;
    std::optional<uint16_t> altProductId;
};

struct DeviceExpectation {
    std::string device;
    std::string pointer;
    std::optional<std::string> mode;  // "loader", "product", "unplugged"
    std::optional<uint16_t> enumeratesAs;
    std::optional<IdentityExpectation> identity;
    std::optional<bool> markerInPlace;
    std::optional<std::string> programmedWith;  // DOS path of the image the firmware area must hold
    std::vector<MemoryExpectation> memory;
    std::optional<RequestsExpectation> requests;
    std::optional<LinesExpectation> findings;
};

struct Expectations {
    std::optional<LinesExpectation> eventLog;
    std::optional<LinesExpectation> debugLines;
    std::optional<LinesExpectation> findings;
    std::vector<DeviceExpectation> devices;
    std::optional<bool> nothingLeft;
    std::optional<std::vector<std::string>> createdKeys;
};

struct Scenario {
    std::string file;  // as named on the command line, for messages
    std::filesystem::path directory;
    std::string description;
    HostPlan host;
    RegistryPlan registry;
    std::vector<DrivePlan> drives;
    FileFaultPlan fileFaults;
    std::vector<DevicePlan> devices;
    std::vector<StepPlan> steps;
    Expectations expect;
};

const char* stepKindName(StepKind kind);

}  // namespace lab
