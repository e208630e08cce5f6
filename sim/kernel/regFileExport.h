// Writes keys and values in the registry editor's export format, the form in
// which the lab reports the registry and in which it can be read back.
#pragma once

#include <string>
#include <vector>

#include "registrySim.h"

namespace sim::kernel {

struct RegistryKeyContent {
    std::string path;  // full kernel path, "\Registry\Machine\..."
    std::vector<RegistryValue> values;
};

// UTF-8 text with "\n" line ends, beginning "Windows Registry Editor Version 5.00".
std::string formatRegistryExport(const std::vector<RegistryKeyContent>& keys);

}  // namespace sim::kernel
