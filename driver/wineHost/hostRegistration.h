// Registration: the module's records are read here by layout, as the host
// reads them, and sent to the lab whole, where the stand-in checks them.
#pragma once

#include "../../host/moduleRecords.h"

namespace karvelk {

void registerModule(_tLibModuleInfo* module, tStatus& status);
void unregisterModule(_tLibModuleInfo* module, tStatus& status);
// The record the lab accepted, or null.
_tLibModuleInfo* registeredModule();

}  // namespace karvelk
