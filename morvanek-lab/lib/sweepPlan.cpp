#include "sweepPlan.h"

#include <algorithm>
#include <cctype>
#include <map>

#include <fmt/format.h>

#include "deviceStory.h"

namespace lab {

namespace {

using Document = ScenarioDocument;
using Ending = FaultExpectation::Ending;

// What the faults inject, and what the module makes of them.
constexpr int32_t kStalled = sim::kHostTransferStalled;
constexpr int32_t kGone = sim::kHostDeviceGone;
constexpr int32_t kReleaseFailure = sim::kHostFailure;
constexpr const char* kAccessDenied = "0xC0000022";
constexpr const char* kInsufficientResources = "0xC000009A";
constexpr const char* kBufferOverflow = "0x80000005";
constexpr const char* kDeviceDataError = "0xC000009C";
constexpr const char* kIoDeviceError = "0xC0000185";
constexpr int kLineImageNotOpened = 385;
constexpr int kFileStandardInformation = 5;
constexpr int32_t kImageRefused = -50150;
constexpr int32_t kImageReadFailed = -50207;
constexpr int32_t kUnverified = -50152;
constexpr uint32_t kBlockSize = 512;
constexpr uint8_t kChangedImageSeed = 0xA5;

Document& objectField(Document& object, const char* name)
{
    Document& field = object[name];
    if (!field.is_object()) field = Document::object();
    return field;
}

// Adds to a field that holds a list, or a single value taken as a list of one.
void append(Document& object, const char* name, Document item)
{
    Document& field = object[name];
    if (field.is_null()) field = Document::array();
    if (!field.is_array()) {
        Document list = Document::array();
        list.push_back(field);
        field = list;
    }
    field.push_back(std::move(item));
}

std::string hex16(uint32_t value)
{
    return fmt::format("0x{:04X}", value);
}

std::string folded(std::string text)
{
    for (char& c : text) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
    return text;
}

std::string withoutObjectPrefix(const std::string& path)
{
    return path.rfind("\\??\\", 0) == 0 ? path.substr(4) : path;
}

// One request of the clean run, and where it stands in its update.
struct RequestPlace {
    size_t device = 0;
    size_t index = 0;  // in the trace
    const sim::RequestRecord* request = nullptr;
    int update = 0;
    int step = 0;
    bool programming = false;  // at or after the update's first erase
};

class Planner {
public:
    Planner(const Document& document, const RunRecord& clean) : clean_(clean), base_(document)
    {
        base_.erase("expect");  // a fault changes the ending the scenario expects
        if (!base_.contains("steps")) base_["steps"] = Document::array({"load", "start", "stop", "unload"});
        for (size_t d = 0; d < clean_.devices.size(); ++d) placeRequests(d);
    }

    void plan(SweepKind kind)
    {
        switch (kind) {
        case SweepKind::failedRequest:
        case SweepKind::unplug:
        case SweepKind::lostStatus:
            for (const RequestPlace& place : requests_) requestFault(kind, place);
            break;
        case SweepKind::readCorruption:
        case SweepKind::stuckBits:
        case SweepKind::shortRead:
            for (const RequestPlace& place : requests_) blockFault(kind, place);
            break;
        case SweepKind::deadErase:
            for (const RequestPlace& place : requests_) deadErase(place);
            break;
        case SweepKind::allocation:
            allocations();
            break;
        case SweepKind::releaseFailure:
            releases();
            break;
        case SweepKind::registryOpen:
        case SweepKind::registryQuery:
        case SweepKind::registryOverflow:
            registryCalls(kind);
            break;
        case SweepKind::fileRead:
        case SweepKind::fileShortRead:
            fileReads(kind);
            break;
        case SweepKind::imageChange:
            imageChanges();
            break;
        case SweepKind::fileOpen:
            fileOpens();
            break;
        case SweepKind::fileSizeQuery:
            sizeQueries();
            break;
        }
    }

