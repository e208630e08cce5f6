#include "staticObjects.h"

#include <stdint.h>

#include "../../moduleMemory.h"

namespace {

struct StopNode {
    StopNode* next;
    void (*stop)();
};

uint32_t gStartCount;
uint8_t gStarted;
StopNode* gStopList;

void releaseModuleStatics()
{
    --gStartCount;
}

// The module's one static start routine. A stop node that cannot be allocated
// is skipped; the count is still raised.
void startModuleStatics()
{
    ++gStartCount;
    StopNode* node = static_cast<StopNode*>(allocateFromHost(sizeof(StopNode)));
    if (node == nullptr) return;
    node->next = gStopList;
    node->stop = releaseModuleStatics;
    gStopList = node;
}

typedef void (*StartRoutine)();
constexpr StartRoutine kStartTable[] = {startModuleStatics};

}  // namespace

void startStaticObjects()
{
    if (gStartCount != 0) {
        ++gStartCount;
        return;
    }
    gStarted = 1;
    for (StartRoutine start : kStartTable) {
        if (start != nullptr) start();
    }
}

void stopStaticObjects()
{
    // An unpaired stop must not wrap the count round to 0xFFFFFFFF.
    if (gStartCount == 0) return;
    if (gStartCount != 1 || !gStarted) {
        --gStartCount;
        return;
    }
    while (gStopList != nullptr) {
        StopNode* node = gStopList;
        node->stop();
        gStopList = node->next;
        _memDelete(node);
    }
}
