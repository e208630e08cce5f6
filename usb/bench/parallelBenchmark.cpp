// How long morvanek-usb takes to update one device, and eight at once, on an
// emulated bus whose devices take the time their full-speed timing model
// says. Each device is served on its own thread, so eight should take about
// as long as one.
//
//   build/default/usb/usb_parallel_benchmark [DEVICES] [IMAGE_BYTES] [RUNS]
//
// Each figure is the best of RUNS runs (default 3), and their median: other
// work on the machine only ever makes a run slower.
#include <algorithm>
#include <chrono>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <random>

#include <sys/resource.h>

#include "regfile/registryText.h"
#include "sim/kernel/simKernel.h"
#include "usb/testbed/emulatedBus.h"
#include "usb/testbed/programRun.h"

namespace {

constexpr const char* kSystemVersionKey = "\\Registry\\Machine\\Software\\Microsoft\\Windows NT\\CurrentVersion";

std::vector<uint8_t> image(size_t size, uint8_t seed)
{
    std::vector<uint8_t> bytes(size);
    for (size_t i = 0; i < size; ++i) bytes[i] = static_cast<uint8_t>(seed + i * 7 + (i >> 9));
    bytes[6] = bytes[7] = 0xFF;  // room for the completion marker
    return bytes;
}

struct Setup {
    std::filesystem::path folder;
    std::filesystem::path registryFile;
    std::filesystem::path driveC;
};

double cpuSeconds(int who)
{
    rusage usage{};
    getrusage(who, &usage);
    return static_cast<double>(usage.ru_utime.tv_sec + usage.ru_stime.tv_sec) +
           static_cast<double>(usage.ru_utime.tv_usec + usage.ru_stime.tv_usec) / 1e6;
}

struct Cpu {
    double program = 0;  // morvanek-usb
    double bus = 0;      // the emulated bus: umockdev's handler and the devices
};

// Returns seconds of wall time for one run of morvanek-usb once over `count` devices.
double updateDevices(const Setup& setup, int count, Cpu& cpu)
{
    double programBefore = cpuSeconds(RUSAGE_CHILDREN);
    double busBefore = cpuSeconds(RUSAGE_SELF);
    usbtestbed::EmulatedBus bus(1.0);
    std::vector<std::shared_ptr<sim::PhysicalDevice>> devices;
    for (int i = 0; i < count; ++i) {
        sim::EmulatedDeviceOptions options;
        options.loaderProductId = 0x4A10;
        sim::IdentityValues identity;
        identity.productId = static_cast<uint16_t>(0x4B01 + i);
        identity.serialNumber = 0x1000u + static_cast<uint32_t>(i);
        options.identity = identity;
        options.timing = sim::TimingModel::fullSpeed();
        options.trace = false;
        devices.push_back(sim::makeEmulatedDevice(options));
        bus.plugIn(devices.back());
    }
    auto start = std::chrono::steady_clock::now();
    usbtestbed::ProgramRun run({MORVANEK_USB_EXECUTABLE, "once", "--no-progress", "--registry",
                                setup.registryFile.string(), "--drive", "C=" + setup.driveC.string()},
                               bus.folder(), setup.folder.string());
    usbtestbed::ProgramOutput output = run.finish();
    double seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
    cpu.program = cpuSeconds(RUSAGE_CHILDREN) - programBefore;
    cpu.bus = cpuSeconds(RUSAGE_SELF) - busBefore;
    int updated = 0;
    for (const auto& device : devices) updated += device->completionMarkerInPlace() ? 1 : 0;
    if (output.exitCode != 0 || updated != count) {
        std::fprintf(stderr, "run of %d device(s) failed (exit %d, %d updated):\n%s", count, output.exitCode, updated,
                     output.errors.c_str());
        std::exit(1);
    }
    return seconds;
}

}  // namespace

int main(int argc, char** argv)
{
    usbtestbed::runUnderUmockdev();
    int count = argc > 1 ? std::atoi(argv[1]) : 8;
    size_t imageBytes = argc > 2 ? static_cast<size_t>(std::atol(argv[2])) : 0x3400;

    Setup setup;
    setup.folder =
        std::filesystem::temp_directory_path() / ("morvanek-usb-bench-" + std::to_string(std::random_device()()));
    setup.driveC = setup.folder / "C";
    std::filesystem::create_directories(setup.driveC / "WINDOWS" / "system32" / "drivers");
    for (int i = 0; i < count; ++i) {
        char name[32];
        std::snprintf(name, sizeof name, "QVUSB%04X.bin", 0x4B01 + i);
        std::vector<uint8_t> bytes = image(imageBytes, static_cast<uint8_t>(i));
        std::ofstream(setup.driveC / "WINDOWS" / "system32" / "drivers" / name, std::ios::binary)
            .write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
    }
    sim::kernel::registry().setString(kSystemVersionKey, "SystemRoot", "C:\\WINDOWS");
    setup.registryFile = setup.folder / "machine.reg";
    std::ofstream(setup.registryFile) << sim::regfile::exportRegistryText(sim::kernel::registry());

    int runs = argc > 3 ? std::max(1, std::atoi(argv[3])) : 3;
    std::vector<double> one, many;
    Cpu oneCpu, manyCpu;
    for (int run = 0; run < runs; ++run) {
        one.push_back(updateDevices(setup, 1, oneCpu));
        many.push_back(updateDevices(setup, count, manyCpu));
    }
    std::sort(one.begin(), one.end());
    std::sort(many.begin(), many.end());
    std::printf("image of %zu bytes on loader 0x4A10, full-speed timing model, %d run(s)\n", imageBytes, runs);
    std::printf("one device:   best %.3f s, median %.3f s\n", one.front(), one[one.size() / 2]);
    std::printf("%d devices:    best %.3f s, median %.3f s\n", count, many.front(), many[many.size() / 2]);
    std::printf("ratio:        best %.2f, median %.2f\n", many.front() / one.front(),
                many[many.size() / 2] / one[one.size() / 2]);
    std::printf("processor time of the last run: one device %.3f s (program %.3f, bus %.3f), %d devices %.3f s "
                "(program %.3f, bus %.3f)\n",
                oneCpu.program + oneCpu.bus, oneCpu.program, oneCpu.bus, count, manyCpu.program + manyCpu.bus,
                manyCpu.program, manyCpu.bus);
    std::error_code ignored;
    std::filesystem::remove_all(setup.folder, ignored);
    return 0;
}