    std::vector<FaultRun> runs;

private:
    FaultRun& add(SweepKind kind, std::string position)
    {
        runs.push_back(FaultRun{kind, std::move(position), base_, {}});
        return runs.back();
    }

    static Document& deviceFaults(FaultRun& run, size_t device)
    {
        return objectField(run.scenario["devices"][device], "faults");
    }

    const DeviceRecord& device(size_t index) const { return clean_.devices[index]; }

    void placeRequests(size_t d)
    {
        const DeviceRecord& entry = device(d);
        if (entry.layout == nullptr) return;
        std::map<int, bool> erased;  // by update
        for (size_t i = 0; i < entry.trace.size(); ++i) {
            RequestPlace place;
            place.device = d;
            place.index = i;
            place.request = &entry.trace[i];
            place.update = i < entry.updateOf.size() ? entry.updateOf[i] : 0;
            place.step = i < entry.stepOf.size() ? entry.stepOf[i] : 0;
            if (place.request->kind == sim::RequestKind::Erase) erased[place.update] = true;
            place.programming = erased[place.update];
            // A request that failed already is no place for another failure.
            if (place.request->outcome >= 0) requests_.push_back(place);
        }
    }

    std::string describe(const RequestPlace& place) const
    {
        return fmt::format("{} request {} ({})", device(place.device).name, place.request->sequence,
                           requestText(*place.request));
    }

    // A request failure ends the update without a message while the identity
    // is read and repaired, and with line 451 and its status once programming began.
    static FaultExpectation requestEnding(const RequestPlace& place, int32_t status)
    {
        FaultExpectation expected;
        expected.device = static_cast<int>(place.device);
        expected.update = place.update;
        expected.ending = place.programming ? Ending::failsLogged : Ending::failsSilently;
        if (place.programming) expected.status = status;
        return expected;
    }

    void requestFault(SweepKind kind, const RequestPlace& place)
    {
        const DeviceRecord& entry = device(place.device);
        uint64_t sequence = place.request->sequence;
        if (kind == SweepKind::unplug && entry.options.faults.unplugAtRequest != 0) return;  // the scenario's own
        FaultRun& run = add(kind, describe(place));
        Document& faults = deviceFaults(run, place.device);
        if (kind == SweepKind::failedRequest) {
            append(faults, "stallRequests", sequence);
            run.expected = requestEnding(place, kStalled);
        } else if (kind == SweepKind::lostStatus) {
            append(faults, "lostStatus", sequence);
            run.expected = requestEnding(place, kStalled);
        } else {
            faults["unplugAtRequest"] = sequence;
            // Plugged in again right after the step in which it went: the next update must end as a clean one.
            Document& steps = run.scenario["steps"];
            Document plugIn = {{"do", "plugIn"}, {"device", entry.name}};
            size_t after = std::min(static_cast<size_t>(place.step) + 1, steps.size());
            steps.insert(steps.begin() + static_cast<std::ptrdiff_t>(after), plugIn);
            run.expected = requestEnding(place, kGone);
            // Cut between the writes of an identity repair, the block keeps half of it, which the next
            // update does not repair again: the device stays in loader mode. The table shows it.
            bool identityWrite = !place.programming && place.request->kind == sim::RequestKind::Write;
            if (!identityWrite) run.expected.finalMode = entry.mode;
            run.expected.finalModeAfterAnotherUpdate = true;
        }
    }

    // The blocks of the image: writes after the update's first erase at a
    // block boundary of the firmware area.
    bool isBlock(const RequestPlace& place) const
    {
        const sim::RequestRecord& request = *place.request;
        const sim::LoaderFlashLayout& layout = *device(place.device).layout;
        return place.programming && request.kind == sim::RequestKind::Write && request.wIndex >= layout.firmwareBase &&
               (request.wIndex - layout.firmwareBase) % kBlockSize == 0 && request.data.size() == request.length;
    }

