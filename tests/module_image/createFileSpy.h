// This program's own ZwCreateFile, which the module's linked-in objects call
// instead of the kernel stand-in's: it records each request exactly and can
// refuse one open by its number, which no file on the drive can be made to do
// between the header read and the programming open of one update.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "kernel/ntkernel.h"

namespace create_file_spy {

struct CreateFileCall {
    std::string name;  // the object name, as UTF-8
    uint32_t desiredAccess = 0;
    uint32_t objectAttributesLength = 0;
    bool rootDirectory = false;
    uint32_t objectAttributes = 0;
    bool securityGiven = false;
    bool allocationSizeGiven = false;
    uint32_t fileAttributes = 0;
    uint32_t shareAccess = 0;
    uint32_t createDisposition = 0;
    uint32_t createOptions = 0;
    bool extendedAttributesGiven = false;
};

// Every call since the last reset.
const std::vector<CreateFileCall>& calls();
// Open number `nth` from now (1 = the next) returns `status` without reaching the stand-in.
void refuseOpen(unsigned nth, NTSTATUS status);
void reset();

}  // namespace create_file_spy
