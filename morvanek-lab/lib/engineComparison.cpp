#include "engineComparison.h"

#include <fmt/format.h>

#include "reports.h"

namespace lab {

namespace {

constexpr size_t kMostDifferences = 20;

std::string shown(const nlohmann::json& value)
{
    std::string text = value.dump();
    return text.size() > 120 ? text.substr(0, 117) + "..." : text;
}

void compare(const nlohmann::json& linuxReport, const nlohmann::json& windowsReport, const std::string& path,
             std::vector<std::string>& differences)
{
    if (differences.size() >= kMostDifferences || linuxReport == windowsReport) return;
    if (linuxReport.is_object() && windowsReport.is_object()) {
        for (const auto& [key, value] : linuxReport.items()) {
            if (!windowsReport.contains(key)) {
                differences.push_back(path + "/" + key + ": only the Linux engine has it");
                continue;
            }
            compare(value, windowsReport[key], path + "/" + key, differences);
        }
        for (const auto& [key, value] : windowsReport.items()) {
            if (!linuxReport.contains(key)) differences.push_back(path + "/" + key + ": only the Windows engine has it");
        }
        return;
    }
    if (linuxReport.is_array() && windowsReport.is_array()) {
        const size_t common = std::min(linuxReport.size(), windowsReport.size());
        for (size_t i = 0; i < common; ++i) compare(linuxReport[i], windowsReport[i], fmt::format("{}/{}", path, i), differences);
        if (linuxReport.size() != windowsReport.size())
            differences.push_back(fmt::format("{}: {} entries on Linux, {} under Wine", path, linuxReport.size(), windowsReport.size()));
        return;
    }
    differences.push_back(fmt::format("{}: Linux {}, Windows {}", path, shown(linuxReport), shown(windowsReport)));
}

std::string callText(const sim::kernel::RegistryCall& call)
{
    const bool create = call.kind == sim::kernel::RegistryCall::Kind::createKey;
    return fmt::format("{} {}{}{} -> 0x{:08X}{}", create ? "ZwCreateKey" : "ZwQueryValueKey", call.keyPath,
                       create ? "" : " value ", create ? "" : "\"" + call.valueName + "\"",
                       static_cast<uint32_t>(call.result), call.created ? " (created)" : "");
}

}  // namespace

std::vector<std::string> compareEngineRuns(const ScenarioResult& linuxRun, const ScenarioResult& windowsRun,
                                           const RunOptions& options)
{
    std::vector<std::string> differences;
    const nlohmann::json linuxReport = jsonReport({linuxRun}, options)["scenarios"][0];
    const nlohmann::json windowsReport = jsonReport({windowsRun}, options)["scenarios"][0];
    compare(linuxReport, windowsReport, "", differences);
    // The reports count the registry calls; the calls themselves are where
    // Wine's kernel and the stand-in could answer differently.
    const auto& linuxCalls = linuxRun.record.registryCalls;
    const auto& windowsCalls = windowsRun.record.registryCalls;
    for (size_t i = 0; i < std::max(linuxCalls.size(), windowsCalls.size()); ++i) {
        if (differences.size() >= kMostDifferences) break;
        std::string left = i < linuxCalls.size() ? callText(linuxCalls[i]) : "none";
        std::string right = i < windowsCalls.size() ? callText(windowsCalls[i]) : "none";
        if (left != right) differences.push_back(fmt::format("registry call {}: Linux {}; Windows {}", i + 1, left, right));
    }
    return differences;
}

void printEngineComparison(std::FILE* out, const ScenarioResult& result)
{
    if (!result.engines) return;
    const EngineComparison& engines = *result.engines;
    fmt::print(out, "  engines: Linux module {:.2f} s, morvanek.sys under Wine {:.2f} s: {}\n", engines.linuxSeconds,
               engines.windowsSeconds, engines.differences.empty() ? "the same reports" : "they differ");
    for (const std::string& difference : engines.differences) fmt::print(out, "    {}\n", difference);
}

}  // namespace lab