    // Whether the clean run read the whole block back, every read succeeding:
    // only then does a fault in it end in a verification failure rather than
    // in the failure of a later read.
    bool readBackComplete(const RequestPlace& place) const
    {
        const DeviceRecord& entry = device(place.device);
        uint32_t covered = 0;
        for (size_t i = place.index + 1; i < entry.trace.size() && covered < place.request->length; ++i) {
            const sim::RequestRecord& next = entry.trace[i];
            if (next.kind != sim::RequestKind::Read || next.outcome < 0) return false;
            covered += next.length;
        }
        return covered >= place.request->length;
    }

    // A fault of a cell strikes the first time the cell is programmed in the device's life.
    bool firstProgramming(const RequestPlace& place) const
    {
        const DeviceRecord& entry = device(place.device);
        for (size_t i = 0; i < place.index; ++i) {
            const sim::RequestRecord& earlier = entry.trace[i];
            if (earlier.kind == sim::RequestKind::Write && earlier.wIndex == place.request->wIndex) return false;
        }
        return true;
    }

    void blockFault(SweepKind kind, const RequestPlace& place)
    {
        if (!isBlock(place) || !firstProgramming(place)) return;
        const sim::RequestRecord& write = *place.request;
        const DeviceRecord& entry = device(place.device);
        uint32_t block = (write.wIndex - entry.layout->firmwareBase) / kBlockSize;
        std::string where = fmt::format("{} block {} at {}", entry.name, block, hex16(write.wIndex));

        FaultExpectation verification;
        verification.device = static_cast<int>(place.device);
        verification.update = place.update;
        verification.ending = Ending::failsLogged;
        verification.status = kUnverified;
        verification.verificationLine = write.length == kBlockSize ? 421 : 436;
        verification.verificationBlock = block;

        if (kind == SweepKind::readCorruption) {
            uint32_t offset = write.length / 2;
            FaultRun& run = add(kind, fmt::format("{}, byte {}", where, offset));
            append(deviceFaults(run, place.device), "readCorruptions",
                   Document{{"address", hex16(write.wIndex + offset)}, {"xor", 1}});
            if (readBackComplete(place)) run.expected = verification;
        } else if (kind == SweepKind::stuckBits) {
            // A bit the image sets: after the erase it stays 0 and the block cannot verify.
            for (uint32_t step = 0; step < write.length; ++step) {
                uint32_t offset = (write.length / 2 + step) % write.length;
                uint8_t byte = write.data[offset];
                if (byte == 0) continue;
                uint8_t mask = static_cast<uint8_t>(byte & -byte);
                FaultRun& run = add(kind, fmt::format("{}, bit mask 0x{:02X} of byte {}", where, mask, offset));
                append(deviceFaults(run, place.device), "stuckBits",
                       Document{{"address", hex16(write.wIndex + offset)}, {"mask", mask}});
                if (readBackComplete(place)) run.expected = verification;
                return;
            }
        } else {
            // The first read-back of the block brings half of what was asked for, reported as success:
            // what did not arrive must not pass for the block's bytes.
            size_t next = place.index + 1;
            if (next >= entry.trace.size()) return;
            const sim::RequestRecord* readBack = &entry.trace[next];
            if (readBack->kind != sim::RequestKind::Read || readBack->outcome < 0 || readBack->length < 2) return;
            uint64_t readNumber = static_cast<uint64_t>(
                std::count_if(entry.trace.begin(), entry.trace.begin() + static_cast<std::ptrdiff_t>(next) + 1,
                              [](const sim::RequestRecord& r) { return r.kind == sim::RequestKind::Read; }));
            FaultRun& run = add(kind, fmt::format("{}, read {} ({})", where, readNumber, requestText(*readBack)));
            append(deviceFaults(run, place.device), "shortReads",
                   Document{{"read", readNumber}, {"bytes", readBack->length / 2}});
            if (readBackComplete(place)) run.expected = verification;
        }
    }

