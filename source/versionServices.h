// Version services other kernel components link against: the module's
// compatible version range, a check of a caller's range against it, and a
// check of a product's firmware image against an expected version.
#pragma once

#include <stdint.h>

#include "../host/karvelk.h"
#include "../host/karvelkStatus.h"
#include "exportVisibility.h"

constexpr uint32_t kCurrentVersion = 0x0143C000;           // 1.4.3f0
constexpr uint32_t kOldestCompatibleVersion = 0x01004000;  // 1.0.0a0

namespace nMORVANE_1_4 {
MODULE_EXPORT tSSVersion getCurrentVersion(tStatus& status);
MODULE_EXPORT tSSVersion getOldestCompatibleVersion(tStatus& status);
MODULE_EXPORT void compareVersion(const tSSVersion& newestVersion, const tSSVersion& oldestVersion, tStatus& status,
                                  const char* component);
}  // namespace nMORVANE_1_4

namespace nMORVANE_1_2 {
MODULE_EXPORT void compareFirmwareVersion(tSSVersion expectedVersion, uint16_t productId, tStatus& status);
}  // namespace nMORVANE_1_2
