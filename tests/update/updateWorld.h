// A loader world with one emulated device that the module finds present at
// its start or arriving later, and the device's requests and the event log in
// forms that compare at a glance.
#pragma once

#include <algorithm>
#include <cstdio>
#include <functional>
#include <memory>
#include <string>
#include <tuple>
#include <vector>

#include "sim/device/enumeratedDevice.h"
#include "tests/support/loaderWorld.h"

namespace update_tests {

enum class Arrival { PresentAtStart, PluggedInLater };

constexpr uint16_t kProductId = 0x4B01;

inline std::string hex4(uint32_t value)
{
    char text[8];
    std::snprintf(text, sizeof text, "0x%04X", value);
    return text;
}

inline uint16_t identityPage(uint16_t loaderProductId)
{
    return loaderProductId == 0x4A10 ? 0x3600 : 0x7C00;
}

// One line per request the device was handed: "read 0x37F8 2", "write 0x0200 512", "erase 1", "restart"; a request
// that did not go through ends in " failed".
inline std::vector<std::string> requestLines(const sim::PhysicalDevice& device)
{
    std::vector<std::string> lines;
    for (const sim::RequestRecord& record : device.trace) {
        std::string line = sim::requestKindName(record.kind);
        if (record.kind == sim::RequestKind::Read || record.kind == sim::RequestKind::Write) {
            line += " " + hex4(record.wIndex) + " " + std::to_string(record.length);
        } else if (record.kind == sim::RequestKind::Erase) {
            line += " " + std::to_string(record.wValue);
        }
        lines.push_back(record.outcome < 0 ? line + " failed" : line);
    }
    return lines;
}

inline std::vector<std::string> joined(const std::vector<std::vector<std::string>>& parts)
{
    std::vector<std::string> all;
    for (const auto& part : parts) all.insert(all.end(), part.begin(), part.end());
    return all;
}

// The reads of vendor ID, product ID and serial number that open every update.
inline std::vector<std::string> identityReads(uint16_t loaderProductId)
{
    const uint16_t block = loaderProductId == 0x4A10 ? 0x37F0 : 0x7DF0;
    return {"read " + hex4(block + 8) + " 2", "read " + hex4(block) + " 2", "read " + hex4(block + 12) + " 4"};
}

// One block's write and its read-back in requests of at most 64 bytes.
inline std::vector<std::string> blockRequests(uint16_t address, uint32_t length)
{
    std::vector<std::string> lines = {"write " + hex4(address) + " " + std::to_string(length)};
    for (uint32_t done = 0; done < length; done += 64) {
        lines.push_back("read " + hex4(address + done) + " " + std::to_string(std::min(64u, length - done)));
    }
    return lines;
}

// The messages about the device of deviceWithIdentity(..., kProductId), location and text.
inline std::string updateFailed(tStatus status)
{
    return "source\\DeviceTable:451 - The firmware update failed.  Leaving device 5C1D 4B01 0001E240 in loader mode  "
           "Status = " + std::to_string(status);
}

inline std::string pathNotFound(tStatus status)
{
    return "source\\DeviceTable:355 - Failed to determine the path to the firmware.  Leaving device 5C1D 4B01 "
           "0001E240 in loader mode.  Status = " + std::to_string(status);
}

// Whole blocks are compared at line 421, the partial block at line 436.
inline std::string verificationFailed(int line, uint32_t block)
{
    return "source\\DeviceTable:" + std::to_string(line) + " - Flash write failed verification on page " +
           std::to_string(block) + ".";
}

class UpdateWorld : public testing_support::LoaderWorld {
protected:
    void TearDown() override
    {
        if (started_) {
            EXPECT_EQ(callSsMain(1), 0);
            EXPECT_EQ(module->dllUnload(), 0);
        }
        LoaderWorld::TearDown();
    }

    // Puts a loader-mode enumeration of the hardware into the tree, before or
    // after the module starts; prepare sees it before the module does.
    sim::LoaderModeDevice& run(const std::shared_ptr<sim::PhysicalDevice>& hardware, Arrival arrival,
                               const std::function<void(sim::LoaderModeDevice&)>& prepare = {})
    {
        auto loader = std::make_unique<sim::LoaderModeDevice>(hardware);
        if (prepare) prepare(*loader);
        if (arrival == Arrival::PluggedInLater) start();
        auto& plugged = static_cast<sim::LoaderModeDevice&>(tree().plugIn(std::move(loader)));
        if (arrival == Arrival::PresentAtStart) start();
        tree().deliverPendingEvents();
        return plugged;
    }

    // The event log, location and message; every entry must carry the loader's component, level and tag.
    std::vector<std::string> logLines()
    {
        std::vector<std::string> lines;
        for (const sim::LogEntry& entry : host().eventLog) {
            EXPECT_EQ(entry.component, "morvanek");
            EXPECT_EQ(entry.level, 10u);
            EXPECT_EQ(entry.tag, "[morvaneLoader]");
            lines.push_back(entry.location + entry.message);
        }
        return lines;
    }

private:
    void start()
    {
        EXPECT_EQ(startModule(), 0);
        started_ = true;
    }

    bool started_ = false;
};

// Every case runs with the device present at the start and plugged in later.
template <typename Case>
class WithArrival : public UpdateWorld, public ::testing::WithParamInterface<std::tuple<Case, Arrival>> {};

inline const auto kArrivals = ::testing::Values(Arrival::PresentAtStart, Arrival::PluggedInLater);

struct CaseAndArrival {
    template <typename Info>
    std::string operator()(const Info& info) const
    {
        const bool present = std::get<1>(info.param) == Arrival::PresentAtStart;
        return std::string(std::get<0>(info.param).name) + (present ? "_PresentAtStart" : "_PluggedInLater");
    }
};

}  // namespace update_tests
