// Constant serial-number tables of the identity repair.
#pragma once

#include <stdint.h>

struct SerialRange {
    uint32_t low;
    uint32_t high;  // inclusive
};

constexpr uint32_t kSerialFixListEntries = 1576;  // 1575 serials and the closing 0
constexpr uint32_t kSerialRangeRows = 9;

extern const uint32_t kSerialFixList[kSerialFixListEntries];
extern const SerialRange kSerialRangeTable[kSerialRangeRows];
