#include "bridgeServer.h"

#include <cstring>

#include <fmt/format.h>

#include "scenarioError.h"
#include "wireArguments.h"
#include "sim/kernel/simKernel.h"
#include "wineProcess.h"

namespace lab {

namespace {

using sim::Host;

BridgeServer* gServer = nullptr;  // the Windows engine runs one module at a time

// The module main as the stand-in finds it in the mirrored record.
tStatus remoteModuleMain(uint32_t reason)
{
    return gServer != nullptr ? gServer->callModuleMain(reason) : sim::kHostFailure;
}

// Stand-ins for what the Windows side handed over but the lab never gave
// out: the stand-in sees an object it does not know and says so.
class UnknownQuery final : public DeviceQuery {
public:
    void setAttribute(uint32_t, const void*, tStatus&) override {}
    uint32_t getId() override { return 0; }
};
class UnknownStream final : public ControlStream {
public:
    void* allocateBuffer(uint32_t, tStatus&) override { return nullptr; }
    void freeBuffer(void*, tStatus&) override {}
    void transfer(nQVKORD100::tTransferParameterUSBControl*, tStatus&) override {}
};
UnknownQuery gUnknownQuery;
UnknownStream gUnknownStream;
ListenerRecord gUnknownListener;
_tLibModuleInfo gUnknownModule;
uint8_t gUnknownBlock[16];
// A data stage that is in none of the stream's buffers.
uint8_t gOutsideEveryBuffer[512];

std::string textOrNull(const std::string& text, bool isNull)
{
    return isNull ? "(null)" : text;
}

std::vector<uint8_t> reply(const std::function<void(bridge::Writer&)>& write)
{
    BridgePayload payload;
    write(payload.out());
    return payload.bytes();
}

tStatus statusOf(uint32_t bits)
{
    return static_cast<tStatus>(bits);
}

}  // namespace

struct BridgeServer::Registration {
    _tLibModuleInfo info{};
    ModulePackageRecord package{};
    ModuleDescriptor descriptor{};
    WCHAR elsewhere[260] = {};  // a registry path buffer outside the record
    std::string moduleName;
    std::string descriptorName;
    std::string firstName;
    std::string secondName;
};

// A listener record as the stand-in's tree keeps it; its callback reports the
// event to the record the module added on the Windows side.
class BridgeServer::Listener final : public DeviceEventCallback {
public:
    Listener(BridgeServer& server, uint64_t windowsRecord) : server_(server), windowsRecord_(windowsRecord) {}
    void onDeviceEvent(UsbDevice* device) override
    {
        BridgePayload payload;
        payload.out().u64(windowsRecord_);
        payload.out().u64(reinterpret_cast<uintptr_t>(device));
        server_.callWindows_(bridge::kDeviceEvent, payload.bytes());
    }
    ListenerRecord record{};

private:
    BridgeServer& server_;
    uint64_t windowsRecord_;
};

BridgeServer::BridgeServer(CallWindows callWindows, HostPath hostPath)
    : callWindows_(std::move(callWindows)), hostPath_(std::move(hostPath))
{
    gServer = this;
}

BridgeServer::~BridgeServer()
{
    if (gServer == this) gServer = nullptr;
}

tStatus BridgeServer::callModuleMain(uint32_t reason)
{
    BridgePayload payload;
    payload.out().u32(reason);
    std::vector<uint8_t> answer = callWindows_(bridge::kModuleMain, payload.bytes());
    bridge::Reader in(answer.data(), static_cast<uint32_t>(answer.size()));
    if (in.u32() == 0) {
        Host::get().reportMisuse("module main called while karvelk.sys has no module registered");
        return sim::kHostFailure;
    }
    return statusOf(in.u32());
}

sim::UsbDeviceSim* BridgeServer::device(uint64_t id)
{
    for (sim::UsbDeviceSim* candidate : Host::get().tree()->allDevices()) {
        if (reinterpret_cast<uintptr_t>(candidate) == id) return candidate;
    }
    return nullptr;
}

ControlStream* BridgeServer::stream(uint64_t id)
{
    auto it = streams_.find(id);
    return it != streams_.end() ? it->second : &gUnknownStream;
}

DeviceQuery* BridgeServer::query(uint64_t id)
{
    return queries_.count(id) != 0 ? reinterpret_cast<DeviceQuery*>(static_cast<uintptr_t>(id)) : &gUnknownQuery;
}

void* BridgeServer::block(uint64_t id)
{
    auto it = blocks_.find(id);
    return it != blocks_.end() ? it->second : gUnknownBlock;
}

std::vector<uint8_t> BridgeServer::serve(uint32_t kind, bridge::Reader& in)
{
    Host& host = Host::get();
    switch (kind) {
    case bridge::kIsInitialized:
        return reply([&](bridge::Writer& out) { out.u32(static_cast<uint32_t>(pkgIsKarvelkInitialized())); });
    case bridge::kPackageEvent: {
        const uint32_t event = in.u32();
        bool nulls[3] = {};
        const std::string first = readText(in, &nulls[0]);
        const std::string second = readText(in, &nulls[1]);
        const std::string main = readText(in, &nulls[2]);
        const uint64_t moduleMain = in.u64();
        const tStatus result = pkgModulePackageEventLog(event, nulls[0] ? nullptr : first.c_str(),
                                                        nulls[1] ? nullptr : second.c_str(),
                                                        nulls[2] ? nullptr : main.c_str(),
                                                        moduleMain != 0 ? &remoteModuleMain : nullptr);
        return reply([&](bridge::Writer& out) { out.u32(static_cast<uint32_t>(result)); });
    }
    case bridge::kRegister:
        return registerModule(in);
    case bridge::kUnregister:
        return unregisterModule(in);
    case bridge::kAllocate: {
        const uint64_t size = in.u64();
        const uint32_t flags = in.u32();
        const bool hasStatus = in.u32() != 0;
        tStatus status = statusOf(in.u32());
        void* pointer = _memNewUsingCRT(size, static_cast<tMemAllocationFlags>(flags), hasStatus ? &status : nullptr);
        const uint64_t id = reinterpret_cast<uintptr_t>(pointer);
        if (pointer != nullptr) blocks_[id] = pointer;
        return reply([&](bridge::Writer& out) {
            out.u64(id);
            out.u32(static_cast<uint32_t>(status));
        });
    }
    case bridge::kRelease: {
        const uint64_t id = in.u64();
        const uint64_t windowsAddress = in.u64();
        auto it = blocks_.find(id);
        if (id == 0 || it == blocks_.end()) {
            host.reportMisuse(fmt::format("_memDelete of 0x{:x}, which the allocator did not hand out", windowsAddress));
        } else {
            _memDelete(it->second);
            blocks_.erase(it);
        }
        return {};
    }
    case bridge::kLogEvent: {
        bool nulls[4] = {};
        sim::LogEntry entry;
        entry.component = textOrNull(readText(in, &nulls[0]), nulls[0]);
        entry.location = textOrNull(readText(in, &nulls[1]), nulls[1]);
        entry.level = in.u32();
        entry.tag = textOrNull(readText(in, &nulls[2]), nulls[2]);
        const std::string format = readText(in, &nulls[3]);
        entry.format = textOrNull(format, nulls[3]);
        WireArguments arguments(in);
        entry.message = nulls[3] ? "" : sim::formatHostMessage(format.c_str(), arguments);
        host.eventLog.push_back(entry);
        return {};
    }
    case bridge::kDebugLine: {
        bool isNull = false;
        const std::string format = readText(in, &isNull);
        WireArguments arguments(in);
        std::string line = isNull ? "" : sim::formatHostMessage(format.c_str(), arguments);
        host.debugLines.push_back(line);
        return reply([&](bridge::Writer& out) { out.u32(static_cast<uint32_t>(line.size())); });
    }
    case bridge::kHexValue: {
        bool isNull = false;
        const std::string text = readText(in, &isNull);
        return reply([&](bridge::Writer& out) { out.u32(kvlASCIIToU32Base16(isNull ? nullptr : text.c_str())); });
    }
    case bridge::kVersionText: {
        char text[16] = {};
        tSSVersion(in.u32()).toString(text);
        return reply([&](bridge::Writer& out) { out.text(text); });
    }
    case bridge::kGetTree:
        return reply([&](bridge::Writer& out) { out.u32(iDeviceTree::getDeviceTree() != nullptr ? 1 : 0); });
    case bridge::kAddListener:
        return addListener(in);
    case bridge::kRemoveListener:
        return removeListener(in);
    case bridge::kCreateQuery: {
        DeviceQuery* created = host.tree()->createQuery();
        const uint64_t id = reinterpret_cast<uintptr_t>(created);
        if (created != nullptr) queries_.insert(id);
        return reply([&](bridge::Writer& out) { out.u64(id); });
    }
    case bridge::kReleaseQuery: {
        const bool pointerGiven = in.u32() != 0;
        const bool nonNull = in.u32() != 0;
        const uint64_t id = in.u64();
        DeviceQuery* released = nonNull ? query(id) : nullptr;
        host.tree()->releaseQuery(pointerGiven ? &released : nullptr);
        const bool cleared = pointerGiven && nonNull && released == nullptr;
        if (cleared) queries_.erase(id);
        return reply([&](bridge::Writer& out) { out.u32(cleared ? 1 : 0); });
    }
    case bridge::kFindDevices:
        return findDevices(in);
    case bridge::kQuerySetAttribute: {
        DeviceQuery* target = query(in.u64());
        const uint32_t id = in.u32();
        const bool valueGiven = in.u32() != 0;
        const uint32_t value = in.u32();
        tStatus status = statusOf(in.u32());
        target->setAttribute(id, valueGiven ? &value : nullptr, status);
        return reply([&](bridge::Writer& out) { out.u32(static_cast<uint32_t>(status)); });
    }
    case bridge::kQueryGetId:
        return reply([&](bridge::Writer& out) { out.u32(query(in.u64())->getId()); });
    case bridge::kGetAttribute: {
        sim::UsbDeviceSim* target = device(in.u64());
        const uint32_t id = in.u32();
        const bool hasStatus = in.u32() != 0;
        tStatus status = statusOf(in.u32());
        uint32_t value = 0;
        if (target == nullptr) {
            host.reportMisuse("getAttribute on a device the lab never handed out");
        } else {
            value = target->getAttribute(id, hasStatus ? &status : nullptr);
        }
        return reply([&](bridge::Writer& out) {
            out.u32(value);
            out.u32(static_cast<uint32_t>(status));
        });
    }
    case bridge::kOpenStream: {
        sim::UsbDeviceSim* target = device(in.u64());
        const bool parameterGiven = in.u32() != 0;
        nQVKORD100::tControlStreamParameterUSB parameter;
        parameter.first = in.u32();
        parameter.second = in.u32();
        tStatus status = statusOf(in.u32());
        ControlStream* opened = nullptr;
        if (target == nullptr) {
            host.reportMisuse("openStream on a device the lab never handed out");
            setFailure(status, sim::kHostBadArgument);
        } else {
            opened = target->openStream(parameterGiven ? &parameter : nullptr, status);
        }
        const uint64_t id = reinterpret_cast<uintptr_t>(opened);
        if (opened != nullptr) streams_[id] = opened;
        return reply([&](bridge::Writer& out) {
            out.u64(id);
            out.u32(static_cast<uint32_t>(status));
        });
    }
    case bridge::kCloseStream: {
        sim::UsbDeviceSim* target = device(in.u64());
        ControlStream* closing = stream(in.u64());
        tStatus status = statusOf(in.u32());
        bool closed = false;
        if (target == nullptr) {
            host.reportMisuse("closeStream on a device the lab never handed out");
        } else {
            const size_t before = target->openStreams();
            target->closeStream(closing, status);
            closed = target->openStreams() < before;
        }
        return reply([&](bridge::Writer& out) {
            out.u32(static_cast<uint32_t>(status));
            out.u32(closed ? 1 : 0);
        });
    }
    case bridge::kGetDescriptor: {
        sim::UsbDeviceSim* target = device(in.u64());
        const bool proxyGiven = in.u32() != 0;
        tStatus status = statusOf(in.u32());
        nQVKORD100::tUSBDeviceDescriptorProxy proxy;
        if (target != nullptr) target->getDescriptor(proxyGiven ? &proxy : nullptr, status);
        return reply([&](bridge::Writer& out) {
            out.u32(static_cast<uint32_t>(status));
            out.bytes(proxy.descriptor, sizeof(proxy.descriptor));
            out.u32(proxy.length);
        });
    }
    case bridge::kAllocateBuffer: {
        ControlStream* target = stream(in.u64());
        const uint32_t size = in.u32();
        tStatus status = statusOf(in.u32());
        void* buffer = target->allocateBuffer(size, status);
        const uint64_t id = reinterpret_cast<uintptr_t>(buffer);
        if (buffer != nullptr) {
            blocks_[id] = buffer;
            blockSizes_[id] = size;
        }
        return reply([&](bridge::Writer& out) {
            out.u64(id);
            out.u32(static_cast<uint32_t>(status));
        });
    }
    case bridge::kFreeBuffer: {
        ControlStream* target = stream(in.u64());
        const uint64_t id = in.u64();
        tStatus status = statusOf(in.u32());
        const size_t before = host.allocator.liveBlocks();
        target->freeBuffer(block(id), status);
        const bool freed = host.allocator.liveBlocks() < before;
        if (freed) {
            blocks_.erase(id);
            blockSizes_.erase(id);
        }
        return reply([&](bridge::Writer& out) {
            out.u32(static_cast<uint32_t>(status));
            out.u32(freed ? 1 : 0);
        });
    }
    case bridge::kTransfer:
        return transfer(in);
    case bridge::kMisuse:
        host.reportMisuse("karvelk.sys: " + readText(in));
        return {};
    case bridge::kRegistryCall:
    case bridge::kFileOpen:
        return kernelCall(kind, in);
    default:
        throw LabError(fmt::format("the Windows engine sent a call of unknown kind 0x{:x}", kind));
    }
}

std::vector<uint8_t> BridgeServer::registerModule(bridge::Reader& in)
{
    const uint64_t address = in.u64();
    tStatus status = statusOf(in.u32());
    _tLibModuleInfo* module = nullptr;
    if (in.u32() != 0) {
        std::unique_ptr<Registration>& slot = registrations_[address];
        if (!slot) slot = std::make_unique<Registration>();
        Registration& mirror = *slot;
        const uint64_t packageAddress = in.u64();
        bool nameNull = false;
        mirror.moduleName = readText(in, &nameNull);
        const uint64_t moduleMain = in.u64();
        bool firstNull = false;
        bool secondNull = false;
        mirror.firstName = readText(in, &firstNull);
        mirror.secondName = readText(in, &secondNull);
        mirror.info.packageRecord = nullptr;
        mirror.info.moduleName = nameNull ? nullptr : mirror.moduleName.c_str();
        mirror.info.moduleMain = moduleMain != 0 ? &remoteModuleMain : nullptr;
        mirror.info.firstName = firstNull ? nullptr : mirror.firstName.c_str();
        mirror.info.secondName = secondNull ? nullptr : mirror.secondName.c_str();
        if (packageAddress != 0 && in.u32() != 0) {
            in.bytes(&mirror.package, sizeof(mirror.package));
            const bool bufferInRecord = in.u32() != 0;
            // The Windows side's pointers mean nothing here; the links they made do.
            const bool bufferGiven = mirror.package.registryPath.Buffer != nullptr;
            mirror.package.registryPath.Buffer =
                bufferInRecord ? mirror.package.registryPathBuffer : bufferGiven ? mirror.elsewhere : nullptr;
            mirror.package.descriptor = nullptr;
            if (in.u32() != 0) {
                mirror.descriptor.value = in.u32();
                bool descriptorNameNull = false;
                mirror.descriptorName = readText(in, &descriptorNameNull);
                mirror.descriptor.moduleName = descriptorNameNull ? nullptr : mirror.descriptorName.c_str();
                in.bytes(mirror.descriptor.guid, sizeof(mirror.descriptor.guid));
                if (in.u32() != 0) mirror.info.moduleName = mirror.descriptor.moduleName;
                mirror.package.descriptor = &mirror.descriptor;
            }
            mirror.info.packageRecord = &mirror.package;
        }
        module = &mirror.info;
    }
    libRegisterModuleWithKARVEL(module, status);
    const bool registered = module != nullptr && Host::get().registeredModule == module;
    return reply([&](bridge::Writer& out) {
        out.u32(static_cast<uint32_t>(status));
        out.u32(registered ? 1 : 0);
    });
}

std::vector<uint8_t> BridgeServer::unregisterModule(bridge::Reader& in)
{
    const uint64_t address = in.u64();
    tStatus status = statusOf(in.u32());
    auto it = registrations_.find(address);
    _tLibModuleInfo* module = address == 0 ? nullptr : it != registrations_.end() ? &it->second->info : &gUnknownModule;
    libUnregisterModuleWithKARVEL(module, status);
    return reply([&](bridge::Writer& out) {
        out.u32(static_cast<uint32_t>(status));
        out.u32(Host::get().registeredModule != nullptr ? 1 : 0);
    });
}

std::vector<uint8_t> BridgeServer::addListener(bridge::Reader& in)
{
    const uint64_t address = in.u64();
    tStatus status = statusOf(in.u32());
    ListenerRecord* record = nullptr;
    if (in.u32() != 0) {
        std::unique_ptr<Listener>& slot = listeners_[address];
        if (!slot) slot = std::make_unique<Listener>(*this, address);
        ListenerRecord& mirror = slot->record;
        mirror.eventKind = in.u32();
        mirror.one = in.u32();
        mirror.zero = in.u64();
        mirror.queryId = in.u32();
        mirror.callback = in.u64() != 0 ? slot.get() : nullptr;
        record = &mirror;
    }
    sim::DeviceTreeSim& tree = *Host::get().tree();
    const size_t before = tree.liveListeners();
    tree.addListener(record, status);
    const bool added = tree.liveListeners() > before;
    return reply([&](bridge::Writer& out) {
        out.u32(static_cast<uint32_t>(status));
        out.u32(added ? 1 : 0);
    });
}

std::vector<uint8_t> BridgeServer::removeListener(bridge::Reader& in)
{
    const uint64_t address = in.u64();
    const bool hasStatus = in.u32() != 0;
    tStatus status = statusOf(in.u32());
    auto it = listeners_.find(address);
    ListenerRecord* record = address == 0 ? nullptr : it != listeners_.end() ? &it->second->record : &gUnknownListener;
    sim::DeviceTreeSim& tree = *Host::get().tree();
    const size_t before = tree.liveListeners();
    tree.removeListener(record, hasStatus ? &status : nullptr);
    const bool removed = tree.liveListeners() < before;
    return reply([&](bridge::Writer& out) {
        out.u32(static_cast<uint32_t>(status));
        out.u32(removed ? 1 : 0);
    });
}

std::vector<uint8_t> BridgeServer::findDevices(bridge::Reader& in)
{
    const bool listGiven = in.u32() != 0;
    const uint32_t selector = in.u32();
    const bool queryGiven = in.u32() != 0;
    const uint64_t queryId = in.u64();
    DeviceQuery* target = queryGiven ? query(queryId) : nullptr;
    const uint32_t flags = in.u32();
    tStatus status = statusOf(in.u32());
    DeviceList list{};
    Host::get().tree()->findDevices(listGiven ? &list : nullptr, selector, target, flags, status);
    const uint64_t arrayId = reinterpret_cast<uintptr_t>(list.devices);
    if (list.devices != nullptr) blocks_[arrayId] = list.devices;
    return reply([&](bridge::Writer& out) {
        out.u32(static_cast<uint32_t>(status));
        out.u64(arrayId);
        out.u32(list.count);
        for (uint32_t i = 0; i < list.count; ++i) out.u64(reinterpret_cast<uintptr_t>(list.devices[i]));
    });
}

std::vector<uint8_t> BridgeServer::transfer(bridge::Reader& in)
{
    ControlStream* target = stream(in.u64());
    tStatus status = statusOf(in.u32());
    if (in.u32() == 0) {
        target->transfer(nullptr, status);
        return reply([&](bridge::Writer& out) {
            out.u32(static_cast<uint32_t>(status));
            out.bytes(nullptr, 0);
        });
    }
    nQVKORD100::tTransferParameterUSBControl request;
    request.bmRequestType = static_cast<uint8_t>(in.u32());
    request.bRequest = static_cast<uint8_t>(in.u32());
    request.wValue = static_cast<uint16_t>(in.u32());
    request.wIndex = static_cast<uint16_t>(in.u32());
    request.length = in.u32();
    const bool dataGiven = in.u32() != 0;
    const uint64_t bufferId = in.u64();
    const uint32_t offset = in.u32();
    const uint8_t* outgoing = nullptr;
    const uint32_t outgoingLength = in.span(&outgoing);
    // The data stage inside the lab's copy of the buffer, filled as the
    // module left its own.
    auto size = blockSizes_.find(bufferId);
    uint8_t* data = nullptr;
    if (size != blockSizes_.end() && offset <= size->second && request.length <= size->second - offset) {
        data = static_cast<uint8_t*>(blocks_.at(bufferId)) + offset;
        if (outgoing != nullptr && outgoingLength == request.length) std::memcpy(data, outgoing, outgoingLength);
    }
    request.data = !dataGiven ? nullptr : data != nullptr ? data : gOutsideEveryBuffer;
    target->transfer(&request, status);
    return reply([&](bridge::Writer& out) {
        out.u32(static_cast<uint32_t>(status));
        out.bytes(data, data != nullptr ? request.length : 0);
    });
}

std::vector<uint8_t> BridgeServer::kernelCall(uint32_t kind, bridge::Reader& in)
{
    if (kind == bridge::kRegistryCall) {
        sim::kernel::RegistryCall call;
        call.kind = in.u32() == 0 ? sim::kernel::RegistryCall::Kind::createKey
                                  : sim::kernel::RegistryCall::Kind::queryValue;
        std::u16string key = readText16(in);
        std::u16string value = readText16(in);
        call.keyPath = sim::utf16ToUtf8(key.data(), key.size());
        call.valueName = sim::utf16ToUtf8(value.data(), value.size());
        call.desiredAccess = in.u32();
        call.bufferLength = in.u32();
        call.result = static_cast<NTSTATUS>(in.u32());
        call.created = in.u32() != 0;
        sim::kernel::registry().noteCall(call);
        return {};
    }
    sim::kernel::FileOpenRecord open;
    std::u16string path = readText16(in);
    open.dosPath = sim::utf16ToUtf8(path.data(), path.size());
    open.status = static_cast<NTSTATUS>(in.u32());
    // The object-manager prefix "\??\" is the kernel's; the drive path follows.
    std::string dos = open.dosPath.rfind("\\??\\", 0) == 0 ? open.dosPath.substr(4) : open.dosPath;
    if (std::optional<std::filesystem::path> host = hostPath_(dos)) open.hostPath = *host;
    sim::kernel::files().noteOpen(open);
    return {};
}

}  // namespace lab
