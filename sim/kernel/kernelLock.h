// The kernel calls of the stand-in may come from several threads at once, as
// from a host that updates devices side by side; one lock keeps the registry,
// file and handle tables whole. Recursive, because closing a handle runs the
// close of the subsystem that opened it.
#pragma once

#include <mutex>

namespace sim::kernel {

std::recursive_mutex& kernelCallLock();

}  // namespace sim::kernel
