// The parts of a scenario's world that a real machine cannot be given: faults
// the stand-ins inject into the host, the registry and the files, files held
// open by another program, and the emulated devices themselves. An export
// names each, so that nothing is dropped without a word.
#pragma once

#include <string>
#include <vector>

#include "scenario.h"

namespace lab {

// One line per part, such as "registry fault: opening \Registry\Machine\X fails with 0xC0000022".
std::vector<std::string> partsNotExported(const Scenario& scenario);

}  // namespace lab
