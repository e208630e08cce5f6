#include "UpdateWorld.h"

#include <algorithm>
#include <cstdio>

namespace update_tests {

namespace {

constexpr const char* kDevice = "5C1D 4B01 0001E240";

std::string hex4(uint32_t value)
{
    char text[8];
    std::snprintf(text, sizeof text, "0x%04X", value);
    return text;
}

}  // namespace

std::string arrivalName(Arrival arrival)
{
    return arrival == Arrival::PresentAtStart ? "PresentAtStart" : "PluggedInLater";
}

void PrintTo(const LogLine& line, std::ostream* out)
{
    *out << '"' << line.location << line.message << '"';
}

std::vector<std::string> requestLines(const sim::PhysicalDevice& device)
{
    std::vector<std::string> lines;
    for (const sim::RequestRecord& record : device.trace) {
        std::string line = sim::requestKindName(record.kind);
        if (record.kind == sim::RequestKind::Read || record.kind == sim::RequestKind::Write) {
            line += " " + hex4(record.wIndex) + " " + std::to_string(record.length);
        } else if (record.kind == sim::RequestKind::Erase) {
            line += " " + std::to_string(record.wValue);
        }
        if (record.outcome < 0) line += " failed";
        lines.push_back(line);
    }
    return lines;
}

std::vector<std::string> identityReads(uint16_t loaderProductId)
{
    const uint16_t block = loaderProductId == 0x4A10 ? 0x37F0 : 0x7DF0;
    return {"read " + hex4(block + 8) + " 2", "read " + hex4(block) + " 2", "read " + hex4(block + 12) + " 4"};
}

std::vector<std::string> blockRequests(uint16_t address, uint32_t length)
{
    std::vector<std::string> lines = {"write " + hex4(address) + " " + std::to_string(length)};
    for (uint32_t done = 0; done < length; done += 64) {
        lines.push_back("read " + hex4(address + done) + " " + std::to_string(std::min(64u, length - done)));
    }
    return lines;
}

std::vector<std::string> joined(const std::vector<std::vector<std::string>>& parts)
{
    std::vector<std::string> all;
    for (const auto& part : parts) all.insert(all.end(), part.begin(), part.end());
    return all;
}

LogLine updateFailed(tStatus status)
{
    return {"source\\DeviceTable:451 - ",
            std::string("The firmware update failed.  Leaving device ") + kDevice + " in loader mode  Status = " +
                std::to_string(status)};
}

LogLine pathNotFound(tStatus status)
{
    return {"source\\DeviceTable:355 - ",
            std::string("Failed to determine the path to the firmware.  Leaving device ") + kDevice +
                " in loader mode.  Status = " + std::to_string(status)};
}

LogLine blockDiffers(uint32_t block)
{
    return {"source\\DeviceTable:421 - ", "Flash write failed verification on page " + std::to_string(block) + "."};
}

LogLine partialBlockDiffers(uint32_t block)
{
    return {"source\\DeviceTable:436 - ", "Flash write failed verification on page " + std::to_string(block) + "."};
}

void UpdateWorld::TearDown()
{
    if (started_) {
        EXPECT_EQ(callSsMain(1), 0);
        EXPECT_EQ(module->dllUnload(), 0);
    }
    LoaderWorld::TearDown();
}

sim::LoaderModeDevice& UpdateWorld::run(const std::shared_ptr<sim::PhysicalDevice>& hardware, Arrival arrival,
                                        const std::function<void(sim::LoaderModeDevice&)>& prepare)
{
    auto loader = std::make_unique<sim::LoaderModeDevice>(hardware);
    if (prepare) prepare(*loader);
    if (arrival == Arrival::PluggedInLater) {
        EXPECT_EQ(startModule(), 0);
        started_ = true;
    }
    sim::LoaderModeDevice& plugged = static_cast<sim::LoaderModeDevice&>(tree().plugIn(std::move(loader)));
    if (arrival == Arrival::PresentAtStart) {
        EXPECT_EQ(startModule(), 0);
        started_ = true;
    }
    tree().deliverPendingEvents();
    return plugged;
}

std::vector<LogLine> UpdateWorld::logLines()
{
    std::vector<LogLine> lines;
    for (const sim::LogEntry& entry : host().eventLog) {
        EXPECT_EQ(entry.component, "morvanek");
        EXPECT_EQ(entry.level, 10u);
        EXPECT_EQ(entry.tag, "[morvaneLoader]");
        lines.push_back({entry.location, entry.message});
    }
    return lines;
}

}  // namespace update_tests
