// One request of a device's trace as the lab's JSON reports write it; also
// what morvanek-usb-gadget writes, so that its traces compare with the lab's.
#pragma once

#include <nlohmann/json.hpp>

#include "sim/device/requestTrace.h"

namespace lab {

nlohmann::json requestRecordJson(const sim::RequestRecord& request);

}  // namespace lab
