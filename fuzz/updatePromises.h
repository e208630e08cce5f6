// What the loader promises about every update, whatever its input and faults,
// checked against what the emulated device saw and what the stand-ins hold.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "sim/device/physicalDevice.h"

namespace fuzzing {

// From the device's request trace, each broken promise described:
// - the identity page is never erased, and written only in its identity block
//   and only before programming begins;
// - nothing is written outside the image's range but the identity block;
// - the completion marker is written only when every byte of the image was
//   written and then read back equal since the last erase;
// - the restart request follows a marker written in the same update.
std::vector<std::string> devicePromisesBroken(const sim::PhysicalDevice& device, const std::vector<uint8_t>& image);

// Nothing allocated, open or registered, and no misuse of the host's or the
// kernel's interfaces; for after the module is unloaded.
std::vector<std::string> leftoversAndMisuse();

}  // namespace fuzzing
