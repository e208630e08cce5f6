#include "loaderWorld.h"

#include <fstream>
#include <random>

namespace testing_support {

std::vector<uint8_t> makeImage(size_t size, uint8_t seed, const std::string& headerText)
{
    std::vector<uint8_t> image(size);
    for (size_t i = 0; i < size; ++i) image[i] = static_cast<uint8_t>(seed + i * 7 + (i >> 9));
    for (size_t i = 6; i < 8 && i < size; ++i) image[i] = 0xFF;
    for (size_t i = 0; i < headerText.size() && 514 + i < size; ++i) image[514 + i] = headerText[i];
    return image;
}

std::string instanceKey(uint16_t vendorId, uint16_t productId, uint32_t serialNumber)
{
    char text[128];
    std::snprintf(text, sizeof text, "\\Registry\\Machine\\System\\CurrentControlSet\\Enum\\USB\\Vid_%04X&Pid_%04X\\%08X",
                  vendorId, productId, serialNumber);
    return text;
}

void LoaderWorld::SetUp()
{
    ModuleTest::SetUp();
    std::random_device random;
    driveC = std::filesystem::temp_directory_path() / ("morvanek-test-" + std::to_string(random()));
    std::filesystem::create_directories(driveC / "WINDOWS" / "system32" / "drivers");
    sim::kernel::files().mapDrive('C', driveC);
    sim::kernel::registry().setString(kSystemVersionKey, "SystemRoot", "C:\\WINDOWS");
}

void LoaderWorld::TearDown()
{
    ModuleTest::TearDown();
    std::error_code ignored;
    std::filesystem::remove_all(driveC, ignored);
}

std::filesystem::path LoaderWorld::hostPath(const std::string& dosPath) const
{
    std::string relative = dosPath.substr(dosPath.find(':') + 1);
    for (char& c : relative) {
        if (c == '\\') c = '/';
    }
    while (!relative.empty() && relative[0] == '/') relative.erase(0, 1);
    return driveC / relative;
}

std::filesystem::path LoaderWorld::writeFile(const std::string& dosPath, const std::vector<uint8_t>& bytes)
{
    std::filesystem::path path = hostPath(dosPath);
    std::filesystem::create_directories(path.parent_path());
    std::ofstream out(path, std::ios::binary);
    out.write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
    return path;
}

std::filesystem::path LoaderWorld::writeDefaultImage(uint16_t productId, const std::vector<uint8_t>& bytes,
                                                     bool image0200)
{
    char name[64];
    std::snprintf(name, sizeof name, "C:\\WINDOWS\\system32\\drivers\\QVUSB%04X%s.bin", productId,
                  image0200 ? "0200" : "");
    return writeFile(name, bytes);
}

sim::EmulatedDeviceOptions LoaderWorld::deviceWithIdentity(uint16_t loaderProductId, uint16_t productId,
                                                           uint32_t serialNumber)
{
    sim::EmulatedDeviceOptions options;
    options.loaderProductId = loaderProductId;
    sim::IdentityValues identity;
    identity.vendorId = 0x5C1D;
    identity.productId = productId;
    identity.serialNumber = serialNumber;
    options.identity = identity;
    return options;
}

tStatus LoaderWorld::startModule()
{
    load();
    return callSsMain(0);
}

}  // namespace testing_support
