#include "kernelWatch.h"

#include <cstdint>
#include <cstring>
#include <map>

#include "labLink.h"

namespace winehost {

namespace {

// The kernel's own shapes, declared here: <windows.h> leaves them out.
struct CountedText {
    uint16_t Length;
    uint16_t MaximumLength;
    const wchar_t* Buffer;
};
struct ObjectAttributes {
    uint32_t Length;
    HANDLE RootDirectory;
    const CountedText* ObjectName;
    uint32_t Attributes;
    void* SecurityDescriptor;
    void* SecurityQualityOfService;
};

using ZwCreateKeyFn = LONG(WINAPI*)(HANDLE*, ULONG, const ObjectAttributes*, ULONG, const CountedText*, ULONG, ULONG*);
using ZwQueryValueKeyFn = LONG(WINAPI*)(HANDLE, const CountedText*, ULONG, void*, ULONG, ULONG*);
using ZwCreateFileFn = LONG(WINAPI*)(HANDLE*, ULONG, const ObjectAttributes*, void*, void*, ULONG, ULONG, ULONG, ULONG,
                                     void*, ULONG);
using ZwCloseFn = LONG(WINAPI*)(HANDLE);
using ZwReadFileFn = LONG(WINAPI*)(HANDLE, HANDLE, void*, void*, void*, void*, ULONG, void*, ULONG*);
using ZwInformationFileFn = LONG(WINAPI*)(HANDLE, void*, void*, ULONG, ULONG);

struct IoStatus {
    LONG status;
    ULONG_PTR information;
};
constexpr ULONG kFileStandardInformation = 5;
constexpr ULONG kFilePositionInformation = 14;

ZwCreateKeyFn gCreateKey;
ZwQueryValueKeyFn gQueryValueKey;
ZwCreateFileFn gCreateFile;
ZwCloseFn gClose;
ZwReadFileFn gReadFile;
ZwInformationFileFn gQueryInformationFile;
ZwInformationFileFn gSetInformationFile;
KernelFaults gFaults;
unsigned gReads;

struct OpenHandle {
    std::wstring name;
    bool key;
};
std::map<HANDLE, OpenHandle> gOpen;
std::vector<std::wstring> gCreatedKeys;

// Case and doubled or trailing separators do not make another key.
std::wstring folded(const std::wstring& path)
{
    std::wstring out;
    for (wchar_t c : path) {
        if (c == L'\\' && (out.empty() || out.back() == L'\\')) continue;
        out += (c >= L'A' && c <= L'Z') ? static_cast<wchar_t>(c - L'A' + L'a') : c;
    }
    while (!out.empty() && out.back() == L'\\') out.pop_back();
    return out;
}

// A DOS path as a file call names it, without the kernel's "\\??\\" in front.
std::wstring foldedFile(std::wstring path)
{
    if (path.rfind(L"\\??\\", 0) == 0) path = path.substr(4);
    for (wchar_t& c : path) c = c == L'/' ? L'\\' : c;
    return folded(path);
}

// The status a counted file-call fault injects into this call, or 0.
LONG fileCallFault(std::vector<KernelFaults::FileCallFault>& faults, const std::wstring& file)
{
    for (KernelFaults::FileCallFault& fault : faults) {
        if (!fault.file.empty() && foldedFile(fault.file) != foldedFile(file)) continue;
        ++fault.seen;
        if (fault.number == 0 || fault.seen == fault.number) return fault.status;
    }
    return 0;
}

// Every fault of the key or value counts the call, as the stand-in counts the
// calls of a key or value once; the first that applies to this call wins.
LONG keyFault(const std::wstring& key, const std::wstring* value)
{
    LONG status = 0;
    for (KernelFaults::KeyFault& fault : gFaults.keys) {
        if (fault.query != (value != nullptr) || folded(fault.keyPath) != folded(key)) continue;
        if (value != nullptr && folded(fault.valueName) != folded(*value)) continue;
        ++fault.seen;
        if (status == 0 && (fault.number == 0 || fault.seen == fault.number)) status = fault.status;
    }
    return status;
}

std::wstring textOf(const CountedText* text)
{
    if (text == nullptr || text->Buffer == nullptr) return L"";
    return std::wstring(text->Buffer, text->Length / sizeof(wchar_t));
}

std::wstring nameOf(const ObjectAttributes* attributes)
{
    return attributes != nullptr ? textOf(attributes->ObjectName) : L"";
}

void text16(bridge::Writer& out, const std::wstring& text)
{
    out.text16(reinterpret_cast<const uint16_t*>(text.data()), static_cast<uint32_t>(text.size()));
}

// The lab's registry call record: kind (0 create, 1 query), key name, value
// name, access, buffer length, result, created.
void reportRegistryCall(uint32_t kind, const std::wstring& key, const std::wstring& value, uint32_t access,
                        uint32_t length, LONG result, bool created)
{
    Payload payload;
    payload.out().u32(kind);
    text16(payload.out(), key);
    text16(payload.out(), value);
    payload.out().u32(access);
    payload.out().u32(length);
    payload.out().u32(static_cast<uint32_t>(result));
    payload.out().u32(created ? 1 : 0);
    callLab(bridge::kRegistryCall, payload.bytes());
}

constexpr wchar_t kMachinePrefix[] = L"\\Registry\\Machine\\";

LONG WINAPI watchedCreateKey(HANDLE* key, ULONG access, const ObjectAttributes* attributes, ULONG titleIndex,
                             const CountedText* keyClass, ULONG options, ULONG* disposition)
{
    ULONG seen = 0;
    const LONG injected = keyFault(nameOf(attributes), nullptr);
    const LONG result = injected < 0 ? injected : gCreateKey(key, access, attributes, titleIndex, keyClass, options, &seen);
    if (disposition != nullptr && result >= 0) *disposition = seen;
    const std::wstring name = nameOf(attributes);
    const bool created = result >= 0 && seen == REG_CREATED_NEW_KEY;
    if (result >= 0 && key != nullptr) gOpen[*key] = {name, true};
    if (created && _wcsnicmp(name.c_str(), kMachinePrefix, wcslen(kMachinePrefix)) == 0)
        gCreatedKeys.push_back(name.substr(wcslen(kMachinePrefix)));
    reportRegistryCall(0, name, L"", access, 0, result, created);
    return result;
}

LONG WINAPI watchedQueryValueKey(HANDLE key, const CountedText* valueName, ULONG informationClass, void* information,
                                 ULONG length, ULONG* resultLength)
{
    auto open = gOpen.find(key);
    const std::wstring value = textOf(valueName);
    const LONG injected = open != gOpen.end() ? keyFault(open->second.name, &value) : 0;
    const LONG result = injected < 0 ? injected
                                     : gQueryValueKey(key, valueName, informationClass, information, length, resultLength);
    reportRegistryCall(1, open != gOpen.end() ? open->second.name : L"", textOf(valueName), 0, length, result, false);
    return result;
}

LONG WINAPI watchedCreateFile(HANDLE* file, ULONG access, const ObjectAttributes* attributes, void* ioStatus,
                              void* allocationSize, ULONG fileAttributes, ULONG shareAccess, ULONG disposition,
                              ULONG options, void* extendedAttributes, ULONG extendedLength)
{
    const std::wstring name = nameOf(attributes);
    const LONG injected = fileCallFault(gFaults.opens, name);
    const LONG result = injected < 0 ? injected
                                     : gCreateFile(file, access, attributes, ioStatus, allocationSize, fileAttributes,
                                                   shareAccess, disposition, options, extendedAttributes, extendedLength);
    if (result >= 0 && file != nullptr) gOpen[*file] = {name, false};
    Payload payload;
    text16(payload.out(), name);
    payload.out().u32(static_cast<uint32_t>(result));
    callLab(bridge::kFileOpen, payload.bytes());
    return result;
}

LONG WINAPI watchedReadFile(HANDLE file, HANDLE event, void* routine, void* context, void* ioStatus, void* buffer,
                            ULONG length, void* offset, ULONG* key)
{
    if (gOpen.count(file) != 0) {
        const unsigned number = ++gReads;
        LONG injected = gFaults.everyRead;
        for (auto it = gFaults.readNumbers.begin(); it != gFaults.readNumbers.end(); ++it) {
            if (it->first != number) continue;
            injected = it->second;
            gFaults.readNumbers.erase(it);
            break;
        }
        if (injected < 0) {
            if (ioStatus != nullptr) *static_cast<IoStatus*>(ioStatus) = {injected, 0};
            return injected;
        }
    }
    return gReadFile(file, event, routine, context, ioStatus, buffer, length, offset, key);
}

LONG WINAPI watchedQueryInformationFile(HANDLE file, void* ioStatus, void* information, ULONG length, ULONG kind)
{
    auto open = gOpen.find(file);
    if (kind == kFileStandardInformation && open != gOpen.end()) {
        const LONG counted = fileCallFault(gFaults.sizeQueries, open->second.name);
        const LONG injected = counted < 0 ? counted : gFaults.sizeQuery;
        if (injected < 0) {
            if (ioStatus != nullptr) *static_cast<IoStatus*>(ioStatus) = {injected, 0};
            return injected;
        }
    }
    return gQueryInformationFile(file, ioStatus, information, length, kind);
}

LONG WINAPI watchedSetInformationFile(HANDLE file, void* ioStatus, void* information, ULONG length, ULONG kind)
{
    if (kind == kFilePositionInformation && gFaults.setPosition < 0 && gOpen.count(file) != 0) {
        if (ioStatus != nullptr) *static_cast<IoStatus*>(ioStatus) = {gFaults.setPosition, 0};
        return gFaults.setPosition;
    }
    return gSetInformationFile(file, ioStatus, information, length, kind);
}

LONG WINAPI watchedClose(HANDLE handle)
{
    const LONG result = gClose(handle);
    if (result >= 0) gOpen.erase(handle);
    return result;
}

struct Hook {
    const char* name;
    void* watcher;
    void** original;
};

}  // namespace

bool watchKernelCalls(HMODULE image, std::string& problem)
{
    const Hook hooks[] = {
        {"ZwCreateKey", reinterpret_cast<void*>(&watchedCreateKey), reinterpret_cast<void**>(&gCreateKey)},
        {"ZwQueryValueKey", reinterpret_cast<void*>(&watchedQueryValueKey), reinterpret_cast<void**>(&gQueryValueKey)},
        {"ZwCreateFile", reinterpret_cast<void*>(&watchedCreateFile), reinterpret_cast<void**>(&gCreateFile)},
        {"ZwClose", reinterpret_cast<void*>(&watchedClose), reinterpret_cast<void**>(&gClose)},
        {"ZwReadFile", reinterpret_cast<void*>(&watchedReadFile), reinterpret_cast<void**>(&gReadFile)},
        {"ZwQueryInformationFile", reinterpret_cast<void*>(&watchedQueryInformationFile),
         reinterpret_cast<void**>(&gQueryInformationFile)},
        {"ZwSetInformationFile", reinterpret_cast<void*>(&watchedSetInformationFile),
         reinterpret_cast<void**>(&gSetInformationFile)},
    };
    auto* base = reinterpret_cast<uint8_t*>(image);
    auto* dos = reinterpret_cast<IMAGE_DOS_HEADER*>(base);
    auto* nt = reinterpret_cast<IMAGE_NT_HEADERS64*>(base + dos->e_lfanew);
    const IMAGE_DATA_DIRECTORY& directory = nt->OptionalHeader.DataDirectory[IMAGE_DIRECTORY_ENTRY_IMPORT];
    int found = 0;
    for (auto* import = reinterpret_cast<IMAGE_IMPORT_DESCRIPTOR*>(base + directory.VirtualAddress); import->Name != 0;
         ++import) {
        if (_stricmp(reinterpret_cast<const char*>(base + import->Name), "ntoskrnl.exe") != 0) continue;
        auto* names = reinterpret_cast<IMAGE_THUNK_DATA64*>(base + import->OriginalFirstThunk);
        auto* addresses = reinterpret_cast<IMAGE_THUNK_DATA64*>(base + import->FirstThunk);
        for (; names->u1.AddressOfData != 0; ++names, ++addresses) {
            if (IMAGE_SNAP_BY_ORDINAL64(names->u1.Ordinal)) continue;
            auto* byName = reinterpret_cast<IMAGE_IMPORT_BY_NAME*>(base + names->u1.AddressOfData);
            for (const Hook& hook : hooks) {
                if (std::strcmp(reinterpret_cast<const char*>(byName->Name), hook.name) != 0) continue;
                DWORD previous = 0;
                VirtualProtect(&addresses->u1.Function, sizeof(void*), PAGE_READWRITE, &previous);
                *hook.original = reinterpret_cast<void*>(addresses->u1.Function);
                addresses->u1.Function = reinterpret_cast<ULONGLONG>(hook.watcher);
                VirtualProtect(&addresses->u1.Function, sizeof(void*), previous, &previous);
                ++found;
            }
        }
    }
    if (found != static_cast<int>(sizeof(hooks) / sizeof(hooks[0]))) {
        problem = "the image does not import every watched kernel call from ntoskrnl.exe";
        return false;
    }
    return true;
}

void setKernelFaults(const KernelFaults& faults)
{
    gFaults = faults;
    gReads = 0;
}

std::vector<std::string> openKernelHandles()
{
    std::vector<std::string> result;
    for (const auto& entry : gOpen) {
        std::string name(entry.second.name.begin(), entry.second.name.end());
        result.push_back(std::string(entry.second.key ? "key " : "file ") + name);
    }
    return result;
}

std::vector<std::wstring> keysCreatedByModule()
{
    return gCreatedKeys;
}

}  // namespace winehost
