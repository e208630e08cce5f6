// The pieces of the scenario reader, one per part of the file.
#pragma once

#include <filesystem>
#include <vector>

#include "jsonNode.h"
#include "scenario.h"

namespace lab {

HostPlan parseHost(const JsonNode& node);
RegistryPlan parseRegistry(const JsonNode& node, const std::filesystem::path& directory);
std::vector<DrivePlan> parseDrives(const JsonNode& node, const std::filesystem::path& directory);
FileFaultPlan parseFileFaults(const JsonNode& node, const std::filesystem::path& directory);
std::vector<DevicePlan> parseDevices(const JsonNode& node, const std::filesystem::path& directory);
std::vector<StepPlan> parseSteps(const JsonNode& node, const std::vector<DevicePlan>& devices);
Expectations parseExpectations(const JsonNode& node, const std::vector<DevicePlan>& devices);

// A file a scenario names, relative to the scenario's folder; a missing or
// unreadable file is an error at that place.
std::vector<uint8_t> readNamedFile(const JsonNode& node, const std::filesystem::path& directory,
                                   size_t maximumSize);
std::filesystem::path resolveNamedPath(const JsonNode& node, const std::filesystem::path& directory);

// A status a fault injects: it must be a failure, negative as a 32-bit value.
int32_t failureStatus(const JsonNode& node);

// "\Registry\Machine\..." or "HKEY_LOCAL_MACHINE\..." (or "HKLM\...") in the kernel's form.
std::string kernelKeyPath(const JsonNode& node);

}  // namespace lab
