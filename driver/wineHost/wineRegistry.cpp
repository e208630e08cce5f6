#include "wineRegistry.h"

#include <windows.h>

#include <algorithm>
#include <optional>

namespace winehost {

namespace {

struct SavedValue {
    ValueToSet value;
    std::optional<DWORD> type;  // none: the value was not there
    std::vector<BYTE> data;
};

std::vector<SavedValue> gSavedValues;
std::vector<std::wstring> gKeysToDelete;  // keys that were not there, highest missing first

constexpr REGSAM kAccess = KEY_READ | KEY_WOW64_64KEY;

bool keyExists(const std::wstring& key)
{
    HKEY handle = nullptr;
    if (RegOpenKeyExW(HKEY_LOCAL_MACHINE, key.c_str(), 0, kAccess, &handle) != ERROR_SUCCESS) return false;
    RegCloseKey(handle);
    return true;
}

SavedValue save(const ValueToSet& value)
{
    SavedValue saved{value, std::nullopt, {}};
    HKEY handle = nullptr;
    if (RegOpenKeyExW(HKEY_LOCAL_MACHINE, value.key.c_str(), 0, kAccess, &handle) != ERROR_SUCCESS) return saved;
    DWORD type = 0;
    DWORD size = 0;
    if (RegQueryValueExW(handle, value.name.c_str(), nullptr, &type, nullptr, &size) == ERROR_SUCCESS) {
        saved.data.resize(size);
        if (RegQueryValueExW(handle, value.name.c_str(), nullptr, &type, saved.data.data(), &size) == ERROR_SUCCESS) {
            saved.type = type;
            saved.data.resize(size);
        }
    }
    RegCloseKey(handle);
    return saved;
}

void put(const SavedValue& saved)
{
    HKEY handle = nullptr;
    if (RegOpenKeyExW(HKEY_LOCAL_MACHINE, saved.value.key.c_str(), 0, KEY_WRITE | KEY_WOW64_64KEY, &handle) !=
        ERROR_SUCCESS)
        return;
    if (saved.type) {
        RegSetValueExW(handle, saved.value.name.c_str(), 0, *saved.type, saved.data.data(),
                       static_cast<DWORD>(saved.data.size()));
    } else {
        RegDeleteValueW(handle, saved.value.name.c_str());
    }
    RegCloseKey(handle);
}

// The first of the key's ancestors (or the key) that is not there.
std::optional<std::wstring> highestMissing(const std::wstring& key)
{
    for (size_t end = key.find(L'\\');; end = key.find(L'\\', end + 1)) {
        std::wstring prefix = key.substr(0, end);
        if (!keyExists(prefix)) return prefix;
        if (end == std::wstring::npos) return std::nullopt;
    }
}

bool runRegedit(const std::wstring& file, std::string& problem)
{
    std::wstring command = L"regedit.exe /S \"" + file + L"\"";
    STARTUPINFOW startup = {};
    startup.cb = sizeof(startup);
    PROCESS_INFORMATION process = {};
    if (!CreateProcessW(nullptr, command.data(), nullptr, nullptr, FALSE, 0, nullptr, nullptr, &startup, &process)) {
        problem = "regedit could not be started (error " + std::to_string(GetLastError()) + ")";
        return false;
    }
    WaitForSingleObject(process.hProcess, INFINITE);
    DWORD exitCode = 0;
    GetExitCodeProcess(process.hProcess, &exitCode);
    CloseHandle(process.hThread);
    CloseHandle(process.hProcess);
    if (exitCode != 0) {
        problem = "regedit refused the scenario's registry (exit " + std::to_string(exitCode) + ")";
        return false;
    }
    return true;
}

}  // namespace

bool applyRegistry(const RegistryPlan& plan, std::string& problem)
{
    for (const std::wstring& key : plan.keys) {
        std::optional<std::wstring> missing = highestMissing(key);
        if (missing && std::find(gKeysToDelete.begin(), gKeysToDelete.end(), *missing) == gKeysToDelete.end())
            gKeysToDelete.push_back(*missing);
    }
    for (const ValueToSet& value : plan.values) gSavedValues.push_back(save(value));
    for (const ValueToSet& value : plan.absent) gSavedValues.push_back(save(value));
    if (!plan.regFile.empty() && !runRegedit(plan.regFile, problem)) return false;
    for (const ValueToSet& value : plan.absent) put(SavedValue{value, std::nullopt, {}});
    return true;
}

void restoreRegistry(const std::vector<std::wstring>& createdKeys)
{
    for (auto it = createdKeys.rbegin(); it != createdKeys.rend(); ++it)
        RegDeleteTreeW(HKEY_LOCAL_MACHINE, it->c_str());
    for (auto it = gSavedValues.rbegin(); it != gSavedValues.rend(); ++it) put(*it);
    for (const std::wstring& key : gKeysToDelete) RegDeleteTreeW(HKEY_LOCAL_MACHINE, key.c_str());
    gSavedValues.clear();
    gKeysToDelete.clear();
}

}  // namespace winehost
