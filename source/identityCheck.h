// The device's identity block and its repair helpers.
#pragma once

#include <stdint.h>

#include "../host/karvelkStatus.h"
#include "loaderChannel.h"

// Offsets in the identity page of the 16-byte identity block's fields, each
// stored big-endian.
constexpr uint16_t kIdentityProductId = 0x1F0;
constexpr uint16_t kIdentityProductIdCopy = 0x1F2;
constexpr uint16_t kIdentityVendorId = 0x1F8;
constexpr uint16_t kIdentityAltProductId = 0x1FA;
constexpr uint16_t kIdentitySerialNumber = 0x1FC;

// Reads the product ID from the "FVTPID" value under the device class key.
void readRegistryProductId(uint16_t& productId, tStatus& status);

// Writes the product ID big-endian at identity page + 0x1F0.
void writeProductId(LoaderChannel& channel, uint16_t productId, tStatus& status);
