// The image a device is programmed from is shared with readers: a version
// check that reads its header meanwhile gets it, while a program that holds
// the image without sharing still keeps the update out (a failure row).
#include "updateWorld.h"

namespace update_tests {
namespace {

using testing_support::kDeviceClassKey;

class SharedImage : public UpdateWorld {};

TEST_F(SharedImage, AVersionCheckReadsTheImageADeviceIsBeingProgrammedFrom)
{
    // The device's "Firmware" value names the product's 0200 image, the one
    // the version check reads.
    const std::string image = "C:\\WINDOWS\\system32\\drivers\\QVUSB4B010200.bin";
    writeFile(image, testing_support::makeImage(1000));
    sim::kernel::registry().setString(testing_support::instanceKey(0x5C1D, kProductId, 0x0001E240), "Driver",
                                      "{6D2F4B10-93A7-11CF-B4E8-00C05D7A3F21}\\0000");
    sim::kernel::registry().setString(std::string(kDeviceClassKey) + "\\0000", "Firmware", image);

    auto hardware = sim::makeEmulatedDevice(deviceWithIdentity(0x4A10, kProductId));
    bool checked = false;
    size_t filesOpenDuringTheCheck = 0;
    tStatus checkStatus = 0;
    hardware->requestObserver = [&](const sim::PhysicalDevice&, const sim::RequestRecord& record) {
        if (checked || record.kind != sim::RequestKind::Write) return;
        checked = true;
        filesOpenDuringTheCheck = sim::kernel::files().openFileCount();
        module->compareFirmwareVersion(tSSVersion(0x0143C000), kProductId, checkStatus);
    };
    run(hardware, Arrival::PresentAtStart);

    ASSERT_TRUE(checked);
    EXPECT_EQ(filesOpenDuringTheCheck, 1u) << "the update holds the image open while it writes the first block";
    EXPECT_EQ(checkStatus, 0) << "the header was read and its version is the one asked for";
    EXPECT_NE(dynamic_cast<sim::ProductDevice*>(hardware->current()), nullptr) << "the update went on to the end";
    EXPECT_TRUE(host().eventLog.empty());
}

}  // namespace
}  // namespace update_tests
