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
FileFaultPlan parseFileFaults(const JsonNode& node);
std::vector<DevicePlan> parseDevices(const JsonNode& node, const std::filesystem::path& directory);
std::vector<StepPlan> parseSteps(const JsonNode& node, const std::vector<DevicePlan>& devices);
Expectations parseExpectations(const JsonNode& node, const std::vector<DevicePlan>& devices);

// A file a scenario names, relative to the scenario's folder; a missing or
// unreadable file is an error at that place.
std::vector<uint8_t> readNamedFile(const JsonNode& node, const std::filesystem::path& directory,
                                   size_t maximumSize);
std::filesystem::path resolveNamedPath(const JsonNode& node, const std::filesystem::path& directory);

// "loader", "product" and, when asFlashAllowed, "flash".
sim::PhysicalDevice::PowerUp powerUp(const JsonNode& node, bool asFlashAllowed);

// A fault's status: a failure, negative as a 32-bit value.
int32_t failureStatus(const JsonNode& node);
// A status (every call fails with it), or one or a list of {"number": N,
// "status": S} (the Nth call fails), each entry with an optional "file" (a DOS
// path) when fileCalls is set; an entry with a file may leave out its number
// (every call of that file).
std::vector<CallFailurePlan> parseCallFailures(const JsonNode& node, bool fileCalls);
// A DOS path "C:\dir\file.bin", as a file fault names a file of the drives.
std::string dosFilePath(const JsonNode& node);

// "\Registry\Machine\..." or "HKEY_LOCAL_MACHINE\..." (or "HKLM\...") in the kernel's form.
std::string kernelKeyPath(const JsonNode& node);

}  // namespace lab
