#include "requestTrace.h"

#include <cstdio>

namespace sim {

const char* requestKindName(RequestKind kind)
{
    switch (kind) {
    case RequestKind::Read:
        return "read";
    case RequestKind::Write:
        return "write";
    case RequestKind::Erase:
        return "erase";
    case RequestKind::Restart:
        return "restart";
    case RequestKind::Unknown:
        break;
    }
    return "unknown";
}

std::string describeRequest(const RequestRecord& record)
{
    char text[128];
    std::snprintf(text, sizeof text, "#%llu %s %02X %02X %04X %04X len %u ",
                  static_cast<unsigned long long>(record.sequence), requestKindName(record.kind),
                  record.bmRequestType, record.bRequest, record.wValue, record.wIndex, record.length);
    std::string line = text;
    if (record.outcome >= 0) {
        line += "ok";
    } else {
        line += "failed " + std::to_string(record.outcome);
    }
    return line;
}

}  // namespace sim
