// The module's kernel calls go to Wine's own ntoskrnl.exe. The harness only
// watches them: it puts a forwarding function into the module's import table
// for the calls the lab reports (key creation, value queries, file opens,
// closes), tells the lab what Wine answered, and counts the handles left open.
#pragma once

#include <windows.h>

#include <string>
#include <vector>

namespace winehost {

// Patches the image's import table; false when an import is missing.
bool watchKernelCalls(HMODULE image, std::string& problem);
// Kernel handles the module holds now, described.
std::vector<std::string> openKernelHandles();
// Keys the module's ZwCreateKey created, as HKLM-relative names, oldest first.
std::vector<std::wstring> keysCreatedByModule();

}  // namespace winehost
