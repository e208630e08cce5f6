// Writes keys and values in the registry editor's export format, the form in
// which the lab reports the registry and in which it can be read back.
#pragma once

#include <string>
#include <vector>

#include "sim/kernel/registrySim.h"

namespace sim::regfile {

// UTF-8 text with "\n" line ends, beginning "Windows Registry Editor Version 5.00".
std::string formatRegistryExport(const std::vector<kernel::RegistryKeyContent>& keys);

}  // namespace sim::regfile
