// The module's DOS names ("\??\C:\dir\file.bin") resolved onto the folders
// that stand for the drives.
#pragma once

#include <filesystem>
#include <map>
#include <string>

#include "../../kernel/ntkernel.h"

namespace sim::kernel {

struct DosPathResolution {
    NTSTATUS status = 0;
    std::filesystem::path hostPath; // canonical, inside the drive's folder; set on success only
    bool isDirectory = false;
};

// Each component is matched against the directory's entries ignoring ASCII
// case, an exact match preferred. Names that could leave the drive's folder
// (".", "..", a symbolic link pointing outside) are refused as invalid before
// anything is opened.
DosPathResolution resolveDosPath(const std::u16string& name, const std::map<char, std::filesystem::path>& drives);

} // namespace sim::kernel
