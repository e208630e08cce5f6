// What a device will answer by the setup packet alone must be what it then
// answers: a gadget refuses an OUT data stage on this word before it takes
// the data, so a wrong word would program a block the device refused.
#include "deviceHarness.h"

using namespace device_tests;

namespace {

struct BeforeDataCase {
    const char* what;
    sim::DeviceFaults faults;
    uint8_t requestType;
    uint8_t request;
    uint16_t value;
    uint32_t length;
    tStatus expected;  // what the setup packet alone decides
};

TEST_F(DeviceTest, TheOutcomeBeforeTheDataIsTheOutcomeOfTheRequest)
{
    auto faults = [](auto fill) {
        sim::DeviceFaults made;
        fill(made);
        return made;
    };
    const BeforeDataCase cases[] = {
        {"a plain write", {}, kOut, 0xB0, 0, 16, 0},
        {"a write stalled by number", faults([](auto& f) { f.stallRequests = {1}; }), kOut, 0xB0, 0, 16,
         sim::kHostTransferStalled},
        {"a write stalled by kind", faults([](auto& f) { f.stallKinds = {sim::RequestKind::Write}; }), kOut, 0xB0, 0,
         16, sim::kHostTransferStalled},
        {"a read stalled by kind, the write not", faults([](auto& f) { f.stallKinds = {sim::RequestKind::Read}; }),
         kOut, 0xB0, 0, 16, 0},
        {"a write of 513 bytes", {}, kOut, 0xB0, 0, 513, sim::kHostTransferStalled},
        {"a write with wValue", {}, kOut, 0xB0, 1, 16, sim::kHostTransferStalled},
        {"an unknown request", {}, kOut, 0xB7, 0, 16, sim::kHostTransferStalled},
        {"the device stops answering", faults([](auto& f) { f.unplugAtRequest = 1; }), kOut, 0xB0, 0, 16,
         sim::kHostDeviceGone},
        // Decided only once the request took effect: the data crosses first.
        {"a lost status stage", faults([](auto& f) { f.lostStatus = {1}; }), kOut, 0xB0, 0, 16, 0},
    };
    for (const BeforeDataCase& c : cases) {
        SCOPED_TRACE(c.what);
        sim::EmulatedDeviceOptions options;
        options.faults = c.faults;
        sim::LoaderModeDevice& device = sim::plugInLoaderDevice(options);
        RawLink link(device, 1024);
        nQVKORD100::tTransferParameterUSBControl request;
        request.bmRequestType = c.requestType;
        request.bRequest = c.request;
        request.wValue = c.value;
        request.length = static_cast<uint16_t>(c.length);
        request.data = link.buffer;

        EXPECT_EQ(device.hardware().outcomeBeforeData(request), c.expected);
        tStatus served = link.send(c.requestType, c.request, c.value, 0x0200, c.length, link.buffer);
        if (c.expected < 0) EXPECT_EQ(served, c.expected);
        EXPECT_EQ(device.hardware().requestCount(), 1u);  // asking changed nothing
        if (device.hardware().current() != nullptr) device.hardware().unplug();
    }
}

}  // namespace
