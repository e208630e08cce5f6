#include "simKernel.h"

namespace sim::kernel {

void reset()
{
    resetHandles();
    registry().reset();
    files().reset();
}

}  // namespace sim::kernel
