// What the loader promises of every run, whatever went wrong around it:
// nothing left behind and no misuse; the identity page kept out of
// programming; no completion marker before every byte of the image was read
// back equal; a device that runs its firmware holds exactly the image; and each
// failed update reported the way its place in the update calls for. Read from
// the run record alone, so that the sweep, a fuzzer or a test can ask.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "lab.h"
#include "runRecord.h"

namespace lab {

struct InvariantViolation {
    std::string rule;    // short and stable: "left behind", "identity page", ...
    std::string device;  // empty: the run as a whole
    std::string what;    // what was seen, with request numbers and addresses
};

// moduleUnloaded: the run ended with the module unloaded, so everything it
// obtained must have been given back.
std::vector<InvariantViolation> checkRunInvariants(const RunRecord& record, bool moduleUnloaded);

// The record's invariants, and that the lab itself could run the scenario.
std::vector<InvariantViolation> checkResultInvariants(const ScenarioResult& result);

// "source\DeviceTable:451 - " -> 451; 0 when the location has no line number.
int logLineNumber(const std::string& location);
// The "Status = %d" of a line 355 or 451 message.
std::optional<int32_t> loggedStatus(const std::string& message);

}  // namespace lab
