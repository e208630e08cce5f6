// The registry stand-in filled from, and written out as, the registry editor's
// export text: how the lab, the USB host and tests bring in a machine's real
// export and show what the module left behind.
#pragma once

#include <string>

#include "sim/kernel/registrySim.h"

namespace sim::regfile {

// "Windows Registry Editor Version 5.00" or "REGEDIT4", UTF-8 or UTF-16LE with
// BOM. A malformed text throws std::runtime_error naming source and line, and
// changes nothing.
void importRegistryText(kernel::Registry& registry, const std::string& text, const std::string& sourceName);
void importRegistryFile(kernel::Registry& registry, const std::string& path);

// The whole hive in the export format, which importRegistryText reads back.
std::string exportRegistryText(const kernel::Registry& registry);

}  // namespace sim::regfile
