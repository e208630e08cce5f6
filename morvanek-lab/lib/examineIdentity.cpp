#include <fstream>
#include <iterator>
#include <regex>

#include <fmt/format.h>
#include <nlohmann/json.hpp>

#include "deviceStory.h"
#include "examine.h"
#include "lab.h"
#include "scenarioError.h"

namespace lab {

namespace {

constexpr const char* kClassKey =
    "\\Registry\\Machine\\System\\CurrentControlSet\\Control\\Class\\{6D2F4B10-93A7-11CF-B4E8-00C05D7A3F21}";

// A device with the block in front of the module, the registry's FVTPID if
// given, and no system root: an update that gets past the identity check then
// stops at the image lookup and names the device it concluded in its message.
Scenario identityScenario(const InspectOptions& options, const std::vector<uint8_t>& bytes, uint16_t loader)
{
    Scenario scenario;
    scenario.file = options.file;
    if (options.fvtpid) scenario.registry.keys.push_back({kClassKey, {{"FVTPID", 1, sim::kernel::utf16leBytes(*options.fvtpid)}}});
    DevicePlan device;
    device.name = "device";
    device.options.name = device.name;
    device.options.loaderProductId = loader;
    if (bytes.size() == 16) {
        const sim::LoaderFlashLayout* layout = sim::findLoaderFlashLayout(loader);
        device.memory.push_back({static_cast<uint16_t>(layout->identityPage + 0x1F0), bytes});
    } else {
        device.flashDump = bytes;
    }
    scenario.devices.push_back(device);
    for (StepKind kind : {StepKind::load, StepKind::start, StepKind::stop, StepKind::unload}) {
        StepPlan step;
        step.kind = kind;
        step.reason = kind == StepKind::stop ? 1 : 0;
        step.registryPath = "\\Registry\\Machine\\System\\CurrentControlSet\\Services\\morvanek";
        scenario.steps.push_back(step);
    }
    return scenario;
}

struct Conclusion {
    bool accepted = false;
    uint16_t vendorId = 0;
    uint16_t productId = 0;
    uint32_t serialNumber = 0;
    std::string text;
};

// Read from what the module did: its message names the device it concluded;
// without one, the trace and registry calls tell where it stopped.
Conclusion conclude(const RunRecord& record)
{
    Conclusion conclusion;
    static const std::regex named("device ([0-9A-F]{4}) ([0-9A-F]{4}) ([0-9A-F]{8})");
    for (const LogRecord& line : record.eventLog) {
        std::smatch match;
        if (!std::regex_search(line.entry.message, match, named)) continue;
        conclusion.accepted = true;
        conclusion.vendorId = static_cast<uint16_t>(std::stoul(match[1].str(), nullptr, 16));
        conclusion.productId = static_cast<uint16_t>(std::stoul(match[2].str(), nullptr, 16));
        conclusion.serialNumber = static_cast<uint32_t>(std::stoul(match[3].str(), nullptr, 16));
        conclusion.text = fmt::format("accepted as vendor {:04X}, product {:04X}, serial {:08X}: the update would go "
                                      "on to look for the image of product {:04X}",
                                      conclusion.vendorId, conclusion.productId, conclusion.serialNumber,
                                      conclusion.productId);
        return conclusion;
    }
    const DeviceRecord& device = record.devices.at(0);
    bool signatureRead = false;
    for (const sim::RequestRecord& request : device.trace)
        signatureRead = signatureRead || (request.kind == sim::RequestKind::Read && request.wIndex == 0x0C00);
    const sim::kernel::RegistryCall* fvtpid = nullptr;
    for (const sim::kernel::RegistryCall& call : record.registryCalls) {
        if (call.kind == sim::kernel::RegistryCall::Kind::queryValue && call.valueName == "FVTPID") fvtpid = &call;
    }
    const sim::kernel::RegistryCall* classKeyOpen = nullptr;
    for (const sim::kernel::RegistryCall& call : record.registryCalls) {
        if (call.kind == sim::kernel::RegistryCall::Kind::createKey) classKeyOpen = &call;
    }
    if (device.trace.empty()) {
        conclusion.text = "not taken on: the module made no request";
    } else if (signatureRead) {
        conclusion.text = "refused: the product ID is erased and the firmware at 0x0C00 matches neither known "
                          "signature, so no product ID could be derived";
    } else if (fvtpid != nullptr) {
        conclusion.text = fmt::format("refused: the block is blank and the registry's FVTPID could not be used "
                                      "(query result 0x{:08X}, or not a text of at most 10 bytes)",
                                      static_cast<uint32_t>(fvtpid->result));
    } else if (classKeyOpen != nullptr) {
        conclusion.text = fmt::format("refused: the block is blank and the device class key, where FVTPID would be, "
                                      "could not be opened (0x{:08X})",
                                      static_cast<uint32_t>(classKeyOpen->result));
    } else {
        conclusion.text = "refused: the vendor ID is not the family's 5C1D and the block is not blank";
    }
    return conclusion;
}

}  // namespace

int inspectIdentity(const InspectOptions& options, std::FILE* out)
{
    std::ifstream in(options.file, std::ios::binary);
    std::vector<uint8_t> bytes((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
    if (bytes.size() != 16 && (bytes.size() > 0x10000 || !options.loaderProductId)) {
        throw CommandError(kExitScenarioInvalid,
                           fmt::format("{} has {} bytes: give a 16-byte identity block, or a flash dump of at most "
                                       "65536 bytes together with --loader 0x4A10 or 0x4A20",
                                       options.file, bytes.size()));
    }
    uint16_t loader = options.loaderProductId.value_or(0x4A10);
    if (sim::findLoaderFlashLayout(loader) == nullptr) {
        throw CommandError(kExitScenarioInvalid, fmt::format("--loader is 0x4A10 or 0x4A20, not 0x{:04X}", loader));
    }
    RunOptions runOptions;
    runOptions.modulePath = options.modulePath;
    ScenarioResult result = runScenario(identityScenario(options, bytes, loader), runOptions);
    if (!result.labError.empty()) throw CommandError(kExitLabError, result.labError);
    const RunRecord& record = result.record;
    const DeviceRecord& device = record.devices.at(0);
    sim::IdentityValues before = *identityIn(device, device.flashBefore);
    sim::IdentityValues after = *identityIn(device, device.flashAfter);
    Conclusion conclusion = conclude(record);
    std::vector<UpdateStory> stories = tellDeviceStory(record, 0);
    std::vector<IdentityWrite> writes = stories.empty() ? std::vector<IdentityWrite>{} : stories.front().identityWrites;

    if (options.json) {
        nlohmann::json writesJson = nlohmann::json::array();
        for (const IdentityWrite& write : writes)
            writesJson.push_back({{"address", fmt::format("0x{:04X}", write.address)},
                                  {"field", write.field},
                                  {"bytes", hexBytesText(write.bytes)},
                                  {"took", write.took}});
        nlohmann::json report = {{"file", options.file},
                                 {"loaderProductId", fmt::format("0x{:04X}", loader)},
                                 {"blockBefore", identityText(before)},
                                 {"blockAfter", identityText(after)},
                                 {"accepted", conclusion.accepted},
                                 {"conclusion", conclusion.text},
                                 {"writes", writesJson}};
        if (conclusion.accepted) {
            report["vendorId"] = fmt::format("0x{:04X}", conclusion.vendorId);
            report["productId"] = fmt::format("0x{:04X}", conclusion.productId);
            report["serialNumber"] = fmt::format("0x{:08X}", conclusion.serialNumber);
        }
        fmt::print(out, "{}\n", report.dump(2));
        return kExitSuccess;
    }
    const sim::LoaderFlashLayout* layout = sim::findLoaderFlashLayout(loader);
    fmt::print(out, "{} on loader 0x{:04X} (identity block at 0x{:04X})\n", options.file, loader, layout->identityPage + 0x1F0);
    fmt::print(out, "  block           {}\n", identityText(before));
    fmt::print(out, "  FVTPID          {}\n", options.fvtpid ? "\"" + *options.fvtpid + "\"" : "not in the registry");
    fmt::print(out, "  conclusion      {}\n", conclusion.text);
    if (writes.empty()) fmt::print(out, "  writes          none\n");
    for (size_t i = 0; i < writes.size(); ++i) {
        const IdentityWrite& write = writes[i];
        fmt::print(out, "  {:<16}{} {} at 0x{:04X}{}\n", i == 0 ? "writes" : "", write.field, hexBytesText(write.bytes),
                   write.address, write.took ? "" : " - did not take: flash can only clear bits without an erase");
    }
    if (!writes.empty()) fmt::print(out, "  block after     {}\n", identityText(after));
    for (const Finding& finding : record.findings) {
        if (finding.text.find("every update") != std::string::npos) fmt::print(out, "  note            {}\n", finding.text);
    }
    return kExitSuccess;
}

}  // namespace lab
