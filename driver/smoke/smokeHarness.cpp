// Loads the real driver image into a user process under Wine, beside the test
// karvelk.sys, and drives it the way the kernel and the host do: load, start,
// stop, the version services, unload. Wine's ntoskrnl.exe serves the kernel
// imports, so registry and file calls reach a real implementation.
//
// Usage: morvanek-smoke <path of morvanek.sys>. Exit status 0 when every
// check passes; each check prints one line.
#include <windows.h>
#include <imagehlp.h>

#include <cstdint>
#include <cstdio>
#include <cstring>
#include <string>

#include "fakeHostProbe.h"
#include "moduleRecordView.h"

namespace {

int gFailures = 0;

void check(bool passed, const std::string& what)
{
    std::printf("%s: %s\n", passed ? "ok" : "FAILED", what.c_str());
    if (!passed) ++gFailures;
}

void checkEqual(int64_t actual, int64_t expected, const std::string& what)
{
    char values[64];
    std::snprintf(values, sizeof(values), " (got %lld, want %lld)", static_cast<long long>(actual),
                  static_cast<long long>(expected));
    check(actual == expected, what + (actual == expected ? "" : values));
}

void checkText(const std::string& actual, const std::string& expected, const std::string& what)
{
    check(actual == expected, what + (actual == expected ? "" : "\n  got:  " + actual + "\n  want: " + expected));
}

// The kernel's counted string, declared here because <windows.h> leaves it out.
struct CountedText {
    uint16_t Length;
    uint16_t MaximumLength;
    const wchar_t* Buffer;
};

// The exports as a caller in another module sees them. The status is a 32-bit
// `long &`, passed as a pointer. tSSVersion has a user-declared constructor,
// so the MSVC ABI returns it through a hidden pointer passed first and handed
// back in RAX; taken by value it travels as a 32-bit integer.
using DllInitializeFn = int32_t (*)(const CountedText* registryPath);
using DllUnloadFn = int32_t (*)();
using SetWdmLoadStateFn = const uint8_t* (*)(uint32_t state);
using CallSsMainFn = int32_t (*)(uint32_t reason);
using SetLegacyLoadStateFn = void (*)(uint32_t state);
using VersionQueryFn = uint32_t* (*)(uint32_t* result, int32_t* status);
using CompareVersionFn = void (*)(const uint32_t* newest, const uint32_t* oldest, int32_t* status,
                                  const char* component);
using CompareFirmwareVersionFn = void (*)(uint32_t expected, uint16_t productId, int32_t* status);

struct ModuleExports {
    DllInitializeFn dllInitialize;
    DllUnloadFn dllUnload;
    SetWdmLoadStateFn setWdmLoadState;
    CallSsMainFn callSsMain;
    SetLegacyLoadStateFn setLegacyLoadState;
    VersionQueryFn getCurrentVersion;
    VersionQueryFn getOldestCompatibleVersion;
    CompareVersionFn compareVersion;
    CompareFirmwareVersionFn compareFirmwareVersion;
};

struct HostProbe {
    decltype(&fakeHostState) state;
    decltype(&fakeHostSetDeviceTreePresent) setDeviceTreePresent;
    decltype(&fakeHostOfferDevice) offerDevice;
};

template <typename Function>
Function resolve(HMODULE module, const char* name)
{
    FARPROC address = GetProcAddress(module, name);
    check(address != nullptr, std::string("export ") + name + " resolves");
    return reinterpret_cast<Function>(reinterpret_cast<void*>(address));
}

ModuleExports resolveModule(HMODULE module)
{
    ModuleExports e{};
    e.dllInitialize = resolve<DllInitializeFn>(module, "DllInitialize");
    e.dllUnload = resolve<DllUnloadFn>(module, "DllUnload");
    e.setWdmLoadState = resolve<SetWdmLoadStateFn>(module, "pkgSetWDMWrapperLoadStateAndGetGUID");
    e.callSsMain = resolve<CallSsMainFn>(module, "pkgWDMWrapperCallSSMain");
    e.setLegacyLoadState = resolve<SetLegacyLoadStateFn>(module, "pkgSetLegacyWrapperLoadState");
    e.getCurrentVersion =
        resolve<VersionQueryFn>(module, "?getCurrentVersion@nMORVANE_1_4@@YA?AVtSSVersion@@AEAJ@Z");
    e.getOldestCompatibleVersion =
        resolve<VersionQueryFn>(module, "?getOldestCompatibleVersion@nMORVANE_1_4@@YA?AVtSSVersion@@AEAJ@Z");
    e.compareVersion = resolve<CompareVersionFn>(module, "?compareVersion@nMORVANE_1_4@@YAXAEBVtSSVersion@@0AEAJPEBD@Z");
    e.compareFirmwareVersion =
        resolve<CompareFirmwareVersionFn>(module, "?compareFirmwareVersion@nMORVANE_1_2@@YAXVtSSVersion@@GAEAJ@Z");
    return e;
}

bool allResolved(const ModuleExports& e)
{
    return e.dllInitialize && e.dllUnload && e.setWdmLoadState && e.callSsMain && e.setLegacyLoadState &&
           e.getCurrentVersion && e.getOldestCompatibleVersion && e.compareVersion && e.compareFirmwareVersion;
}

void checkImageChecksum(const char* imagePath)
{
    DWORD stored = 0;
    DWORD computed = 0;
    const DWORD result = MapFileAndCheckSumA(imagePath, &stored, &computed);
    checkEqual(result, CHECKSUM_SUCCESS, "imagehlp reads the image");
    check(stored != 0 && stored == computed, "stored checksum agrees with imagehlp's");
}

void checkLoad(const ModuleExports& e, const HostProbe& host)
{
    static const wchar_t kRegistryPath[] = L"\\Registry\\Machine\\System\\CurrentControlSet\\Services\\morvanek";
    const CountedText path = {sizeof(kRegistryPath) - sizeof(wchar_t), sizeof(kRegistryPath), kRegistryPath};
    checkEqual(e.dllInitialize(&path), 0, "DllInitialize succeeds");

    const FakeHostState& state = *host.state();
    checkEqual(state.registrations, 1, "module registered once");
    checkEqual(state.lastPackageEvent, 0, "package event 0 logged on load");
    if (state.registeredModule == nullptr) return;
    checkText(registeredModuleName(state.registeredModule), "morvanek", "registered module name");
    check(registeredRegistryPath(state.registeredModule) == reinterpret_cast<const char16_t*>(kRegistryPath),
          "registry path copied into the package record");

    static const uint8_t kGuid[16] = {0x92, 0x7A, 0x4C, 0x1F, 0x5E, 0x3B, 0x81, 0x4D,
                                      0x9C, 0x06, 0x72, 0xE8, 0xA1, 0xB5, 0xD3, 0xF4};
    const uint8_t* guid = e.setWdmLoadState(3);
    check(guid == registeredModuleGuid(state.registeredModule) && std::memcmp(guid, kGuid, sizeof(kGuid)) == 0,
          "module GUID returned from the descriptor");
    checkEqual(registeredWdmLoadState(state.registeredModule), 3, "WDM load state stored in the package record");
}

void checkStartWithoutDeviceTree(const ModuleExports& e, const HostProbe& host)
{
    const FakeHostState& state = *host.state();
    host.setDeviceTreePresent(0);
    const uint32_t logLinesBefore = state.logLines;
    checkEqual(e.callSsMain(0), -50150, "ssMain(0) without a device tree fails");
    checkEqual(state.logLines, logLinesBefore + 1, "the failure is logged once");
    checkText(state.lastLogLine,
              "ssKernelExportDriver|.\\source\\package\\windows\\clientPkgExportDriver:97 - |10||"
              "ssMain(0) of morvanek failed with status -50150\n",
              "failure log line");
    checkEqual(e.callSsMain(1), 0, "ssMain(1) after the failed start");
    host.setDeviceTreePresent(1);
}

void checkStartAndStop(const ModuleExports& e, const HostProbe& host)
{
    const FakeHostState& state = *host.state();
    checkEqual(e.callSsMain(0), 0, "ssMain(0) with an empty device tree");
    checkEqual(state.listeners, 2, "two listener records added");
    checkEqual(state.listenerKindMask, (1 << 1) | (1 << 2), "one removal and one arrival listener");
    checkEqual(state.openQueries, 1, "the table keeps its query");

    // A device of another vendor: read and ignored, through the module's
    // callback vtable as the host calls it.
    host.offerDevice(0x1234, 0x4A10);
    checkEqual(state.attributeReads, 2, "foreign device: vendor and product read");
    checkEqual(state.streamsOpened, 0, "foreign device: no stream opened");

    checkEqual(e.callSsMain(2), 0, "ssMain(2) does nothing");
    checkEqual(state.listeners, 2, "listeners stay after ssMain(2)");
    checkEqual(e.callSsMain(1), 0, "ssMain(1) stops");
    checkEqual(state.listeners, 0, "listener records removed");
    checkEqual(state.openQueries, 0, "query released");
}

void checkVersionQueries(const ModuleExports& e)
{
    struct Query {
        VersionQueryFn function;
        uint32_t expected;
        const char* name;
    };
    const Query queries[] = {{e.getCurrentVersion, 0x0143C000, "getCurrentVersion"},
                             {e.getOldestCompatibleVersion, 0x01004000, "getOldestCompatibleVersion"}};
    for (const Query& query : queries) {
        uint32_t version = 0xDEADBEEF;
        int32_t status = 7;
        const uint32_t* returned = query.function(&version, &status);
        checkEqual(version, query.expected, std::string(query.name) + " value");
        check(returned == &version, std::string(query.name) + " returns through the hidden pointer");
        checkEqual(status, 7, std::string(query.name) + " leaves the status alone");
    }
}

void checkCompareVersion(const ModuleExports& e, const HostProbe& host)
{
    const FakeHostState& state = *host.state();
    const uint32_t linesBefore = state.debugLines;
    const uint32_t installedNewest = 0x0143C000;
    const uint32_t installedOldest = 0x01004000;

    int32_t status = 0;
    e.compareVersion(&installedNewest, &installedOldest, &status, "smoke");
    checkEqual(status, 0, "compareVersion accepts the installed range");
    checkEqual(state.debugLines, linesBefore, "nothing printed on success");

    status = 0;
    e.compareVersion(&installedOldest, &installedNewest, &status, "smoke");
    checkEqual(status, -50000, "compareVersion refuses an inverted range");
    checkEqual(state.debugLines, linesBefore + 1, "one line printed on failure");
    checkText(state.lastDebugLine,
              "[morvanek] version check failed with status = -50000. Component 'smoke' desires the range "
              "1.4.3f0 - 1.0.0a0 however the installed range is 1.0.0a0 - 1.4.3f0\n",
              "version check line");
}

std::wstring imagePath0200(uint16_t productId)
{
    wchar_t system[MAX_PATH];
    GetSystemDirectoryW(system, MAX_PATH);
    wchar_t name[64];
    std::swprintf(name, 64, L"\\drivers\\QVUSB%04X0200.bin", productId);
    return std::wstring(system) + name;
}

bool writeImage(const std::wstring& path, const char* headerDigits)
{
    std::string image(514, '\0');
    image += headerDigits;
    image.resize(1024, '\0');
    HANDLE file = CreateFileW(path.c_str(), GENERIC_WRITE, 0, nullptr, CREATE_ALWAYS, FILE_ATTRIBUTE_NORMAL, nullptr);
    if (file == INVALID_HANDLE_VALUE) return false;
    DWORD written = 0;
    const BOOL ok = WriteFile(file, image.data(), static_cast<DWORD>(image.size()), &written, nullptr);
    CloseHandle(file);
    return ok && written == image.size();
}

// Through Wine's registry ("SystemRoot") and file calls (open, position, read).
void checkCompareFirmwareVersion(const ModuleExports& e)
{
    int32_t status = 0;
    e.compareFirmwareVersion(0x0143C000, 0x4BEE, &status);
    checkEqual(status, -50150, "compareFirmwareVersion without an image file");

    const uint16_t productId = 0x4B01;
    const std::wstring path = imagePath0200(productId);
    // Version 0x01500000, header revision 0x0201, image type 0x0A.
    check(writeImage(path, "01500000000000010002000302010A"), "test image written to the drivers directory");
    struct Case {
        uint32_t expected;
        int32_t status;
        const char* what;
    };
    const Case cases[] = {{0x0143C000, -50253, "image newer than expected"},
                          {0x01500000, 0, "image as expected"},
                          {0x01600000, -50252, "image older than expected"}};
    for (const Case& c : cases) {
        status = 0;
        e.compareFirmwareVersion(c.expected, productId, &status);
        checkEqual(status, c.status, std::string("compareFirmwareVersion: ") + c.what);
    }
    DeleteFileW(path.c_str());
}

void checkUnload(const ModuleExports& e, const HostProbe& host)
{
    const FakeHostState& state = *host.state();
    checkEqual(e.dllUnload(), 0, "DllUnload succeeds");
    checkEqual(state.registrations, 0, "module unregistered");
    checkEqual(state.lastPackageEvent, 1, "package event 1 logged on unload");
    // Load, five module main calls through the wrapper, unload.
    checkEqual(state.packageEvents, 7, "one package event per load, module main call and unload");
    checkEqual(state.liveAllocations, 0, "every host block given back");
}

}  // namespace