    void deadErase(const RequestPlace& place)
    {
        const sim::RequestRecord& erase = *place.request;
        if (erase.kind != sim::RequestKind::Erase) return;
        const DeviceRecord& entry = device(place.device);
        // A page's erase is dead over the device's life: its first erase is the place.
        for (size_t i = 0; i < place.index; ++i) {
            if (entry.trace[i].kind == sim::RequestKind::Erase && entry.trace[i].wValue == erase.wValue) return;
        }
        FaultRun& run = add(SweepKind::deadErase, describe(place));
        append(deviceFaults(run, place.device), "deadErases", erase.wValue);
        // On a blank page an erase that does nothing does no harm; elsewhere the read-back must catch it.
        uint32_t start = erase.wValue * kBlockSize;
        bool blank = std::all_of(entry.flashBefore.begin() + start, entry.flashBefore.begin() + start + kBlockSize,
                                 [](uint8_t byte) { return byte == 0xFF; });
        // A dead erase stays dead: a later update's erase of the page meets programmed bytes.
        auto erases = std::count_if(entry.trace.begin(), entry.trace.end(), [&](const sim::RequestRecord& r) {
            return r.kind == sim::RequestKind::Erase && r.wValue == erase.wValue;
        });
        run.expected.device = static_cast<int>(place.device);
        if (blank && erases == 1) run.expected.finalMode = entry.mode;
    }

    void allocations()
    {
        for (size_t n = 1; n <= clean_.allocationAttempts.size(); ++n) {
            FaultRun& run = add(SweepKind::allocation,
                                fmt::format("allocation {} ({})", n, clean_.allocationAttempts[n - 1]));
            append(objectField(run.scenario, "host"), "failAllocations", n);
        }
    }

    // A failed release must change nothing: the device ends as it would have.
    void releases()
    {
        for (size_t d = 0; d < clean_.devices.size(); ++d) {
            const DeviceRecord& entry = device(d);
            if (entry.layout == nullptr || entry.trace.empty()) continue;
            for (const char* release : {"failFreeBuffer", "failCloseStream"}) {
                FaultRun& run = add(SweepKind::releaseFailure, fmt::format("{} {}", entry.name, release));
                deviceFaults(run, d)[release] = kReleaseFailure;
                run.expected.device = static_cast<int>(d);
                run.expected.finalMode = entry.mode;
            }
        }
    }

    std::string ownerText(const Owner& owner) const
    {
        if (owner.device < 0) return "";
        return fmt::format(", {} update {}", device(static_cast<size_t>(owner.device)).name, owner.update + 1);
    }

    void registryCalls(SweepKind kind)
    {
        using Kind = sim::kernel::RegistryCall::Kind;
        bool opens = kind == SweepKind::registryOpen;
        std::map<std::string, uint64_t> counts;
        for (size_t c = 0; c < clean_.registryCalls.size(); ++c) {
            const sim::kernel::RegistryCall& call = clean_.registryCalls[c];
            if ((call.kind == Kind::createKey) != opens || call.keyPath.empty()) continue;
            uint64_t number = ++counts[folded(call.keyPath) + "\n" + folded(call.valueName)];
            Owner owner = c < clean_.registryCallOwners.size() ? clean_.registryCallOwners[c] : Owner{};
            Document fault = {{"key", call.keyPath}};
            std::string position;
            if (opens) {
                position = fmt::format("open {} of {}{}", number, call.keyPath, ownerText(owner));
            } else {
                fault["value"] = call.valueName;
                position = fmt::format("query {} of {} in {}{}", number, call.valueName, call.keyPath, ownerText(owner));
            }
            fault["status"] = kind == SweepKind::registryOpen    ? kAccessDenied
                              : kind == SweepKind::registryQuery ? kInsufficientResources
                                                                 : kBufferOverflow;
            fault["number"] = number;
            FaultRun& run = add(kind, position);
            append(objectField(run.scenario, "registry"), "faults", fault);
        }
    }

