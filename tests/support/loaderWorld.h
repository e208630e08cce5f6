// A world in which the loader can do its whole job: a drive C: in a fresh
// temporary folder, a registry with the system root, and image files.
#pragma once

#include <cstdint>
#include <filesystem>
#include <optional>
#include <string>
#include <vector>

#include "moduleTest.h"
#include "sim/device/enumeratedDevice.h"
#include "sim/kernel/simKernel.h"

namespace testing_support {

constexpr const char* kSystemVersionKey = "\\Registry\\Machine\\Software\\Microsoft\\Windows NT\\CurrentVersion";
constexpr const char* kDeviceClassKey =
    "\\Registry\\Machine\\System\\CurrentControlSet\\Control\\Class\\{6D2F4B10-93A7-11CF-B4E8-00C05D7A3F21}";

// An image of `size` bytes: a counting pattern from `seed`, bytes 6 and 7
// erased so the completion marker can be written over them, and, when the
// image is long enough, the header text at offset 514.
std::vector<uint8_t> makeImage(size_t size, uint8_t seed = 1,
                               const std::string& headerText = "0143C000000000010002000302000A");

// The instance key of a device's identity, as the loader builds it.
std::string instanceKey(uint16_t vendorId, uint16_t productId, uint32_t serialNumber);

class LoaderWorld : public ModuleTest {
protected:
    void SetUp() override;
    void TearDown() override;

    // C:\WINDOWS\system32\drivers\QVUSBxxxx.bin (or ...xxxx0200.bin).
    std::filesystem::path writeDefaultImage(uint16_t productId, const std::vector<uint8_t>& bytes,
                                            bool image0200 = false);
    // A file anywhere on drive C:, given as a DOS path such as "C:\\images\\a.bin".
    std::filesystem::path writeFile(const std::string& dosPath, const std::vector<uint8_t>& bytes);
    std::filesystem::path hostPath(const std::string& dosPath) const;

    // A device whose identity block names the product; loaded into its flash.
    static sim::EmulatedDeviceOptions deviceWithIdentity(uint16_t loaderProductId, uint16_t productId,
                                                         uint32_t serialNumber = 0x0001E240);

    // Registers the module's table with the devices present (start), so that
    // present devices are programmed; returns ssMain's status.
    tStatus startModule();

    std::filesystem::path driveC;
};

}  // namespace testing_support
