// morvanek-wine-host: the Windows side of the lab's Windows engine. Loads the
// real morvanek.sys into this process under Wine, beside the test karvelk.sys,
// and does what the lab asks: the kernel's calls of the driver's exports, the
// host's calls of the module main and of listener callbacks. The host's own
// calls go back to the lab, where the emulated devices live; the module's
// kernel calls go to Wine's ntoskrnl.exe.
//
// Usage: morvanek-wine-host <Windows path of morvanek.sys>, with the lab on
// standard input and output. MORVANEK_WINE_HOST_MISTAKE=slotOrder or
// versionByReference makes a deliberate ABI mistake, for the host's own test.
#include <windows.h>
#include <imagehlp.h>

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "karvelkBridge.h"
#include "kernelWatch.h"
#include "labLink.h"
#include "wineRegistry.h"

namespace {

using winehost::Payload;

// The exports as a caller in another module sees them. The status is a 32-bit
// `long &`, passed as a pointer. tSSVersion has a user-declared constructor,
// so the MSVC ABI returns it through a hidden pointer passed first and handed
// back in RAX; taken by value it travels as a 32-bit integer.
struct CountedText {
    uint16_t Length;
    uint16_t MaximumLength;
    const wchar_t* Buffer;
};
using DllInitializeFn = int32_t (*)(const CountedText* registryPath);
using DllUnloadFn = int32_t (*)();
using SetWdmLoadStateFn = const uint8_t* (*)(uint32_t state);
using CallSsMainFn = int32_t (*)(uint32_t reason);
using SetLegacyLoadStateFn = void (*)(uint32_t state);
using VersionQueryFn = uint32_t* (*)(uint32_t* result, int32_t* status);
using CompareVersionFn = void (*)(const uint32_t* newest, const uint32_t* oldest, int32_t* status,
                                  const char* component);
using CompareFirmwareVersionFn = void (*)(uint32_t expected, uint16_t productId, int32_t* status);
// The mistake: the version passed as if by reference.
using CompareFirmwareVersionByReferenceFn = void (*)(const uint32_t* expected, uint16_t productId, int32_t* status);

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

ModuleExports gModule;
uint32_t gMistakes;
HMODULE gHost;
HMODULE gImage;
std::vector<HANDLE> gHeldFiles;

[[noreturn]] void fail(const std::string& what)
{
    std::fprintf(stderr, "morvanek-wine-host: %s\n", what.c_str());
    std::fflush(stderr);
    ExitProcess(3);
}

template <typename Function>
Function resolve(HMODULE module, const char* name)
{
    FARPROC address = GetProcAddress(module, name);
    if (address == nullptr) fail(std::string("no export ") + name);
    return reinterpret_cast<Function>(reinterpret_cast<void*>(address));
}

// ---- the bridge karvelk.sys calls through

int32_t bridgeCall(void*, const uint8_t* message, uint32_t size, uint8_t* reply, uint32_t capacity)
{
    bridge::Header header = {};
    std::memcpy(&header, message, sizeof(header));
    std::vector<uint8_t> payload(message + sizeof(header), message + size);
    std::vector<uint8_t> answer = winehost::callLab(header.kind, payload);
    const uint32_t length = static_cast<uint32_t>(answer.size()) < capacity ? static_cast<uint32_t>(answer.size())
                                                                            : capacity;
    if (length != 0) std::memcpy(reply, answer.data(), length);
    return static_cast<int32_t>(length);
}

void* bridgeAllocate(void*, uint64_t size)
{
    return std::calloc(1, static_cast<size_t>(size));
}

void bridgeRelease(void*, void* block)
{
    std::free(block);
}

void attachHost()
{
    KarvelkBridge link = {};
    link.call = &bridgeCall;
    link.allocate = &bridgeAllocate;
    link.release = &bridgeRelease;
    static const char* const kCasts[4][2] = {
        {"?___CPPKRLDynamicCast@tTransferParameter@nQVKORD100@@UEBAPEBXPEBX@Z",
         "?___CPPKRLDynamicCast@tTransferParameter@nQVKORD100@@UEAAPEAXPEBX@Z"},
        {"?___CPPKRLDynamicCast@tTransferParameterUSBControl@nQVKORD100@@UEBAPEBXPEBX@Z",
         "?___CPPKRLDynamicCast@tTransferParameterUSBControl@nQVKORD100@@UEAAPEAXPEBX@Z"},
        {"?___CPPKRLDynamicCast@tStreamParameter@nQVKORD100@@UEBAPEBXPEBX@Z",
         "?___CPPKRLDynamicCast@tStreamParameter@nQVKORD100@@UEAAPEAXPEBX@Z"},
        {"?___CPPKRLDynamicCast@tControlStreamParameterUSB@nQVKORD100@@UEBAPEBXPEBX@Z",
         "?___CPPKRLDynamicCast@tControlStreamParameterUSB@nQVKORD100@@UEAAPEAXPEBX@Z"},
    };
    for (int c = 0; c < 4; ++c) {
        for (int overload = 0; overload < 2; ++overload)
            link.castExports[c][overload] = resolve<const void*>(gHost, kCasts[c][overload]);
    }
    link.mistakes = gMistakes;
    resolve<decltype(&karvelkAttachBridge)>(gHost, "karvelkAttachBridge")(&link);
}

// ---- the lab's calls

std::wstring readText16(bridge::Reader& in)
{
    const uint8_t* start = nullptr;
    const uint32_t units = in.span(&start, 2);
    if (start == nullptr) return L"";
    std::wstring text(units, L'\0');
    std::memcpy(text.data(), start, units * 2);
    return text;
}

std::string readText(bridge::Reader& in, bool* isNull = nullptr)
{
    const uint8_t* start = nullptr;
    const uint32_t length = in.span(&start);
    if (isNull != nullptr) *isNull = start == nullptr;
    return start == nullptr ? std::string() : std::string(reinterpret_cast<const char*>(start), length);
}

std::vector<uint8_t> prepareKernel(bridge::Reader& in)
{
    winehost::RegistryPlan plan;
    plan.regFile = readText16(in);
    for (uint32_t count = in.u32(); count != 0 && !in.broken(); --count) plan.keys.push_back(readText16(in));
    for (uint32_t count = in.u32(); count != 0 && !in.broken(); --count) {
        winehost::ValueToSet value;
        value.key = readText16(in);
        value.name = readText16(in);
        plan.values.push_back(value);
    }
    for (uint32_t count = in.u32(); count != 0 && !in.broken(); --count) {
        winehost::ValueToSet value;
        value.key = readText16(in);
        value.name = readText16(in);
        plan.absent.push_back(value);
    }
    winehost::KernelFaults faults;
    for (uint32_t count = in.u32(); count != 0 && !in.broken(); --count) {
        winehost::KernelFaults::KeyFault fault;
        fault.keyPath = readText16(in);
        fault.query = in.u32() != 0;
        fault.valueName = readText16(in);
        fault.status = static_cast<LONG>(in.u32());
        fault.number = in.u64();
        faults.keys.push_back(fault);
    }
    faults.everyRead = static_cast<LONG>(in.u32());
    for (uint32_t count = in.u32(); count != 0 && !in.broken(); --count) {
        const unsigned number = in.u32();
        faults.readNumbers.emplace_back(number, static_cast<LONG>(in.u32()));
    }
    faults.sizeQuery = static_cast<LONG>(in.u32());
    faults.setPosition = static_cast<LONG>(in.u32());
    // Files another program holds open without sharing, as that program would.
    for (uint32_t count = in.u32(); count != 0 && !in.broken(); --count) {
        const std::wstring path = readText16(in);
        HANDLE held = CreateFileW(path.c_str(), GENERIC_READ, 0, nullptr, OPEN_EXISTING, FILE_ATTRIBUTE_NORMAL, nullptr);
        if (held != INVALID_HANDLE_VALUE) gHeldFiles.push_back(held);
    }
    for (auto* calls : {&faults.opens, &faults.sizeQueries}) {
        for (uint32_t count = in.u32(); count != 0 && !in.broken(); --count) {
            winehost::KernelFaults::FileCallFault fault;
            fault.number = in.u64();
            fault.status = static_cast<LONG>(in.u32());
            fault.file = readText16(in);
            calls->push_back(fault);
        }
    }
    winehost::setKernelFaults(faults);
    std::string problem;
    Payload reply;
    const bool applied = winehost::applyRegistry(plan, problem);
    reply.out().u32(applied ? 1 : 0);
    reply.out().text(problem.c_str());
    return reply.bytes();
}

std::vector<uint8_t> finish()
{
    Payload reply;
    std::vector<std::string> lines;
    char text[1024];
    const uint32_t length = resolve<decltype(&karvelkLeftovers)>(gHost, "karvelkLeftovers")(text, sizeof(text));
    std::string held(text, length);
    for (size_t start = 0; start < held.size();) {
        size_t end = held.find('\n', start);
        lines.push_back(held.substr(start, end - start));
        start = end == std::string::npos ? held.size() : end + 1;
    }
    for (const std::string& handle : winehost::openKernelHandles())
        lines.push_back("kernel handle left open under Wine: " + handle);
    winehost::restoreRegistry(winehost::keysCreatedByModule());
    for (HANDLE held : gHeldFiles) CloseHandle(held);
    gHeldFiles.clear();
    reply.out().u32(static_cast<uint32_t>(lines.size()));
    for (const std::string& line : lines) reply.out().text(line.c_str());
    return reply.bytes();
}

std::vector<uint8_t> serve(const winehost::Message& call)
{
    bridge::Reader in(call.payload.data(), static_cast<uint32_t>(call.payload.size()));
    Payload reply;
    bridge::Writer& out = reply.out();
    switch (call.kind) {
    case bridge::kLoad: {
        const std::wstring path = readText16(in);
        const uint16_t bytes = static_cast<uint16_t>(path.size() * sizeof(wchar_t));
        const CountedText text = {bytes, bytes, path.c_str()};
        out.u32(static_cast<uint32_t>(gModule.dllInitialize(&text)));
        break;
    }
    case bridge::kUnload:
        out.u32(static_cast<uint32_t>(gModule.dllUnload()));
        break;
    case bridge::kWrapperMain:
        out.u32(static_cast<uint32_t>(gModule.callSsMain(in.u32())));
        break;
    case bridge::kModuleMain: {
        int32_t result = 0;
        const int32_t called = resolve<decltype(&karvelkCallModuleMain)>(gHost, "karvelkCallModuleMain")(in.u32(),
                                                                                                     &result);
        out.u32(static_cast<uint32_t>(called));
        out.u32(static_cast<uint32_t>(result));
        break;
    }
    case bridge::kSetWdmLoadState: {
        const uint8_t* guid = gModule.setWdmLoadState(in.u32());
        out.u32(guid == nullptr ? 1 : 0);
        out.bytes(guid, guid == nullptr ? 0 : 16);
        break;
    }
    case bridge::kSetLegacyLoadState:
        gModule.setLegacyLoadState(in.u32());
        break;
    case bridge::kVersionQuery: {
        const bool oldest = in.u32() != 0;
        int32_t status = static_cast<int32_t>(in.u32());
        uint32_t version = 0xDEADBEEF;
        (oldest ? gModule.getOldestCompatibleVersion : gModule.getCurrentVersion)(&version, &status);
        out.u32(version);
        out.u32(static_cast<uint32_t>(status));
        break;
    }
    case bridge::kCompareVersion: {
        const uint32_t newest = in.u32();
        const uint32_t oldest = in.u32();
        int32_t status = static_cast<int32_t>(in.u32());
        bool isNull = false;
        const std::string component = readText(in, &isNull);
        gModule.compareVersion(&newest, &oldest, &status, isNull ? nullptr : component.c_str());
        out.u32(static_cast<uint32_t>(status));
        break;
    }
    case bridge::kCompareFirmwareVersion: {
        const uint32_t version = in.u32();
        const uint16_t productId = static_cast<uint16_t>(in.u32());
        int32_t status = static_cast<int32_t>(in.u32());
        if ((gMistakes & kMistakeVersionByReference) != 0) {
            reinterpret_cast<CompareFirmwareVersionByReferenceFn>(reinterpret_cast<void*>(gModule.compareFirmwareVersion))(&version, productId,
                                                                                                 &status);
        } else {
            gModule.compareFirmwareVersion(version, productId, &status);
        }
        out.u32(static_cast<uint32_t>(status));
        break;
    }
    case bridge::kDeviceEvent: {
        const uint64_t record = in.u64();
        const uint64_t device = in.u64();
        resolve<decltype(&karvelkDeliverEvent)>(gHost, "karvelkDeliverEvent")(record, device);
        break;
    }
    case bridge::kPrepareKernel:
        return prepareKernel(in);
    case bridge::kFinish:
        return finish();
    default:
        fail("the lab sent a call of unknown kind " + std::to_string(call.kind));
    }
    return reply.bytes();
}

LONG WINAPI onCrash(EXCEPTION_POINTERS* exception)
{
    std::fprintf(stderr, "morvanek-wine-host: exception 0x%08lX at %p\n",
                 static_cast<unsigned long>(exception->ExceptionRecord->ExceptionCode),
                 exception->ExceptionRecord->ExceptionAddress);
    std::fflush(stderr);
    ExitProcess(5);
}

uint32_t mistakesFromEnvironment()
{
    const char* mistake = std::getenv("MORVANEK_WINE_HOST_MISTAKE");
    if (mistake == nullptr) return kMistakeNone;
    if (std::strcmp(mistake, "slotOrder") == 0) return kMistakeSlotOrder;
    if (std::strcmp(mistake, "versionByReference") == 0) return kMistakeVersionByReference;
    fail(std::string("unknown MORVANEK_WINE_HOST_MISTAKE ") + mistake);
}

}  // namespace

