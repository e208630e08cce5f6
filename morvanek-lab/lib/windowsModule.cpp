#include "windowsModule.h"

#include <unistd.h>

#include <algorithm>
#include <iterator>
#include <fstream>

#include <fmt/format.h>

#include "regfile/regFileImport.h"
#include "regfile/registryText.h"
#include "scenarioError.h"
#include "sim/kernel/simKernel.h"

namespace lab {

namespace {

WindowsModule* gActive = nullptr;  // one module at a time, as in a real kernel

constexpr const char* kMachinePrefix = "\\Registry\\Machine\\";
constexpr const char* kCurrentVersionKey = "\\Registry\\Machine\\Software\\Microsoft\\Windows NT\\CurrentVersion";

WindowsModule& active()
{
    if (gActive == nullptr) throw LabError("the Windows engine was used after it ended");
    return *gActive;
}

bridge::Reader readerOf(const std::vector<uint8_t>& payload)
{
    return bridge::Reader(payload.data(), static_cast<uint32_t>(payload.size()));
}

uint32_t callForNumber(uint32_t kind, const std::function<void(bridge::Writer&)>& write)
{
    BridgePayload payload;
    write(payload.out());
    std::vector<uint8_t> answer = active().call(kind, payload.bytes());
    return readerOf(answer).u32();
}

// The exports, each a call into the Windows process.
NTSTATUS remoteDllInitialize(UNICODE_STRING* path)
{
    return static_cast<NTSTATUS>(callForNumber(bridge::kLoad, [&](bridge::Writer& out) {
        out.text16(reinterpret_cast<const uint16_t*>(path->Buffer), path->Length / 2);
    }));
}

NTSTATUS remoteDllUnload()
{
    return static_cast<NTSTATUS>(callForNumber(bridge::kUnload, [](bridge::Writer&) {}));
}

const uint8_t* remoteSetWdmLoadState(uint32_t state)
{
    BridgePayload payload;
    payload.out().u32(state);
    std::vector<uint8_t> answer = active().call(bridge::kSetWdmLoadState, payload.bytes());
    bridge::Reader in = readerOf(answer);
    const bool isNull = in.u32() != 0;
    in.bytes(const_cast<uint8_t*>(active().guid()), 16);
    return isNull ? nullptr : active().guid();
}

tStatus remoteCallSsMain(uint32_t reason)
{
    return static_cast<tStatus>(callForNumber(bridge::kWrapperMain, [&](bridge::Writer& out) { out.u32(reason); }));
}

void remoteSetLegacyLoadState(uint32_t state)
{
    BridgePayload payload;
    payload.out().u32(state);
    active().call(bridge::kSetLegacyLoadState, payload.bytes());
}

tSSVersion versionQuery(bool oldest, tStatus& status)
{
    BridgePayload payload;
    payload.out().u32(oldest ? 1 : 0);
    payload.out().u32(static_cast<uint32_t>(status));
    std::vector<uint8_t> answer = active().call(bridge::kVersionQuery, payload.bytes());
    bridge::Reader in = readerOf(answer);
    const uint32_t packed = in.u32();
    status = static_cast<tStatus>(in.u32());
    return tSSVersion(packed);
}

tSSVersion remoteGetCurrentVersion(tStatus& status)
{
    return versionQuery(false, status);
}

tSSVersion remoteGetOldestCompatibleVersion(tStatus& status)
{
    return versionQuery(true, status);
}

void remoteCompareVersion(const tSSVersion& newest, const tSSVersion& oldest, tStatus& status, const char* component)
{
    status = static_cast<tStatus>(callForNumber(bridge::kCompareVersion, [&](bridge::Writer& out) {
        out.u32(newest.packed());
        out.u32(oldest.packed());
        out.u32(static_cast<uint32_t>(status));
        out.text(component);
    }));
}

void remoteCompareFirmwareVersion(tSSVersion expected, uint16_t productId, tStatus& status)
{
    status = static_cast<tStatus>(callForNumber(bridge::kCompareFirmwareVersion, [&](bridge::Writer& out) {
        out.u32(expected.packed());
        out.u32(productId);
        out.u32(static_cast<uint32_t>(status));
    }));
}

std::string lower(std::string text)
{
    for (char& c : text) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
    return text;
}

// The entry of `folder` named `name` regardless of case, as Wine finds it.
std::filesystem::path childIgnoringCase(const std::filesystem::path& folder, const std::string& name)
{
    std::error_code error;
    for (const auto& entry : std::filesystem::directory_iterator(folder, error)) {
        if (lower(entry.path().filename().string()) == lower(name)) return entry.path();
    }
    return folder / name;
}

std::u16string relativeToMachine(const std::string& keyPath)
{
    const std::string prefix = kMachinePrefix;
    std::string relative = keyPath.size() > prefix.size() && lower(keyPath.substr(0, prefix.size())) == lower(prefix)
                               ? keyPath.substr(prefix.size())
                               : keyPath;
    return sim::utf8ToUtf16(relative);
}

}  // namespace

WindowsModule::WindowsModule(const Scenario& scenario, const std::map<char, std::filesystem::path>& drives,
                             BridgeServer::HostPath hostPath)
    : ModuleImage(LoadedElsewhere{})
{
    if (gActive != nullptr) throw LabError("a Windows engine run is already going on in this process");
    setup_ = WineSetup::find();
    process_ = std::make_unique<WineProcess>(setup_);
    server_ = std::make_unique<BridgeServer>(
        [this](uint32_t kind, const std::vector<uint8_t>& payload) { return call(kind, payload); }, std::move(hostPath));
    gActive = this;
    try {
        placeDrives(drives);
        prepareKernel(scenario);
    } catch (...) {
        gActive = nullptr;
        removeDrives();
        throw;
    }
    dllInitialize = &remoteDllInitialize;
    dllUnload = &remoteDllUnload;
    setWdmLoadStateAndGetGuid = &remoteSetWdmLoadState;
    callSsMain = &remoteCallSsMain;
    setLegacyLoadState = &remoteSetLegacyLoadState;
    getCurrentVersion = &remoteGetCurrentVersion;
    getOldestCompatibleVersion = &remoteGetOldestCompatibleVersion;
    compareVersion = &remoteCompareVersion;
    compareFirmwareVersion = &remoteCompareFirmwareVersion;
}

WindowsModule::~WindowsModule()
{
    if (!finished_) {
        try {
            finish();
        } catch (const std::exception&) {
            // The harness is gone; what it held went with its process.
        }
    }
    removeDrives();
    if (gActive == this) gActive = nullptr;
}

std::vector<uint8_t> WindowsModule::call(uint32_t kind, const std::vector<uint8_t>& payload)
{
    process_->send(kind, payload);
    for (;;) {
        BridgeMessage message = process_->receive();
        if (message.kind == bridge::kReply) return message.payload;
        bridge::Reader in = readerOf(message.payload);
        process_->send(bridge::kReply, server_->serve(message.kind, in));
    }
}

std::vector<std::string> WindowsModule::finish()
{
    if (finished_) return *finished_;
    finished_.emplace();
    std::vector<uint8_t> answer = call(bridge::kFinish, {});
    bridge::Reader in = readerOf(answer);
    for (uint32_t count = in.u32(); count != 0 && !in.broken(); --count) finished_->push_back(readText(in));
    const int exitCode = process_->wait();
    if (exitCode != 0) finished_->push_back(fmt::format("the Windows-side host ended with exit status {}", exitCode));
    removeDrives();
    return *finished_;
}

void WindowsModule::placeDrives(const std::map<char, std::filesystem::path>& drives)
{
    for (const auto& [letter, folder] : drives) {
        const char drive = static_cast<char>(std::tolower(static_cast<unsigned char>(letter)));
        if (drive != 'c') {
            // Any other letter is the scenario's folder itself.
            if (drive == 'z') throw LabError("drive Z: is Wine's view of the Linux root; use another letter");
            std::filesystem::path link = setup_.prefix / "dosdevices" / (std::string(1, drive) + ":");
            std::error_code error;
            std::filesystem::remove(link, error);
            std::filesystem::create_directory_symlink(std::filesystem::absolute(folder), link, error);
            if (error) throw LabError("cannot map drive " + std::string(1, letter) + ": in Wine: " + error.message());
            placedLinks_.push_back(link);
            continue;
        }
        // C: holds Wine's own system; the scenario's files are copied in.
        std::error_code error;
        for (auto it = std::filesystem::recursive_directory_iterator(folder, error);
             !error && it != std::filesystem::recursive_directory_iterator(); it.increment(error)) {
            if (!it->is_regular_file()) continue;
            std::filesystem::path target = setup_.prefix / "drive_c";
            const std::filesystem::path relative = std::filesystem::relative(it->path(), folder);
            for (auto part = relative.begin(); part != relative.end(); ++part) {
                target = childIgnoringCase(target, part->string());
                if (std::next(part) == relative.end()) break;  // the file itself
                if (!std::filesystem::exists(target)) {
                    std::filesystem::create_directory(target);
                    placedFolders_.push_back(target);
                }
            }
            std::filesystem::copy_file(it->path(), target, std::filesystem::copy_options::overwrite_existing);
            placedFiles_.push_back(target);
        }
        if (error) throw LabError("cannot copy drive C: into the Wine prefix: " + error.message());
    }
}

void WindowsModule::removeDrives()
{
    std::error_code ignored;
    for (const auto& file : placedFiles_) std::filesystem::remove(file, ignored);
    for (auto it = placedFolders_.rbegin(); it != placedFolders_.rend(); ++it) std::filesystem::remove(*it, ignored);
    for (const auto& link : placedLinks_) std::filesystem::remove(link, ignored);
    if (!regFile_.empty()) std::filesystem::remove(regFile_, ignored);
    placedFiles_.clear();
    placedFolders_.clear();
    placedLinks_.clear();
    regFile_.clear();
}

void WindowsModule::prepareKernel(const Scenario& scenario)
{
    sim::kernel::Registry& registry = sim::kernel::registry();
    const std::string text = sim::regfile::exportRegistryText(registry);
    std::vector<sim::regfile::RegistryEdit> edits = sim::regfile::parseRegistryExport(text, "the scenario's registry");
    BridgePayload payload;
    bridge::Writer& out = payload.out();
    const bool anything = std::any_of(edits.begin(), edits.end(), [](const auto& edit) {
        return edit.kind == sim::regfile::RegistryEdit::Kind::setValue ||
               edit.kind == sim::regfile::RegistryEdit::Kind::createKey;
    });
    if (anything) {
        // regedit reads the editor's own form best: UTF-16LE with a BOM, CRLF line ends.
        std::string crlf;
        for (char c : text) crlf += c == '\n' ? std::string("\r\n") : std::string(1, c);
        std::u16string wide = u"\uFEFF" + sim::utf8ToUtf16(crlf);
        char name[] = "/tmp/morvanek-lab-registry-XXXXXX";
        int fd = ::mkstemp(name);
        if (fd < 0) throw LabError("cannot write the scenario's registry for Wine");
        ::close(fd);
        regFile_ = std::string(name) + ".reg";
        std::filesystem::rename(name, regFile_);
        std::ofstream file(regFile_, std::ios::binary);
        for (char16_t unit : wide) {
            file.put(static_cast<char>(unit & 0xFF));
            file.put(static_cast<char>(unit >> 8));
        }
        if (!file) throw LabError("cannot write " + regFile_.string());
    }
    const std::wstring regFile = anything ? windowsPathOf(regFile_) : std::wstring();
    writeText16(out, std::u16string(regFile.begin(), regFile.end()));
    std::vector<const sim::regfile::RegistryEdit*> keys;
    std::vector<const sim::regfile::RegistryEdit*> values;
    for (const auto& edit : edits) {
        if (edit.kind == sim::regfile::RegistryEdit::Kind::createKey) keys.push_back(&edit);
        if (edit.kind == sim::regfile::RegistryEdit::Kind::setValue) values.push_back(&edit);
    }
    out.u32(static_cast<uint32_t>(keys.size()));
    for (const auto* key : keys) writeText16(out, relativeToMachine(key->keyPath));
    out.u32(static_cast<uint32_t>(values.size()));
    for (const auto* value : values) {
        writeText16(out, relativeToMachine(value->keyPath));
        writeText16(out, sim::utf8ToUtf16(value->valueName));
    }
    // Of what the module reads, only the system root is in a fresh Wine
    // prefix: a world without it must not borrow Wine's. (Its key stays:
    // every Windows has it, and Wine's cannot be deleted whole.)
    const bool systemRoot = registry.value(kCurrentVersionKey, "SystemRoot").has_value();
    out.u32(systemRoot ? 0 : 1);
    if (!systemRoot) {
        writeText16(out, relativeToMachine(kCurrentVersionKey));
        writeText16(out, u"SystemRoot");
    }
    // The scenario's kernel faults, which the harness injects at the same calls as the stand-in.
    out.u32(static_cast<uint32_t>(scenario.registry.faults.size()));
    for (const RegistryFaultPlan& fault : scenario.registry.faults) {
        writeText16(out, sim::utf8ToUtf16(fault.keyPath));
        out.u32(fault.valueName ? 1 : 0);
        writeText16(out, sim::utf8ToUtf16(fault.valueName.value_or("")));
        out.u32(static_cast<uint32_t>(fault.status));
        out.u64(fault.number);
    }
    const FileFaultPlan& files = scenario.fileFaults;
    out.u32(static_cast<uint32_t>(files.everyRead));
    out.u32(static_cast<uint32_t>(files.readNumbers.size()));
    for (const auto& [number, status] : files.readNumbers) {
        out.u32(number);
        out.u32(static_cast<uint32_t>(status));
    }
    out.u32(static_cast<uint32_t>(files.sizeQuery));
    out.u32(static_cast<uint32_t>(files.setPosition));
    std::vector<std::u16string> held;
    for (const DrivePlan& drive : scenario.drives) {
        for (const FilePlan& file : drive.files)
            if (file.heldOpenElsewhere) held.push_back(sim::utf8ToUtf16(std::string(1, drive.letter) + ":\\" + file.path));
    }
    out.u32(static_cast<uint32_t>(held.size()));
    for (const std::u16string& path : held) writeText16(out, path);
    for (const auto* calls : {&files.opens, &files.sizeQueries}) {
        out.u32(static_cast<uint32_t>(calls->size()));
        for (const CallFailurePlan& failure : *calls) {
            out.u64(failure.number);
            out.u32(static_cast<uint32_t>(failure.status));
            writeText16(out, sim::utf8ToUtf16(failure.file.value_or("")));
        }
    }
    std::vector<uint8_t> answer = call(bridge::kPrepareKernel, payload.bytes());
    bridge::Reader in = readerOf(answer);
    if (in.u32() == 0) throw LabError("the Windows engine could not set up the registry: " + readText(in));
}

}  // namespace lab
