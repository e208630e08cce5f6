// What the lab knows and the module cannot: writes that did not take, devices
// that came back in loader mode, updates that ended without a word, identity
// blocks that every update will rewrite.
#pragma once

#include "runRecord.h"

namespace lab {

std::vector<Finding> findFindings(const RunRecord& record);

}  // namespace lab
