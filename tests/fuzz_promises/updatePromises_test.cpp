// The end-to-end fuzzer's checks must catch an update that breaks the
// loader's promises, and pass one that keeps them: request traces written by
// hand, each the story of one update on loader 0x4A10 (image at 0x0200,
// identity page 0x3600, identity block 0x37F0).
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "fuzz/updatePromises.h"

namespace {

using sim::RequestKind;

struct Request {
    RequestKind kind;
    uint16_t value;  // the page of an erase
    uint16_t index;  // the address of a read or write
    std::vector<uint8_t> data;
    tStatus outcome = 0;
};

const std::vector<uint8_t> kImage = {1, 2, 3, 4, 5, 6, 0xFF, 0xFF, 9, 10};
const Request kEraseImagePage = {RequestKind::Erase, 1, 0, {}};
const Request kWriteImage = {RequestKind::Write, 0, 0x0200, kImage};
const Request kReadImageBack = {RequestKind::Read, 0, 0x0200, kImage};
const Request kMarker = {RequestKind::Write, 0, 0x0206, {0xAA, 0x55}};
const Request kRestart = {RequestKind::Restart, 0, 0, {}};
const Request kRepairIdentity = {RequestKind::Write, 0, 0x37F0, {0x4B, 0x01}};

struct Story {
    const char* name;
    std::vector<Request> requests;
    const char* broken;  // words of the one broken promise; null: none
};

std::vector<std::string> check(const std::vector<Request>& requests)
{
    sim::EmulatedDeviceOptions options;
    options.loaderProductId = 0x4A10;
    auto device = sim::makeEmulatedDevice(options);
    uint64_t sequence = 0;
    for (const Request& request : requests) {
        sim::RequestRecord record;
        record.sequence = ++sequence;
        record.kind = request.kind;
        record.wValue = request.value;
        record.wIndex = request.index;
        record.length = static_cast<uint32_t>(request.data.size());
        record.data = request.data;
        record.outcome = request.outcome;
        device->trace.push_back(record);
    }
    return fuzzing::devicePromisesBroken(*device, kImage);
}

TEST(UpdatePromises, AreBrokenOnlyByAnUpdateThatBreaksThem)
{
    const std::vector<uint8_t> readWrong = {1, 2, 3, 4, 5, 6, 0xFF, 0xFF, 9, 11};
    const Story stories[] = {
        {"a whole update", {kRepairIdentity, kEraseImagePage, kWriteImage, kReadImageBack, kMarker, kRestart}, nullptr},
        {"a failed update without marker or restart", {kEraseImagePage, kWriteImage}, nullptr},
        {"two updates, the second after the first came back",
         {kEraseImagePage, kWriteImage, kReadImageBack, kMarker, kRestart, kEraseImagePage, kWriteImage, kReadImageBack,
          kMarker, kRestart},
         nullptr},
        {"a refused erase of the identity page", {{RequestKind::Erase, 27, 0, {}, -52002}}, nullptr},
        {"the marker after a read-back that differed",
         {kEraseImagePage, kWriteImage, {RequestKind::Read, 0, 0x0200, readWrong}, kMarker},
         "1 image byte(s) not written and read back equal, the first at 0x0209"},
        {"the marker without a read-back", {kEraseImagePage, kWriteImage, kMarker}, "10 image byte(s)"},
        {"the marker after a write following the read-back",
         {kEraseImagePage, kWriteImage, kReadImageBack, kWriteImage, kMarker},
         "10 image byte(s)"},
        {"the marker over an erase after the read-back",
         {kEraseImagePage, kWriteImage, kReadImageBack, kEraseImagePage, kMarker},
         "10 image byte(s)"},
        {"the marker for an image never written", {kMarker}, "10 image byte(s)"},
        {"the identity page erased", {{RequestKind::Erase, 27, 0, {}}}, "the identity page was erased"},
        {"the identity block written after programming began",
         {kEraseImagePage, kRepairIdentity},
         "written at 0x37F0 after programming began"},
        {"the identity page written outside its block",
         {{RequestKind::Write, 0, 0x3600, {0}}},
         "written at 0x3600 outside the identity block"},
        {"a write past the image",
         {kEraseImagePage, {RequestKind::Write, 0, 0x0208, {9, 10, 11}}},
         "a write at 0x020A lies outside the image's range"},
        {"a write below the firmware base", {{RequestKind::Write, 0, 0x0100, {0}}}, "0x0100 lies outside"},
        {"a restart without the marker",
         {kEraseImagePage, kWriteImage, kReadImageBack, kRestart},
         "a restart without a completion marker"},
        {"a request the loader does not know", {{RequestKind::Unknown, 0, 0, {}}}, "does not know"},
    };
    for (const Story& story : stories) {
        SCOPED_TRACE(story.name);
        const std::vector<std::string> broken = check(story.requests);
        if (story.broken == nullptr) {
            EXPECT_EQ(broken, std::vector<std::string>{});
        } else {
            ASSERT_EQ(broken.size(), 1u) << ::testing::PrintToString(broken);
            EXPECT_NE(broken[0].find(story.broken), std::string::npos) << broken[0];
        }
    }
}

}  // namespace
