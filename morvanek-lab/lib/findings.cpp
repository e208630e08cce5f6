#include "findings.h"

#include <algorithm>

#include <fmt/format.h>

#include "deviceStory.h"

namespace lab {

namespace {

void writesThatDidNotTake(const DeviceRecord& device, std::vector<Finding>& findings)
{
    bool identityStaysDamaged = false;
    for (const WriteNotTaken& write : device.writesNotTaken) {
        findings.push_back({device.name, fmt::format("request #{} wrote {} at 0x{:04X}, but the flash holds {}: without "
                                                     "an erase, programming can only clear bits",
                                                     write.sequence, hexBytesText(write.written), write.address,
                                                     hexBytesText(write.stored))});
        if (device.layout == nullptr) continue;
        uint16_t offset = static_cast<uint16_t>(write.address - device.layout->identityPage);
        if (offset == 0x1F0 || offset == 0x1F8) identityStaysDamaged = true;
    }
    if (identityStaysDamaged)
        findings.push_back({device.name, "the identity block did not take its repair: every update will read the same "
                                         "damaged block and write it again"});
}

// An update that stopped short (no restart) and left nothing in the event log.
void silentEnds(const RunRecord& record, int index, std::vector<Finding>& findings)
{
    const DeviceRecord& device = record.devices[static_cast<size_t>(index)];
    std::vector<UpdateStory> stories = tellDeviceStory(record, index);
    for (const UpdateStory& story : stories) {
        if (story.requests == 0 || story.restarted || !story.logLines.empty()) continue;
        bool unplugged = false;
        for (size_t r = 0; r < device.trace.size(); ++r) {
            if (device.updateOf[r] == story.index && device.trace[r].outcome == sim::kHostDeviceGone) unplugged = true;
        }
        if (unplugged) continue;
        std::string why = story.opensRefused.empty() ? "" : "; the image could not be opened: " + story.opensRefused.front();
        if (story.imagesOpened.empty() && story.opensRefused.empty() && story.identityWrites.empty())
            why = "; it stopped after reading the identity block";
        findings.push_back(
            {device.name, fmt::format("update {} ended after {} request(s) without a restart and without any event-log "
                                      "message{}",
                                      story.index + 1, story.requests, why)});
    }
}

}  // namespace

std::vector<Finding> findFindings(const RunRecord& record)
{
    std::vector<Finding> findings;
    for (size_t i = 0; i < record.devices.size(); ++i) {
        const DeviceRecord& device = record.devices[i];
        writesThatDidNotTake(device, findings);
        for (const std::string& note : device.notes) findings.push_back({device.name, note});
        silentEnds(record, static_cast<int>(i), findings);
    }
    for (const std::string& misuse : record.misuse) findings.push_back({"", "misuse of the host or kernel: " + misuse});
    return findings;
}

}  // namespace lab
