// The kernel stand-in as a whole: registry, files and handles.
#pragma once

#include "fileSim.h"
#include "kernelHandles.h"
#include "registrySim.h"

namespace sim::kernel {

// An empty registry, no drives, no open handles, no faults.
void reset();

}  // namespace sim::kernel
