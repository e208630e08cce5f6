// Reads the registry editor's export format (.reg files) into a list of edits,
// so that a malformed file is refused before anything is changed.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace sim::regfile {

struct RegistryEdit {
    enum class Kind { createKey, deleteKey, setValue, deleteValue };
    Kind kind = Kind::createKey;
    std::string keyPath;    // full kernel path, "\Registry\Machine\..."
    std::string valueName;  // empty: the key's default value
    uint32_t type = 0;
    std::vector<uint8_t> data;
};

// The file's bytes: UTF-16LE with BOM, as regedit writes it, or UTF-8/ASCII.
// Throws std::runtime_error("<sourceName>:<line>: <what is wrong>").
std::vector<RegistryEdit> parseRegistryExport(const std::string& bytes, const std::string& sourceName);

}  // namespace sim::regfile