    // The opens each update made, successful ones only, in order.
    std::vector<size_t> updateOpens(const Owner& owner) const
    {
        std::vector<size_t> opens;
        for (size_t o = 0; o < clean_.fileOpens.size(); ++o) {
            const FileOpenSeen& seen = clean_.fileOpens[o];
            if (seen.open.status >= 0 && seen.owner.device == owner.device && seen.owner.update == owner.update)
                opens.push_back(o);
        }
        return opens;
    }

    void fileReads(SweepKind kind)
    {
        for (size_t n = 1; n <= clean_.fileReads.size(); ++n) {
            const sim::kernel::FileReadRecord& read = clean_.fileReads[n - 1];
            if (read.status < 0) continue;
            auto open = std::find_if(clean_.fileOpens.begin(), clean_.fileOpens.end(),
                                     [&](const FileOpenSeen& seen) { return seen.open.handle == read.handle; });
            std::string file = open == clean_.fileOpens.end() ? "?" : withoutObjectPrefix(open->open.dosPath);
            FaultRun& run = add(kind, fmt::format("read {} ({} bytes of {}{})", n, read.length, file,
                                                  open == clean_.fileOpens.end() ? "" : ownerText(open->owner)));
            Document& faults = objectField(run.scenario, "fileFaults");
            if (kind == SweepKind::fileRead) {
                append(faults, "failRead", Document{{"number", n}, {"status", kDeviceDataError}});
            } else {
                append(faults, "shortReads", Document{{"number", n}, {"bytes", read.length / 2}});
            }
            // Reads of the programming open (the update's second) end the update with line 451 and -50207.
            if (open == clean_.fileOpens.end() || open->owner.device < 0) continue;
            if (!isProgrammingOpen(static_cast<size_t>(open - clean_.fileOpens.begin()))) continue;
            run.expected.device = open->owner.device;
            run.expected.update = open->owner.update;
            run.expected.ending = Ending::failsLogged;
            run.expected.status = kImageReadFailed;
        }
    }

    // The update restarted its device and logged nothing. A change of the
    // image would otherwise meet the update's own failure first.
    bool cleanSuccess(const Owner& owner) const
    {
        if (owner.device < 0) return false;
        const DeviceRecord& entry = device(static_cast<size_t>(owner.device));
        bool restarted = false;
        for (size_t i = 0; i < entry.trace.size(); ++i) {
            bool inUpdate = i < entry.updateOf.size() && entry.updateOf[i] == owner.update;
            if (inUpdate && entry.trace[i].kind == sim::RequestKind::Restart && entry.trace[i].outcome >= 0)
                restarted = true;
        }
        bool logged = std::any_of(clean_.eventLog.begin(), clean_.eventLog.end(), [&](const LogRecord& line) {
            return line.owner.device == owner.device && line.owner.update == owner.update;
        });
        return restarted && !logged;
    }

    // An update's second open is the one it programs from.
    bool isProgrammingOpen(size_t openIndex) const
    {
        const FileOpenSeen& seen = clean_.fileOpens[openIndex];
        if (seen.owner.device < 0) return false;
        std::vector<size_t> opens = updateOpens(seen.owner);
        return opens.size() >= 2 && openIndex != opens.front();
    }

    // The header read's open failing ends the update without a message; the
    // programming open's failing logs line 385.
    void fileOpens()
    {
        for (size_t n = 1; n <= clean_.fileOpens.size(); ++n) {
            const FileOpenSeen& seen = clean_.fileOpens[n - 1];
            if (seen.open.status < 0) continue;  // failed already
            FaultRun& run = add(SweepKind::fileOpen, fmt::format("open {} ({}{})", n, withoutObjectPrefix(seen.open.dosPath),
                                                                 ownerText(seen.owner)));
            append(objectField(run.scenario, "fileFaults"), "failOpen",
                   Document{{"number", n}, {"status", kAccessDenied}});
            if (seen.owner.device < 0) continue;
            run.expected.device = seen.owner.device;
            run.expected.update = seen.owner.update;
            if (isProgrammingOpen(n - 1)) {
                run.expected.ending = Ending::failsLogged;
                run.expected.line = kLineImageNotOpened;
            } else if (updateOpens(seen.owner).front() == n - 1) {
                run.expected.ending = Ending::failsSilently;
            }
        }
    }

