// The scenario's registry in Wine's: imported with Wine's own regedit, and
// put back as it was when the run ends, so that one scenario never sees
// another's keys in the prefix the runs share.
#pragma once

#include <string>
#include <vector>

namespace winehost {

struct ValueToSet {
    std::wstring key;   // relative to HKEY_LOCAL_MACHINE
    std::wstring name;  // empty: the default value
};

struct RegistryPlan {
    std::wstring regFile;               // Windows path of the .reg file to import
    std::vector<std::wstring> keys;     // every key it names, HKLM-relative
    std::vector<ValueToSet> values;     // every value it sets
    std::vector<ValueToSet> absent;     // values the scenario's world does not have, removed for the run
};

// Notes what is there now, imports the file, removes the absent values.
// False with a problem when regedit fails.
bool applyRegistry(const RegistryPlan& plan, std::string& problem);
// Puts back what applyRegistry noted and deletes the keys named, which the
// module created during the run.
void restoreRegistry(const std::vector<std::wstring>& createdKeys);

}  // namespace winehost
