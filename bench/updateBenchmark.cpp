// Complete updates of the largest accepted image for each loader product ID,
// through the real module, next to a baseline that sends the same requests
// straight to the emulated device. The module's share is the difference:
// registry and file work, and its own bookkeeping.
#include <benchmark/benchmark.h>
#include <malloc.h>

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <map>
#include <random>
#include <stdexcept>

#include "sim/device/enumeratedDevice.h"
#include "sim/kernel/simKernel.h"
#include "sim/loader/moduleImage.h"

namespace {

constexpr uint16_t kProductId = 0x4B01;

struct Variant {
    uint16_t loaderProductId;
    uint16_t firmwareBase;
    uint16_t identityPage;
    uint32_t largestImage;
};

const Variant& variant(int64_t index)
{
    static const Variant kVariants[] = {{0x4A10, 0x0200, 0x3600, 0x3400}, {0x4A20, 0x0600, 0x7C00, 0x7600}};
    return kVariants[index];
}

std::vector<uint8_t> image(uint32_t size)
{
    std::vector<uint8_t> bytes(size);
    for (uint32_t i = 0; i < size; ++i) bytes[i] = static_cast<uint8_t>(i * 13 + 5);
    bytes[6] = bytes[7] = 0xFF;  // room for the completion marker
    return bytes;
}

sim::EmulatedDeviceOptions deviceOptions(const Variant& v)
{
    sim::EmulatedDeviceOptions options;
    options.loaderProductId = v.loaderProductId;
    options.trace = false;
    sim::IdentityValues identity;
    identity.productId = kProductId;
    identity.serialNumber = 0x0001E240;
    options.identity = identity;
    return options;
}

// A world with drive C:, "SystemRoot", the product's default image, and the
// module loaded and watching.
class ModuleWorld {
public:
    ModuleWorld(const std::vector<uint8_t>& bytes, bool watching) : watching_(watching)
    {
        sim::Host::get().reset();
        sim::kernel::reset();
        drive_ = std::filesystem::temp_directory_path() / ("morvanek-bench-" + std::to_string(std::random_device()()));
        std::filesystem::create_directories(drive_ / "WINDOWS/system32/drivers");
        char name[32];
        std::snprintf(name, sizeof name, "QVUSB%04X.bin", kProductId);
        std::ofstream(drive_ / "WINDOWS/system32/drivers" / name, std::ios::binary)
            .write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
        sim::kernel::files().mapDrive('C', drive_);
        sim::kernel::registry().setString("\\Registry\\Machine\\Software\\Microsoft\\Windows NT\\CurrentVersion",
                                          "SystemRoot", "C:\\WINDOWS");
        module_ = std::make_unique<sim::ModuleImage>();
        if (module_->initialize("\\Registry\\Machine\\System\\CurrentControlSet\\Services\\morvanek") != 0 ||
            (watching_ && sim::Host::get().callModuleMain(0) != 0))
            throw std::runtime_error("the module did not start");
    }
    ~ModuleWorld()
    {
        if (watching_) sim::Host::get().callModuleMain(1);
        module_->dllUnload();
        module_.reset();
        sim::Host::get().reset();
        sim::kernel::reset();
        std::filesystem::remove_all(drive_);
    }

private:
    bool watching_;
    std::filesystem::path drive_;
    std::unique_ptr<sim::ModuleImage> module_;
};

void request(ControlStream& stream, void* buffer, uint8_t type, uint8_t code, uint16_t value, uint16_t index,
             uint32_t length, tStatus& status)
{
    nQVKORD100::tTransferParameterUSBControl parameter;
    parameter.data = length != 0 ? buffer : nullptr;
    parameter.length = length;
    parameter.bmRequestType = type;
    parameter.bRequest = code;
    parameter.wValue = value;
    parameter.wIndex = index;
    stream.transfer(&parameter, status);
}

HANDLE openKey(const char16_t* path)
{
    UNICODE_STRING name;
    RtlInitUnicodeString(&name, path);
    OBJECT_ATTRIBUTES attributes{sizeof(OBJECT_ATTRIBUTES), nullptr, &name, kObjCaseInsensitive, nullptr, nullptr};
    HANDLE key = nullptr;
    return ZwCreateKey(&key, kKeyRead, &attributes, 0, nullptr, 0, nullptr) == 0 ? key : nullptr;
}

HANDLE openFile(const char16_t* path)
{
    UNICODE_STRING name;
    RtlInitUnicodeString(&name, path);
    OBJECT_ATTRIBUTES attributes{sizeof(OBJECT_ATTRIBUTES), nullptr, &name, kObjCaseInsensitive, nullptr, nullptr};
    IO_STATUS_BLOCK io;
    HANDLE file = nullptr;
    ZwCreateFile(&file, kFileReadAccess, &attributes, &io, nullptr, kFileAttributeNormal, 0, kFileOpen,
                 kFileNonDirectoryFile | kFileSynchronousIoNonalert | kFileSequentialOnly, nullptr, 0);
    return file;
}

// The registry and file calls the module makes for one update, so that the
// stand-ins' own cost is the same on both sides.
HANDLE baselinePlatformCalls(const char16_t* imagePath)
{
    openKey(u"\\Registry\\Machine\\System\\CurrentControlSet\\Enum\\USB\\Vid_5C1D&Pid_4B01\\0001E240");
    HANDLE key = openKey(u"\\Registry\\Machine\\Software\\Microsoft\\Windows NT\\CurrentVersion");
    uint32_t record[134];
    uint32_t length = 0;
    UNICODE_STRING value;
    RtlInitUnicodeString(&value, u"SystemRoot");
    ZwQueryValueKey(key, &value, kKeyValuePartialInformation, record, sizeof record, &length);
    ZwClose(key);

    HANDLE header = openFile(imagePath);
    IO_STATUS_BLOCK io;
    FILE_POSITION_INFORMATION position{};
    position.CurrentByteOffset.QuadPart = 514;
    ZwSetInformationFile(header, &io, &position, sizeof position, kFilePositionInformation);
    uint8_t text[60];
    ZwReadFile(header, nullptr, nullptr, nullptr, &io, text, sizeof text, nullptr, nullptr);
    ZwClose(header);

    HANDLE file = openFile(imagePath);
    FILE_STANDARD_INFORMATION information;
    ZwQueryInformationFile(file, &io, &information, sizeof information, kFileStandardInformation);
    return file;
}

// The module's request sequence for one update, sent without the module.
void baselineUpdate(sim::LoaderModeDevice& device, const Variant& v, const std::vector<uint8_t>& bytes)
{
    HANDLE file = baselinePlatformCalls(u"\\??\\C:\\WINDOWS\\system32\\drivers\\QVUSB4B01.bin");
    tStatus status = 0;
    nQVKORD100::tControlStreamParameterUSB parameter;
    parameter.first = 3;
    parameter.second = 0;
    ControlStream* stream = device.openStream(&parameter, status);
    auto* buffer = static_cast<uint8_t*>(stream->allocateBuffer(512, status));
    request(*stream, buffer, 0xC0, 0xB0, 0, v.identityPage + 0x1F8, 2, status);
    request(*stream, buffer, 0xC0, 0xB0, 0, v.identityPage + 0x1F0, 2, status);
    request(*stream, buffer, 0xC0, 0xB0, 0, v.identityPage + 0x1FC, 4, status);
    const uint32_t size = static_cast<uint32_t>(bytes.size());
    for (uint32_t page = v.firmwareBase >> 9; page <= (v.firmwareBase + size - 1u) >> 9; ++page)
        request(*stream, buffer, 0x40, 0xB9, static_cast<uint16_t>(page), 0, 0, status);
    uint8_t verify[512];
    for (uint32_t offset = 0; offset < size; offset += 512) {
        uint32_t length = std::min<uint32_t>(512, size - offset);
        const uint16_t address = static_cast<uint16_t>(v.firmwareBase + offset);
        IO_STATUS_BLOCK io;
        ZwReadFile(file, nullptr, nullptr, nullptr, &io, buffer, length, nullptr, nullptr);
        request(*stream, buffer, 0x40, 0xB0, 0, address, length, status);
        for (uint32_t chunk = 0; chunk < length; chunk += 64) {
            uint32_t part = std::min<uint32_t>(64, length - chunk);
            request(*stream, buffer, 0xC0, 0xB0, 0, static_cast<uint16_t>(address + chunk), part, status);
            std::copy(buffer, buffer + part, verify + chunk);
        }
        benchmark::DoNotOptimize(std::equal(verify, verify + length, bytes.begin() + offset));
    }
    ZwClose(file);
    buffer[0] = 0xAA;
    buffer[1] = 0x55;
    request(*stream, buffer, 0x40, 0xB0, 0, v.firmwareBase + 6, 2, status);
    request(*stream, buffer, 0x40, 0xBA, 0, 0, 0, status);
    tStatus release = 0;
    stream->freeBuffer(buffer, release);
    device.closeStream(stream, release);
    if (status < 0) throw std::runtime_error("the baseline update failed");
}

void ModuleUpdate(benchmark::State& state)
{
    const Variant& v = variant(state.range(0));
    const std::vector<uint8_t> bytes = image(v.largestImage);
    ModuleWorld world(bytes, true);
    size_t allocations = 0;
    for (auto _ : state) {
        auto hardware = sim::makeEmulatedDevice(deviceOptions(v));
        size_t before = sim::Host::get().allocator.totalAllocations();
        hardware->plugIn(*sim::Host::get().tree());
        allocations += sim::Host::get().allocator.totalAllocations() - before;
        if (!hardware->completionMarkerInPlace()) state.SkipWithError("the update did not complete");
    }
    state.counters["allocations_per_update"] =
        benchmark::Counter(static_cast<double>(allocations), benchmark::Counter::kAvgIterations);
    state.SetBytesProcessed(static_cast<int64_t>(state.iterations()) * v.largestImage);
}

void BaselineUpdate(benchmark::State& state)
{
    const Variant& v = variant(state.range(0));
    const std::vector<uint8_t> bytes = image(v.largestImage);
    ModuleWorld world(bytes, false);  // the same drive and registry, with nobody watching the tree
    for (auto _ : state) {
        auto hardware = sim::makeEmulatedDevice(deviceOptions(v));
        baselineUpdate(hardware->plugIn(*sim::Host::get().tree()), v, bytes);
    }
    state.SetBytesProcessed(static_cast<int64_t>(state.iterations()) * v.largestImage);
}

// Each iteration leaves one device (64 KiB of flash) in the tree: keep the
// count fixed so memory stays bounded.
BENCHMARK(ModuleUpdate)->Arg(0)->Arg(1)->ArgName("variant")->Iterations(400)->Unit(benchmark::kMicrosecond);
BENCHMARK(BaselineUpdate)->Arg(0)->Arg(1)->ArgName("variant")->Iterations(400)->Unit(benchmark::kMicrosecond);

// Prints the module/baseline ratio per loader product ID after the runs.
class RatioReporter : public benchmark::ConsoleReporter {
public:
    void ReportRuns(const std::vector<Run>& runs) override
    {
        ConsoleReporter::ReportRuns(runs);
        for (const Run& run : runs) times_[run.benchmark_name()] = run.GetAdjustedRealTime();
    }
    void Finalize() override
    {
        ConsoleReporter::Finalize();
        for (int64_t i = 0; i < 2; ++i) {
            std::string suffix = "/variant:" + std::to_string(i) + "/iterations:400";
            double module = times_["ModuleUpdate" + suffix];
            double baseline = times_["BaselineUpdate" + suffix];
            if (baseline > 0)
                std::printf("loader 0x%04X, %u-byte image: module/baseline = %.3f\n", variant(i).loaderProductId,
                            variant(i).largestImage, module / baseline);
        }
    }

private:
    std::map<std::string, double> times_;
};

}  // namespace

// Every iteration makes a fresh device with 64 KiB of flash. Without this the
// first benchmark to run pays for the process's fresh pages and looks twice
// as slow as the same work run later.
void warmUp()
{
    mallopt(M_TRIM_THRESHOLD, 1 << 30);
    const std::vector<uint8_t> bytes = image(variant(1).largestImage);
    ModuleWorld world(bytes, true);
    for (int i = 0; i < 400; ++i) sim::makeEmulatedDevice(deviceOptions(variant(1)))->plugIn(*sim::Host::get().tree());
}

int main(int argc, char** argv)
{
    benchmark::Initialize(&argc, argv);
    warmUp();
    RatioReporter reporter;
    benchmark::RunSpecifiedBenchmarks(&reporter);
    benchmark::Shutdown();
    return 0;
}
