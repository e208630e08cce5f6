#include "kernelLock.h"

namespace sim::kernel {

std::recursive_mutex& kernelCallLock()
{
    static std::recursive_mutex lock;
    return lock;
}

}  // namespace sim::kernel
