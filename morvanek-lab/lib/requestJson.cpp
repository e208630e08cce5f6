#include "requestJson.h"

#include <fmt/format.h>

#include "deviceStory.h"

namespace lab {

nlohmann::json requestRecordJson(const sim::RequestRecord& request)
{
    nlohmann::json out = {{"sequence", request.sequence},
                          {"kind", sim::requestKindName(request.kind)},
                          {"bmRequestType", fmt::format("0x{:02X}", request.bmRequestType)},
                          {"bRequest", fmt::format("0x{:02X}", request.bRequest)},
                          {"wValue", fmt::format("0x{:04X}", request.wValue)},
                          {"wIndex", fmt::format("0x{:04X}", request.wIndex)},
                          {"length", request.length},
                          {"outcome", request.outcome},
                          {"text", requestText(request)}};
    if (!request.data.empty()) out["data"] = hexBytesText(request.data);
    return out;
}

}  // namespace lab
