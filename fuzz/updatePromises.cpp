#include "updatePromises.h"

#include <cstdio>

#include "sim/host/simHost.h"
#include "sim/kernel/simKernel.h"

namespace fuzzing {

namespace {

constexpr uint16_t kIdentityBlockOffset = 0x1F0;
constexpr uint16_t kIdentityBlockBytes = 16;
constexpr uint16_t kPageBytes = 512;
constexpr uint16_t kMarkerOffset = 6;

std::string hex(uint32_t value)
{
    char text[16];
    std::snprintf(text, sizeof text, "0x%04X", value);
    return text;
}

// What the flash programming has done so far in one update, byte by byte.
class ProgrammingState {
  public:
    void erasePage(uint16_t page)
    {
        for (uint32_t a = page * kPageBytes; a < (page + 1u) * kPageBytes && a < kFlashBytes; ++a) {
            written_[a] = -1;
            verified_[a] = false;
        }
        begun_ = true;
    }
    void write(uint16_t address, uint8_t value)
    {
        written_[address] = value;
        verified_[address] = false;
    }
    void read(uint16_t address, uint8_t value)
    {
        if (written_[address] == value) verified_[address] = true;
    }
    bool begun() const { return begun_; }
    int written(uint16_t address) const { return written_[address]; }
    bool verified(uint16_t address) const { return verified_[address]; }

  private:
    static constexpr uint32_t kFlashBytes = 0x10000;
    std::vector<int> written_ = std::vector<int>(kFlashBytes, -1);
    std::vector<bool> verified_ = std::vector<bool>(kFlashBytes, false);
    bool begun_ = false;
};

}  // namespace

std::vector<std::string> devicePromisesBroken(const sim::PhysicalDevice& device, const std::vector<uint8_t>& image)
{
    std::vector<std::string> broken;
    const sim::LoaderFlashLayout* layout = device.layout();
    if (layout == nullptr) return broken;
    const uint16_t identityPage = layout->identityPage;
    const uint16_t blockStart = static_cast<uint16_t>(identityPage + kIdentityBlockOffset);
    const uint32_t imageEnd = layout->firmwareBase + static_cast<uint32_t>(image.size());
    const uint16_t markerAddress = static_cast<uint16_t>(layout->firmwareBase + kMarkerOffset);

    ProgrammingState state;
    bool markerWritten = false;
    for (const sim::RequestRecord& request : device.trace) {
        if (request.outcome != 0) continue;  // refused: the flash did not change
        const std::string where = "request #" + std::to_string(request.sequence) + ": ";
        switch (request.kind) {
        case sim::RequestKind::Erase:
            if (request.wValue == identityPage / kPageBytes) broken.push_back(where + "the identity page was erased");
            state.erasePage(request.wValue);
            break;
        case sim::RequestKind::Write: {
            const bool marker = request.wIndex == markerAddress && request.data.size() == 2 &&
                                request.data[0] == 0xAA && request.data[1] == 0x55;
            if (marker) {
                uint32_t unverified = 0;
                uint32_t first = 0;
                for (uint32_t a = layout->firmwareBase; a < imageEnd; ++a) {
                    const uint8_t wanted = image[a - layout->firmwareBase];
                    if (a > 0xFFFF || state.written(static_cast<uint16_t>(a)) != wanted ||
                        !state.verified(static_cast<uint16_t>(a))) {
                        if (unverified++ == 0) first = a;
                    }
                }
                if (unverified != 0) {
                    broken.push_back(where + "the completion marker was written with " + std::to_string(unverified) +
                                     " image byte(s) not written and read back equal, the first at " + hex(first));
                }
                markerWritten = true;
                break;
            }
            for (size_t i = 0; i < request.data.size(); ++i) {
                const uint16_t a = static_cast<uint16_t>(request.wIndex + i);
                const bool inIdentityPage = a >= identityPage && a < identityPage + kPageBytes;
                const bool inIdentityBlock = a >= blockStart && a < blockStart + kIdentityBlockBytes;
                if (inIdentityPage && (!inIdentityBlock || state.begun())) {
                    broken.push_back(where + "the identity page was written at " + hex(a) +
                                     (state.begun() ? " after programming began" : " outside the identity block"));
                    break;
                }
                if (!inIdentityPage && (a < layout->firmwareBase || a >= imageEnd)) {
                    broken.push_back(where + "a write at " + hex(a) + " lies outside the image's range");
                    break;
                }
                state.write(a, request.data[i]);
            }
            break;
        }
        case sim::RequestKind::Read:
            for (size_t i = 0; i < request.data.size(); ++i) {
                state.read(static_cast<uint16_t>(request.wIndex + i), request.data[i]);
            }
            break;
        case sim::RequestKind::Restart:
            if (!markerWritten) broken.push_back(where + "a restart without a completion marker in this update");
            // The device comes back, in loader mode or as its product: a new update.
            state = ProgrammingState();
            markerWritten = false;
            break;
        case sim::RequestKind::Unknown:
            broken.push_back(where + "a request the loader does not know");
            break;
        }
    }
    return broken;
}

std::vector<std::string> leftoversAndMisuse()
{
    std::vector<std::string> problems = sim::Host::get().leftovers();
    for (const std::string& handle : sim::kernel::openHandleDescriptions())
        problems.push_back("open handle: " + handle);
    for (const std::string& misuse : sim::Host::get().misuse) problems.push_back("host misuse: " + misuse);
    for (const std::string& misuse : sim::kernel::misuseReports()) problems.push_back("kernel misuse: " + misuse);
    return problems;
}

}  // namespace fuzzing
