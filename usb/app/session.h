// One run of the program: the kernel's registry and drives set up, the host
// started, the module loaded and started, devices updated, everything stopped
// and unloaded again. Returns the exit code.
#pragma once

#include "programOptions.h"
#include "reporter.h"

namespace usbapp {

int runSession(const ProgramOptions& options, Reporter& reporter);

// Installs the SIGINT and SIGTERM handlers: the first signal stops new
// updates and lets running ones finish, the second abandons them.
void installStopSignals();

}  // namespace usbapp