    // The programming open's size query failing is a failed image read: line 451 with -50207.
    void sizeQueries()
    {
        size_t n = 0;
        for (const sim::kernel::FileInformationRecord& call : clean_.fileInformationCalls) {
            if (call.set || call.informationClass != kFileStandardInformation) continue;
            ++n;
            auto open = std::find_if(clean_.fileOpens.begin(), clean_.fileOpens.end(),
                                     [&](const FileOpenSeen& seen) { return seen.open.handle == call.handle; });
            bool known = open != clean_.fileOpens.end();
            FaultRun& run = add(SweepKind::fileSizeQuery,
                                fmt::format("size query {} ({}{})", n, known ? withoutObjectPrefix(open->open.dosPath) : "?",
                                            known ? ownerText(open->owner) : ""));
            append(objectField(run.scenario, "fileFaults"), "failSizeQuery",
                   Document{{"number", n}, {"status", kIoDeviceError}});
            if (!known || !isProgrammingOpen(static_cast<size_t>(open - clean_.fileOpens.begin()))) continue;
            run.expected.device = open->owner.device;
            run.expected.update = open->owner.update;
            run.expected.ending = Ending::failsLogged;
            run.expected.status = kImageReadFailed;
        }
    }

    // The image replaced after the header read, before the programming open:
    // once by another image of the same size, which must be what the device
    // then holds, and once by one too large, which must be refused.
    void imageChanges()
    {
        for (size_t d = 0; d < clean_.devices.size(); ++d) {
            const DeviceRecord& entry = device(d);
            if (entry.layout == nullptr) continue;
            for (int u = 0; u < std::max(entry.updates, 1); ++u) {
                std::vector<size_t> opens = updateOpens(Owner{static_cast<int>(d), u});
                if (opens.size() < 2) continue;
                bool succeeded = cleanSuccess(Owner{static_cast<int>(d), u});
                const FileOpenSeen& header = clean_.fileOpens[opens.front()];
                std::string file = withoutObjectPrefix(header.open.dosPath);
                size_t opensSoFar = 0;
                for (size_t o = 0; o <= opens.front(); ++o) {
                    const FileOpenSeen& seen = clean_.fileOpens[o];
                    if (seen.open.status >= 0 && seen.open.hostPath == header.open.hostPath) ++opensSoFar;
                }
                uint32_t room = entry.layout->identityPage - entry.layout->firmwareBase;
                for (bool tooLarge : {false, true}) {
                    size_t size = tooLarge ? room + 1 : header.open.bytes.size();
                    FaultRun& run = add(SweepKind::imageChange,
                                        fmt::format("{} update {}: {} replaced by {} bytes after the header read",
                                                    entry.name, u + 1, file, size));
                    Document change = {{"file", file},
                                       {"afterOpens", opensSoFar},
                                       {"generate", {{"size", size}, {"seed", kChangedImageSeed}}}};
                    append(objectField(run.scenario, "fileFaults"), "changeContent", change);
                    run.expected.device = static_cast<int>(d);
                    run.expected.update = u;
                    if (!succeeded) continue;  // its own failure comes first
                    // Another image of the same size must simply be what the device then holds, which the
                    // invariants check; one too large must be refused before anything is erased.
                    if (tooLarge) {
                        run.expected.ending = Ending::failsLogged;
                        run.expected.status = kImageRefused;
                    }
                }
            }
        }
    }

    const RunRecord& clean_;
    Document base_;
    std::vector<RequestPlace> requests_;
};

}  // namespace

std::vector<FaultRun> planFaultRuns(const ScenarioDocument& document, const RunRecord& clean,
                                    const std::vector<SweepKind>& kinds)
{
    Planner planner(document, clean);
    for (SweepKind kind : kinds) planner.plan(kind);
    return std::move(planner.runs);
}

}  // namespace lab
