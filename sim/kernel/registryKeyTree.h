// The registry stand-in's key tree: keys and values as the kernel keeps them,
// with names that match without regard to case.
#pragma once

#include <map>
#include <memory>
#include <string>
#include <vector>

#include "registrySim.h"

namespace sim::kernel {

struct StoredValue {
    std::u16string name;
    uint32_t type = 0;
    std::vector<uint8_t> data;
};

struct RegistryKey {
    std::u16string name;
    int depth = 0;  // 0: the object namespace's root; 1: \Registry; 2: \Registry\Machine
    bool deleted = false;
    std::map<std::u16string, std::shared_ptr<RegistryKey>> subkeys;  // by folded name
    std::map<std::u16string, StoredValue> values;                    // by folded name
};

constexpr int kMachineDepth = 2;  // depth of \Registry\Machine below the namespace root

// The registry compares names without regard to case.
std::u16string folded(std::u16string text);
// The components of a path that begins with a backslash; empty ones included,
// so that callers can refuse "\\" and a trailing backslash.
std::vector<std::u16string> splitComponents(const std::u16string& path);
std::u16string foldedPath(const std::vector<std::u16string>& components);
// A control's key path: "\Registry\Machine" or below it; anything else throws
// std::invalid_argument.
std::vector<std::u16string> controlPath(const std::string& path);

std::shared_ptr<RegistryKey> child(const RegistryKey& key, const std::u16string& name);
std::shared_ptr<RegistryKey> addChild(RegistryKey& parent, const std::u16string& name);
// Opens or creates every component below root.
RegistryKey& makeKey(RegistryKey& root, const std::vector<std::u16string>& components);
// Handles still open on a deleted key must see it gone, not its old values.
void markDeleted(RegistryKey& key);
void collectContent(const RegistryKey& key, const std::string& path, std::vector<RegistryKeyContent>& out);

}  // namespace sim::kernel
