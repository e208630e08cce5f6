// Handles of the kernel stand-in. They look like kernel handles: small
// negative numbers sign-extended to 64 bits, so that a module that narrows a
// handle to 32 bits and widens it back is really exercised.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "../../kernel/ntkernel.h"

namespace sim::kernel {

enum class HandleKind { registryKey, file };

// Each subsystem registers what it needs to close one of its handles.
HANDLE openHandle(HandleKind kind, std::function<void()> onClose, std::string description);
// The description of an open handle of that kind, or null when it is not one.
const std::string* findHandle(HANDLE handle, HandleKind kind);
size_t openHandleCount();
size_t openHandleCount(HandleKind kind);
std::vector<std::string> openHandleDescriptions();

// Misuse the kernel would punish (closing a handle that is not open, for
// example) is collected here and printed to stderr at once.
void reportMisuse(const std::string& what);
const std::vector<std::string>& misuseReports();
// For tests that cause misuse on purpose and have checked it.
void clearMisuseReports();

// Forgets every handle without closing it, and every report.
void resetHandles();

}  // namespace sim::kernel
