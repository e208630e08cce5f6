// Checks a scenario's expectations against what its run showed.
#pragma once

#include <string>
#include <vector>

#include "runRecord.h"
#include "world.h"

namespace lab {

struct ExpectationFailure {
    std::string place;  // JSON pointer of the expectation
    std::string what;   // what was expected and what was seen instead
};

struct ExpectationOutcome {
    size_t checked = 0;
    std::vector<ExpectationFailure> failures;
};

// The world is still needed to read image files named by DOS path.
ExpectationOutcome checkExpectations(const Scenario& scenario, const RunRecord& record, const World& world);

}  // namespace lab
