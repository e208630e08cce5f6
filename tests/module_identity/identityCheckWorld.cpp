#include "identityCheckWorld.h"

#include <cstdio>
#include <utility>

#include "source/LoaderChannel.h"

namespace identity_test {

namespace {

// checkIdentity uses none of the table's state, so no table is built for it:
// the storage only gives the call an object address.
DeviceTable& tableWithoutState()
{
    alignas(DeviceTable) static unsigned char storage[sizeof(DeviceTable)];
    return *reinterpret_cast<DeviceTable*>(storage);
}

std::string hex16(uint16_t value)
{
    char text[8];
    std::snprintf(text, sizeof text, "%04X", value);
    return text;
}

std::string describe(const sim::RequestRecord& record)
{
    std::string text;
    if (record.kind == sim::RequestKind::Read) {
        text = "read " + hex16(record.wIndex) + " " + std::to_string(record.length);
    } else if (record.kind == sim::RequestKind::Write) {
        // A refused write never put its data on the bus.
        text = "write " + hex16(record.wIndex) + (record.data.empty() ? "" : " ");
        for (uint8_t byte : record.data) {
            char digits[4];
            std::snprintf(digits, sizeof digits, "%02X", byte);
            text += digits;
        }
    } else {
        return sim::describeRequest(record);
    }
    return record.outcome == 0 ? text : text + " failed";
}

}  // namespace

std::vector<std::string> afterIdentityReads(uint16_t identityPage, std::vector<std::string> more)
{
    std::vector<std::string> requests = {"read " + hex16(static_cast<uint16_t>(identityPage + 0x1F8)) + " 2",
                                         "read " + hex16(static_cast<uint16_t>(identityPage + 0x1F0)) + " 2",
                                         "read " + hex16(static_cast<uint16_t>(identityPage + 0x1FC)) + " 4"};
    requests.insert(requests.end(), more.begin(), more.end());
    return requests;
}

void IdentityCheckWorld::SetUp()
{
    WorldTest::SetUp();
    sim::kernel::registry().setString(kDeviceClassKey, "FVTPID", "4B0C");
}

void PrintTo(const IdentityCase& identityCase, std::ostream* out) { *out << identityCase.name; }

IdentityOutcome IdentityCheckWorld::runCheck(uint16_t loaderProductId, const sim::IdentityValues& identity,
                                             const std::vector<uint8_t>& bytesAt0C00, sim::DeviceFaults faults,
                                             tStatus entryStatus)
{
    sim::EmulatedDeviceOptions options;
    options.loaderProductId = loaderProductId;
    options.identity = identity;
    if (!bytesAt0C00.empty()) options.memory = {{0x0C00, bytesAt0C00}};
    options.faults = std::move(faults);
    sim::LoaderModeDevice& device = sim::makeEmulatedDevice(options)->plugIn(tree());

    IdentityOutcome outcome;
    LoaderChannel channel;
    openLoaderChannel(channel, &device, loaderProductId, outcome.status);
    EXPECT_EQ(outcome.status, 0) << "the channel must open for the check to be seen";
    outcome.status = entryStatus;
    tableWithoutState().checkIdentity(channel, outcome.vendorId, outcome.productId, outcome.serialNumber,
                                   outcome.status);
    closeLoaderChannel(channel);

    for (const sim::RequestRecord& record : device.hardware().trace) outcome.requests.push_back(describe(record));
    return outcome;
}

}  // namespace identity_test
