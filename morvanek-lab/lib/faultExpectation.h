// What one injected fault must lead to, beyond the invariants every run keeps:
// the update it strikes ends silently or with the line its place calls for,
// carrying the status of the fault; a device plugged in again after an unplug
// ends as it would have without the fault.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "runInvariants.h"

namespace lab {

struct FaultExpectation {
    enum class Ending {
        any,            // only the invariants
        failsSilently,  // the update ends without a restart and without a message
        failsLogged,    // the update ends without a restart, logging `line` last
    };

    int device = -1;  // by its place in the scenario; -1: no device in particular
    int update = 0;   // which of the device's updates the fault strikes
    Ending ending = Ending::any;
    int line = 451;                             // the line a logged failure ends with
    std::optional<int32_t> status;              // what that line must report
    int verificationLine = 0;                   // 421 or 436 before line 451
    uint32_t verificationBlock = 0;             // the block that line names
    std::optional<std::string> finalMode;       // the mode the device must end in
    // finalMode holds only once the device was updated again after the fault
    // (a module that no longer listens never sees it plugged in again).
    bool finalModeAfterAnotherUpdate = false;
};

std::vector<InvariantViolation> checkFaultExpectation(const RunRecord& record, const FaultExpectation& expected);

}  // namespace lab
