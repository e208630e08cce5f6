// Failures injected into the host's and the kernel's calls, by call number.
#include <fmt/format.h>

#include "parseParts.h"

namespace lab {

int32_t failureStatus(const JsonNode& node)
{
    int32_t status = node.status();
    // A "failure" that succeeds would hand the module no object and no result.
    if (status >= 0)
        node.fail(fmt::format("{} is not a failure: a fault's status is negative (such as -50150 or \"0xC0000022\")",
                              status));
    return status;
}

std::vector<CallFailurePlan> parseCallFailures(const JsonNode& node, bool fileCalls)
{
    std::vector<CallFailurePlan> failures;
    if (!node.isObject() && !node.isArray()) {
        CallFailurePlan every;
        every.pointer = node.pointer();
        every.status = failureStatus(node);
        failures.push_back(every);
        return failures;
    }
    for (const JsonNode& item : node.itemsOrOne()) {
        if (fileCalls) {
            item.allowOnly({"number", "status", "file"});
        } else {
            item.allowOnly({"number", "status"});
        }
        CallFailurePlan failure;
        failure.pointer = item.pointer();
        failure.status = failureStatus(item.field("status"));
        if (fileCalls) {
            if (auto file = item.optionalField("file")) failure.file = dosFilePath(*file);
        }
        if (auto number = item.optionalField("number")) {
            failure.number = number->unsignedNumber(1000000000);
            if (failure.number == 0) number->fail("calls count from 1");
        } else if (!failure.file) {
            item.fail("missing field \"number\": which call fails (1 = the first)");
        }
        failures.push_back(failure);
    }
    return failures;
}

}  // namespace lab
