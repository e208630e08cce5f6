// The module end to end: a loader-mode device arrives with a fuzzed identity
// block, registry values and image, perhaps with one fault, and the real
// module, loaded once, handles it between DllInitialize and DllUnload. After
// every input the loader's promises are checked.
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <memory>
#include <set>
#include <stdexcept>
#include <string>
#include <unistd.h>

#include "brokenPromise.h"
#include "sim/device/enumeratedDevice.h"
#include "sim/host/simHost.h"
#include "sim/kernel/simKernel.h"
#include "sim/loader/moduleImage.h"
#include "updateInput.h"
#include "updatePromises.h"

namespace {

constexpr const char* kServiceKey = "\\Registry\\Machine\\System\\CurrentControlSet\\Services\\morvanek";
constexpr const char* kSystemVersionKey = "\\Registry\\Machine\\Software\\Microsoft\\Windows NT\\CurrentVersion";
constexpr const char* kClassKeyParent = "\\Registry\\Machine\\System\\CurrentControlSet\\Control\\Class\\";
constexpr const char* kDeviceClassKey =
    "\\Registry\\Machine\\System\\CurrentControlSet\\Control\\Class\\{6D2F4B10-93A7-11CF-B4E8-00C05D7A3F21}";
constexpr uint16_t kSignatureAddress = 0x0C00;
constexpr NTSTATUS kUnsuccessful = static_cast<NTSTATUS>(0xC0000001u);
// Fault positions are folded into what one update can reach, so that most
// fuzzed arguments hit something: the largest image takes about 540 requests,
// 61 file reads and a handful of host allocations.
constexpr uint16_t kMostRequests = 640;
constexpr uint16_t kMostFileReads = 64;
constexpr uint16_t kMostAllocations = 16;

// Another build of the module (MORVANEK_MODULE_FILE), such as a deliberately
// broken one, to see that the checks catch it.
std::string modulePath()
{
    const char* other = std::getenv("MORVANEK_MODULE_FILE");
    return other != nullptr && *other != 0 ? other : MORVANEK_FUZZ_MODULE;
}

struct Harness {
    // Loaded once: the fuzzer's coverage counters live in it.
    sim::ModuleImage module{modulePath()};
    std::filesystem::path driveC;
};

Harness* harness = nullptr;

std::string instanceKey(uint16_t vendorId, uint16_t productId, uint32_t serialNumber)
{
    char text[128];
    std::snprintf(text, sizeof text,
                  "\\Registry\\Machine\\System\\CurrentControlSet\\Enum\\USB\\Vid_%04X&Pid_%04X\\%08X", vendorId,
                  productId, serialNumber);
    return text;
}

void writeFile(const std::filesystem::path& path, const std::vector<uint8_t>& bytes)
{
    std::filesystem::create_directories(path.parent_path());
    std::ofstream out(path, std::ios::binary | std::ios::trunc);
    out.write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
}

// A control given a path the fuzzer made up may refuse it; then the value is
// simply not there, as on a machine without it.
void setValueIfPossible(const std::string& key, const std::string& name, const fuzzing::RegistryValueInput& value)
{
    if (value.form == fuzzing::ValueForm::absent) return;
    try {
        sim::kernel::registry().setValue(key, name, value.valueType(), value.valueData());
    } catch (const std::invalid_argument&) {
    }
}

uint16_t hexNumber(const std::string& text)
{
    uint32_t value = 0;
    for (size_t i = 0; i < text.size() && i < 4; ++i) {
        const char c = text[i];
        const int digit = c >= '0' && c <= '9'   ? c - '0'
                          : c >= 'A' && c <= 'F' ? c - 'A' + 10
                          : c >= 'a' && c <= 'f' ? c - 'a' + 10
                                                 : 0;
        value = value << 4 | static_cast<uint32_t>(digit);
    }
    return static_cast<uint16_t>(value);
}

// The registry and drive C: as the input describes them. The Driver value is
// put under every instance key the identity check may end up naming, and the
// image under every name the loader may look for, so that fuzzed identities
// still reach the programming.
void buildWorld(const fuzzing::UpdateInput& input, const sim::IdentityValues& identity)
{
    std::error_code ignored;
    std::filesystem::remove_all(harness->driveC, ignored);
    std::filesystem::create_directories(harness->driveC);
    sim::kernel::files().mapDrive('C', harness->driveC);

    setValueIfPossible(kDeviceClassKey, "FVTPID", input.fvtpid);
    setValueIfPossible(kSystemVersionKey, "SystemRoot", input.systemRoot);
    const std::set<uint16_t> productIds = {identity.productId, identity.productIdCopy, identity.altProductId,
                                           hexNumber(input.fvtpid.text())};
    for (uint16_t vendorId : {identity.vendorId, sim::kDeviceFamilyVendorId}) {
        for (uint16_t productId : productIds) {
            setValueIfPossible(instanceKey(vendorId, productId, identity.serialNumber), "Driver", input.driver);
        }
    }
    if (input.driver.form != fuzzing::ValueForm::absent) {
        setValueIfPossible(kClassKeyParent + input.driver.text(), "Firmware", input.firmware);
    }

    // One file under every name: the others are links to it.
    const std::filesystem::path image = harness->driveC / "images" / "fw.bin";
    writeFile(image, input.image);
    const std::filesystem::path drivers = harness->driveC / "WINDOWS" / "system32" / "drivers";
    std::filesystem::create_directories(drivers);
    for (uint16_t productId : productIds) {
        for (const char* suffix : {"", "0200"}) {
            char name[64];
            std::snprintf(name, sizeof name, "QVUSB%04X%s.bin", productId, suffix);
            std::filesystem::create_hard_link(image, drivers / name);
        }
    }
}

void armFault(const fuzzing::UpdateInput& input, sim::EmulatedDeviceOptions& options)
{
    const uint16_t argument = input.faultArgument;
    switch (input.fault) {
    case fuzzing::FaultKind::stallRequest:
        options.faults.stallRequests.insert(1 + argument % kMostRequests);
        break;
    case fuzzing::FaultKind::stallKind:
        options.faults.stallKinds.insert(static_cast<sim::RequestKind>(argument % 4));
        break;
    case fuzzing::FaultKind::corruptRead:
        options.faults.readCorruptions.push_back({argument, static_cast<uint8_t>(input.faultMask | 1), {}});
        break;
    case fuzzing::FaultKind::unplugAtRequest:
        options.faults.unplugAtRequest = 1 + argument % kMostRequests;
        break;
    case fuzzing::FaultKind::refuseStream:
        (argument % 2 == 0 ? options.faults.refuseOpenStream : options.faults.refuseAllocateBuffer) = true;
        break;
    default:
        break;
    }
}

// Faults of the host and the kernel, armed last so that only the module's own
// calls count.
void armWorldFault(const fuzzing::UpdateInput& input)
{
    const uint16_t argument = input.faultArgument;
    switch (input.fault) {
    case fuzzing::FaultKind::failAllocation:
        sim::Host::get().allocator.failNth(1 + argument % kMostAllocations);
        break;
    case fuzzing::FaultKind::failRegistryQuery: {
        static const char* const kValueNames[] = {"FVTPID", "Driver", "Firmware", "SystemRoot"};
        const char* name = kValueNames[argument % 4];
        for (const auto& key : sim::kernel::registry().contents()) {
            for (const auto& value : key.values) {
                if (value.name == name) sim::kernel::registry().failQuery(key.path, name, kUnsuccessful);
            }
        }
        break;
    }
    case fuzzing::FaultKind::failFileRead:
        sim::kernel::files().failReadNumber(1 + argument % kMostFileReads, kUnsuccessful);
        break;
    case fuzzing::FaultKind::failSizeQuery:
        sim::kernel::files().failSizeQuery(kUnsuccessful);
        break;
    case fuzzing::FaultKind::failSetPosition:
        sim::kernel::files().failSetPosition(kUnsuccessful);
        break;
    case fuzzing::FaultKind::failDeviceTree: {
        sim::TreeFaults& faults = sim::Host::get().tree()->faults;
        switch (argument % 5) {
        case 0:
            faults.createQuery.everyCall = sim::kHostFailure;
            break;
        case 1:
            faults.setAttribute.everyCall = sim::kHostFailure;
            break;
        case 2:
            faults.findDevices.everyCall = sim::kHostFailure;
            break;
        case 3:
            faults.addListener.byNumber[1 + argument / 5 % 2] = sim::kHostFailure;
            break;
        default:
            faults.removeListener = true;
            break;
        }
        break;
    }
    default:
        break;
    }
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***)
{
    harness = new Harness;
    // Drive C: is rewritten for every input; memory-backed where there is such a folder.
    std::error_code error;
    const std::filesystem::path shared = "/dev/shm";
    const std::filesystem::path base =
        std::filesystem::is_directory(shared, error) ? shared : std::filesystem::temp_directory_path();
    harness->driveC = base / ("morvanek-fuzz-" + std::to_string(getpid()));
    std::atexit([] {
        std::error_code ignored;
        std::filesystem::remove_all(harness->driveC, ignored);
    });
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size)
{
    const fuzzing::UpdateInput input = fuzzing::decodeUpdateInput(data, size);
    sim::Host& host = sim::Host::get();
    host.reset();
    sim::kernel::reset();

    sim::EmulatedDeviceOptions options;
    options.name = "fuzzed";
    options.loaderProductId = input.loaderProductId;
    const uint16_t identityPage = sim::findLoaderFlashLayout(input.loaderProductId)->identityPage;
    options.memory.push_back({static_cast<uint16_t>(identityPage + 0x1F0),
                              std::vector<uint8_t>(input.identityBlock.begin(), input.identityBlock.end())});
    options.memory.push_back(
        {kSignatureAddress, std::vector<uint8_t>(input.signatureArea.begin(), input.signatureArea.end())});
    armFault(input, options);
    std::shared_ptr<sim::PhysicalDevice> device = sim::makeEmulatedDevice(options);
    buildWorld(input, device->identity());
    armWorldFault(input);

    if (!input.pluggedInLater) device->plugIn(*host.tree());
    if (harness->module.initialize(kServiceKey) == kStatusSuccess) {
        host.callModuleMain(0);
        if (input.pluggedInLater) {
            device->plugIn(*host.tree());
            host.tree()->deliverPendingEvents();
        }
        host.callModuleMain(1);
        harness->module.dllUnload();
    }

    fuzzing::requireNone(fuzzing::devicePromisesBroken(*device, input.image), "the update broke a promise");
    fuzzing::requireNone(fuzzing::leftoversAndMisuse(), "the module left something behind or misused an interface");
    host.reset();
    sim::kernel::reset();
    return 0;
}
