#include "notExported.h"

#include <fmt/format.h>

namespace lab {

namespace {

std::string statusText(int32_t status)
{
    return fmt::format("0x{:08X}", static_cast<uint32_t>(status));
}

// "every call" or "call 3", with the file it is limited to.
std::string whichCalls(const CallFailurePlan& failure, const char* call)
{
    std::string which = failure.number == 0 ? fmt::format("every {}", call) : fmt::format("{} {}", call, failure.number);
    if (failure.file) which += " of " + *failure.file;
    return which;
}

void hostParts(const HostPlan& host, std::vector<std::string>& lines)
{
    if (!host.ready) lines.push_back("host: the host library is not ready");
    if (!host.deviceTree) lines.push_back("host: there is no device tree");
    for (size_t nth : host.failAllocations) lines.push_back(fmt::format("host fault: allocation {} fails", nth));
    if (host.failAllAllocations) lines.push_back("host fault: every allocation fails");
    if (host.registrationFailure != 0)
        lines.push_back("host fault: registration fails with " + statusText(host.registrationFailure));
    if (host.unregistrationFailure != 0)
        lines.push_back("host fault: unregistration fails with " + statusText(host.unregistrationFailure));
    const std::pair<const char*, const std::vector<CallFailurePlan>*> calls[] = {
        {"createQuery", &host.failCreateQuery},
        {"setAttribute", &host.failSetAttribute},
        {"findDevices", &host.failFindDevices},
        {"addListener", &host.failAddListener},
    };
    for (const auto& [name, failures] : calls) {
        for (const CallFailurePlan& failure : *failures) {
            lines.push_back(fmt::format("host fault: {} of the device tree fails with {}", whichCalls(failure, name),
                                        statusText(failure.status)));
        }
    }
}

void registryParts(const RegistryPlan& registry, std::vector<std::string>& lines)
{
    for (const RegistryFaultPlan& fault : registry.faults) {
        std::string what = fault.valueName ? fmt::format("querying value \"{}\" of {}", *fault.valueName, fault.keyPath)
                                           : "opening " + fault.keyPath;
        std::string when = fault.number == 0 ? "" : fmt::format(" at call {}", fault.number);
        lines.push_back(fmt::format("registry fault: {} fails with {}{}", what, statusText(fault.status), when));
    }
}

void fileParts(const Scenario& scenario, std::vector<std::string>& lines)
{
    for (const DrivePlan& drive : scenario.drives) {
        for (const FilePlan& file : drive.files) {
            if (file.heldOpenElsewhere) {
                lines.push_back(fmt::format("heldOpenElsewhere: {}:\\{} is exported as an ordinary file", drive.letter,
                                            file.path));
            }
        }
    }
    const FileFaultPlan& faults = scenario.fileFaults;
    if (faults.everyRead != 0) lines.push_back("file fault: every read fails with " + statusText(faults.everyRead));
    for (const auto& [number, status] : faults.readNumbers)
        lines.push_back(fmt::format("file fault: read {} fails with {}", number, statusText(status)));
    if (faults.sizeQuery != 0) lines.push_back("file fault: every size query fails with " + statusText(faults.sizeQuery));
    if (faults.setPosition != 0)
        lines.push_back("file fault: every position change fails with " + statusText(faults.setPosition));
    for (const CallFailurePlan& failure : faults.opens)
        lines.push_back(fmt::format("file fault: {} fails with {}", whichCalls(failure, "open"), statusText(failure.status)));
    for (const CallFailurePlan& failure : faults.sizeQueries) {
        lines.push_back(
            fmt::format("file fault: {} fails with {}", whichCalls(failure, "size query"), statusText(failure.status)));
    }
    for (const auto& [number, bytes] : faults.shortReads)
        lines.push_back(fmt::format("file fault: read {} brings at most {} bytes", number, bytes));
    for (const ContentChangePlan& change : faults.contentChanges) {
        lines.push_back(fmt::format("content change: {} becomes other bytes after {} open(s); its first bytes are exported",
                                    change.dosPath, change.afterOpens));
    }
}

}  // namespace

std::vector<std::string> partsNotExported(const Scenario& scenario)
{
    std::vector<std::string> lines;
    hostParts(scenario.host, lines);
    registryParts(scenario.registry, lines);
    fileParts(scenario, lines);
    if (!scenario.devices.empty()) {
        std::vector<std::string> names;
        for (const DevicePlan& device : scenario.devices) names.push_back(device.name);
        lines.push_back(fmt::format("devices ({}), with their faults: served elsewhere; put them on a bus "
                                    "(morvanek-usb-gadget)",
                                    fmt::join(names, ", ")));
    }
    return lines;
}

}  // namespace lab