int main(int argc, char** argv)
{
    if (argc != 2) fail("usage: morvanek-wine-host <Windows path of morvanek.sys>");
    SetUnhandledExceptionFilter(&onCrash);
    gMistakes = mistakesFromEnvironment();

    // The checksum the kernel would check, read by Windows' own imagehlp as a
    // second opinion beside the build's stamp.
    DWORD stored = 0;
    DWORD computed = 0;
    if (MapFileAndCheckSumA(argv[1], &stored, &computed) != CHECKSUM_SUCCESS || stored == 0 || stored != computed)
        fail("the image's PE checksum is missing or wrong (stored " + std::to_string(stored) + ", computed " +
             std::to_string(computed) + ")");

    // karvelk.sys is found beside this program, which the loader searches first.
    gImage = LoadLibraryA(argv[1]);
    if (gImage == nullptr) fail(std::string("LoadLibrary(") + argv[1] + ") failed, error " + std::to_string(GetLastError()));
    gHost = GetModuleHandleA("karvelk.sys");
    if (gHost == nullptr) fail("karvelk.sys did not come with the image");
    attachHost();
    std::string problem;
    if (!winehost::watchKernelCalls(gImage, problem)) fail(problem);

    gModule.dllInitialize = resolve<DllInitializeFn>(gImage, "DllInitialize");
    gModule.dllUnload = resolve<DllUnloadFn>(gImage, "DllUnload");
    gModule.setWdmLoadState = resolve<SetWdmLoadStateFn>(gImage, "pkgSetWDMWrapperLoadStateAndGetGUID");
    gModule.callSsMain = resolve<CallSsMainFn>(gImage, "pkgWDMWrapperCallSSMain");
    gModule.setLegacyLoadState = resolve<SetLegacyLoadStateFn>(gImage, "pkgSetLegacyWrapperLoadState");
    gModule.getCurrentVersion =
        resolve<VersionQueryFn>(gImage, "?getCurrentVersion@nMORVANE_1_4@@YA?AVtSSVersion@@AEAJ@Z");
    gModule.getOldestCompatibleVersion =
        resolve<VersionQueryFn>(gImage, "?getOldestCompatibleVersion@nMORVANE_1_4@@YA?AVtSSVersion@@AEAJ@Z");
    gModule.compareVersion =
        resolve<CompareVersionFn>(gImage, "?compareVersion@nMORVANE_1_4@@YAXAEBVtSSVersion@@0AEAJPEBD@Z");
    gModule.compareFirmwareVersion =
        resolve<CompareFirmwareVersionFn>(gImage, "?compareFirmwareVersion@nMORVANE_1_2@@YAXVtSSVersion@@GAEAJ@Z");

    winehost::setCallServer(&serve);
    winehost::serveUntilFinished();
    // Wine never calls DllUnload either; the lab's steps did, or the run says what was left.
    return 0;
}