int main(int argc, char** argv)
{
    if (argc != 2) {
        std::fprintf(stderr, "usage: morvanek-smoke <path of morvanek.sys>\n");
        return 2;
    }
    const char* imagePath = argv[1];
    checkImageChecksum(imagePath);

    // karvelk.sys is found beside this program, which the loader searches first.
    HMODULE module = LoadLibraryA(imagePath);
    if (module == nullptr) {
        std::printf("FAILED: LoadLibrary(%s), error %lu\n", imagePath, GetLastError());
        return 1;
    }
    HMODULE hostModule = GetModuleHandleA("karvelk.sys");
    check(hostModule != nullptr, "karvelk.sys loaded with the image");
    if (hostModule == nullptr) return 1;
    const HostProbe host = {resolve<decltype(&fakeHostState)>(hostModule, "fakeHostState"),
                            resolve<decltype(&fakeHostSetDeviceTreePresent)>(hostModule, "fakeHostSetDeviceTreePresent"),
                            resolve<decltype(&fakeHostOfferDevice)>(hostModule, "fakeHostOfferDevice")};
    const ModuleExports exports = resolveModule(module);
    if (!host.state || !host.setDeviceTreePresent || !host.offerDevice || !allResolved(exports)) return 1;

    // Wine never calls DllInitialize; the kernel would, so we do.
    checkLoad(exports, host);
    checkStartWithoutDeviceTree(exports, host);
    checkStartAndStop(exports, host);
    checkVersionQueries(exports);
    checkCompareVersion(exports, host);
    checkCompareFirmwareVersion(exports);
    checkUnload(exports, host);
    check(FreeLibrary(module) != 0, "image unloaded");

    std::printf("%s: %d check(s) failed\n", gFailures == 0 ? "PASSED" : "FAILED", gFailures);
    return gFailures == 0 ? 0 : 1;
}
