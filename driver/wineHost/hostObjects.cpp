// The host's objects the module calls through virtual tables: the device
// tree, queries, USB devices and control streams. Their tables are built here
// by hand, slot by slot in the host's order, and not from the module's
// declarations, so a module that calls a wrong slot meets the wrong function
// here instead of a table that agrees with its own mistake.
//
// The Windows x64 ABI passes `this` first, references as pointers, and
// returns 32-bit values and pointers in RAX, so each slot is a plain function
// taking the object first.
#include "../../host/deviceTree.h"
#include "../../host/transferParameters.h"
#include "hostBlocks.h"
#include "hostCall.h"
#include "hostRegistration.h"

namespace {

using karvelk::HostCall;

enum class ObjectKind : uint32_t { free, query, device, stream };

using Slot = void (*)();

struct HostObject {
    const Slot* table;  // at offset 0, where the module looks for it
    ObjectKind kind;
    uint64_t labId;
};

constexpr uint32_t kMaxObjects = 512;
HostObject gObjects[kMaxObjects];
HostObject gTree;

// What the module still holds, as this host counts it.
uint32_t gLiveQueries;
uint32_t gOpenStreams;
constexpr uint32_t kMaxListeners = 16;
uint64_t gListeners[kMaxListeners];

uint32_t statusBits(const tStatus* status)
{
    return status != nullptr ? static_cast<uint32_t>(*status) : 0;
}

void setStatus(tStatus* status, uint32_t value)
{
    if (status != nullptr) *status = static_cast<tStatus>(value);
}

HostObject* objectFor(ObjectKind kind, uint64_t labId, const Slot* table)
{
    if (labId == 0) return nullptr;
    HostObject* unused = nullptr;
    for (HostObject& object : gObjects) {
        if (object.kind == kind && object.labId == labId) return &object;
        if (object.kind == ObjectKind::free && unused == nullptr) unused = &object;
    }
    if (unused == nullptr) {
        karvelk::reportMisuse("the Windows-side host ran out of object slots");
        return nullptr;
    }
    unused->table = table;
    unused->kind = kind;
    unused->labId = labId;
    return unused;
}

// The lab's name for an object the module hands back; 0 when it is none of
// this host's objects of that kind.
uint64_t labIdOf(const void* object, ObjectKind kind)
{
    for (const HostObject& candidate : gObjects) {
        if (&candidate == object && candidate.kind == kind) return candidate.labId;
    }
    return 0;
}

// An entry of the module's import table is a jump through a pointer; the
// parameter objects' tables point at those jumps, not at this host directly.
const void* throughImportJump(const void* entry)
{
    const uint8_t* code = static_cast<const uint8_t*>(entry);
    if (code == nullptr || code[0] != 0xFF || code[1] != 0x25) return entry;
    int32_t displacement = 0;
    for (int i = 0; i < 4; ++i) displacement |= static_cast<int32_t>(static_cast<uint32_t>(code[2 + i]) << (8 * i));
    return *reinterpret_cast<const void* const*>(code + 6 + displacement);
}

// The module's parameter objects must carry the host's dynamic-cast pair in
// the host's order: const overload first, then non-const.
void checkParameterTable(const void* object, uint32_t castClass, const char* what)
{
    // Once per class: every request of a run has the same table.
    static bool reported[4];
    if (object == nullptr || reported[castClass]) return;
    const void* const* table = *static_cast<const void* const* const*>(object);
    const KarvelkBridge& link = karvelk::bridgeLink();
    const bool constFirst = throughImportJump(table[0]) == link.castExports[castClass][0];
    const bool nonConstSecond = throughImportJump(table[1]) == link.castExports[castClass][1];
    if (constFirst && nonConstSecond) return;
    reported[castClass] = true;
    char text[160] = "virtual table of the ";
    uint32_t at = 0;
    while (text[at] != 0) ++at;
    for (const char* c = what; *c != 0 && at < sizeof(text) - 64; ++c) text[at++] = *c;
    const char* tail = ": slots 0 and 1 are not the host's const and non-const dynamic casts";
    for (const char* c = tail; *c != 0 && at < sizeof(text) - 1; ++c) text[at++] = *c;
    text[at] = 0;
    karvelk::reportMisuse(text);
}

// ---- DeviceQuery: setAttribute, getId

void querySetAttribute(HostObject* self, uint32_t id, const void* value, tStatus* status)
{
    HostCall call(bridge::kQuerySetAttribute);
    call.out().u64(self->labId);
    call.out().u32(id);
    call.out().u32(value != nullptr ? 1 : 0);
    call.out().u32(value != nullptr ? *static_cast<const uint32_t*>(value) : 0);
    call.out().u32(statusBits(status));
    setStatus(status, call.send().u32());
}

uint32_t queryGetId(HostObject* self)
{
    HostCall call(bridge::kQueryGetId);
    call.out().u64(self->labId);
    return call.send().u32();
}

const Slot kQueryTable[] = {reinterpret_cast<Slot>(&querySetAttribute), reinterpret_cast<Slot>(&queryGetId)};

// ---- ControlStream: allocateBuffer, freeBuffer, transfer

void* streamAllocateBuffer(HostObject* self, uint32_t size, tStatus* status)
{
    HostCall call(bridge::kAllocateBuffer);
    call.out().u64(self->labId);
    call.out().u32(size);
    call.out().u32(statusBits(status));
    bridge::Reader& reply = call.send();
    const uint64_t labId = reply.u64();
    setStatus(status, reply.u32());
    if (labId == 0) return nullptr;
    void* buffer = karvelk::adoptBlock(labId, size, self->labId);
    if (buffer == nullptr) karvelk::reportMisuse("the Windows side ran out of memory for a stream buffer");
    return buffer;
}

void streamFreeBuffer(HostObject* self, void* buffer, tStatus* status)
{
    karvelk::HostBlock* block = karvelk::findBlockAt(buffer);
    HostCall call(bridge::kFreeBuffer);
    call.out().u64(self->labId);
    call.out().u64(block != nullptr ? block->labId : 0);
    call.out().u32(statusBits(status));
    bridge::Reader& reply = call.send();
    setStatus(status, reply.u32());
    if (reply.u32() != 0 && block != nullptr) karvelk::dropBlock(block);
}

void streamTransfer(HostObject* self, nQVKORD100::tTransferParameterUSBControl* request, tStatus* status)
{
    checkParameterTable(request, 1, "transfer request");
    HostCall call(bridge::kTransfer);
    bridge::Writer& out = call.out();
    out.u64(self->labId);
    out.u32(statusBits(status));
    out.u32(request != nullptr ? 1 : 0);
    karvelk::HostBlock* block = nullptr;
    uint32_t offset = 0;
    if (request != nullptr) {
        // Read by layout, as the host reads it.
        out.u32(request->bmRequestType);
        out.u32(request->bRequest);
        out.u32(request->wValue);
        out.u32(request->wIndex);
        out.u32(request->length);
        out.u32(request->data != nullptr ? 1 : 0);
        block = karvelk::findBlock(request->data, request->length);
        if (block != nullptr) offset = static_cast<uint32_t>(static_cast<uint8_t*>(request->data) - block->address);
        out.u64(block != nullptr ? block->labId : 0);
        out.u32(offset);
        // The buffer's bytes as the module left them; the lab's copy takes them.
        if (block != nullptr) {
            out.bytes(request->data, request->length);
        } else {
            out.bytes(nullptr, 0);
        }
    }
    bridge::Reader& reply = call.send();
    setStatus(status, reply.u32());
    const uint8_t* data = nullptr;
    const uint32_t length = reply.span(&data);
    // IN data stands at the start of the request's buffer on return.
    if (block != nullptr && data != nullptr && length <= block->size - offset) {
        for (uint32_t i = 0; i < length; ++i) block->address[offset + i] = data[i];
    }
}

const Slot kStreamTable[] = {reinterpret_cast<Slot>(&streamAllocateBuffer), reinterpret_cast<Slot>(&streamFreeBuffer),
                             reinterpret_cast<Slot>(&streamTransfer)};

// ---- UsbDevice: getAttribute, openStream, closeStream, getDescriptor

uint32_t deviceGetAttribute(HostObject* self, uint32_t id, tStatus* status)
{
    HostCall call(bridge::kGetAttribute);
    call.out().u64(self->labId);
    call.out().u32(id);
    call.out().u32(status != nullptr ? 1 : 0);
    call.out().u32(statusBits(status));
    bridge::Reader& reply = call.send();
    const uint32_t value = reply.u32();
    setStatus(status, reply.u32());
    return value;
}

HostObject* deviceOpenStream(HostObject* self, nQVKORD100::tControlStreamParameterUSB* parameter, tStatus* status)
{
    checkParameterTable(parameter, 3, "stream parameter");
    HostCall call(bridge::kOpenStream);
    call.out().u64(self->labId);
    call.out().u32(parameter != nullptr ? 1 : 0);
    call.out().u32(parameter != nullptr ? parameter->first : 0);
    call.out().u32(parameter != nullptr ? parameter->second : 0);
    call.out().u32(statusBits(status));
    bridge::Reader& reply = call.send();
    const uint64_t stream = reply.u64();
    setStatus(status, reply.u32());
    HostObject* object = objectFor(ObjectKind::stream, stream, kStreamTable);
    if (object != nullptr) ++gOpenStreams;
    return object;
}

void deviceCloseStream(HostObject* self, HostObject* stream, tStatus* status)
{
    HostCall call(bridge::kCloseStream);
    call.out().u64(self->labId);
    call.out().u64(labIdOf(stream, ObjectKind::stream));
    call.out().u32(statusBits(status));
    bridge::Reader& reply = call.send();
    setStatus(status, reply.u32());
    if (reply.u32() != 0 && gOpenStreams != 0) --gOpenStreams;
}

void deviceGetDescriptor(HostObject* self, nQVKORD100::tUSBDeviceDescriptorProxy* proxy, tStatus* status)
{
    HostCall call(bridge::kGetDescriptor);
    call.out().u64(self->labId);
    call.out().u32(proxy != nullptr ? 1 : 0);
    call.out().u32(statusBits(status));
    bridge::Reader& reply = call.send();
    setStatus(status, reply.u32());
    uint8_t descriptor[sizeof(proxy->descriptor)] = {};
    reply.bytes(descriptor, sizeof(descriptor));
    const uint32_t length = reply.u32();
    if (proxy == nullptr) return;
    for (uint32_t i = 0; i < sizeof(descriptor); ++i) proxy->descriptor[i] = descriptor[i];
    proxy->length = static_cast<uint16_t>(length);
}

const Slot kDeviceTable[] = {reinterpret_cast<Slot>(&deviceGetAttribute), reinterpret_cast<Slot>(&deviceOpenStream),
                             reinterpret_cast<Slot>(&deviceCloseStream), reinterpret_cast<Slot>(&deviceGetDescriptor)};

// ---- iDeviceTree: addListener, releaseQuery, removeListener, createQuery, findDevices

void treeAddListener(HostObject*, ListenerRecord* record, tStatus* status)
{
    HostCall call(bridge::kAddListener);
    call.out().u64(reinterpret_cast<uintptr_t>(record));
    call.out().u32(statusBits(status));
    call.out().u32(record != nullptr ? 1 : 0);
    if (record != nullptr) {
        call.out().u32(record->eventKind);
        call.out().u32(record->one);
        call.out().u64(record->zero);
        call.out().u32(record->queryId);
        call.out().u64(reinterpret_cast<uintptr_t>(record->callback));
    }
    bridge::Reader& reply = call.send();
    setStatus(status, reply.u32());
    if (reply.u32() == 0) return;
    for (uint64_t& slot : gListeners) {
        if (slot != 0) continue;
        slot = reinterpret_cast<uintptr_t>(record);
        return;
    }
}

void treeReleaseQuery(HostObject*, HostObject** query)
{
    HostCall call(bridge::kReleaseQuery);
    call.out().u32(query != nullptr ? 1 : 0);
    call.out().u32(query != nullptr && *query != nullptr ? 1 : 0);
    call.out().u64(query != nullptr ? labIdOf(*query, ObjectKind::query) : 0);
    bridge::Reader& reply = call.send();
    if (reply.u32() == 0 || query == nullptr) return;
    *query = nullptr;
    if (gLiveQueries != 0) --gLiveQueries;
}

void treeRemoveListener(HostObject*, ListenerRecord* record, tStatus* status)
{
    HostCall call(bridge::kRemoveListener);
    call.out().u64(reinterpret_cast<uintptr_t>(record));
    call.out().u32(status != nullptr ? 1 : 0);
    call.out().u32(statusBits(status));
    bridge::Reader& reply = call.send();
    setStatus(status, reply.u32());
    if (reply.u32() == 0) return;
    for (uint64_t& slot : gListeners) {
        if (slot == reinterpret_cast<uintptr_t>(record)) slot = 0;
    }
}

HostObject* treeCreateQuery(HostObject*)
{
    HostCall call(bridge::kCreateQuery);
    HostObject* query = objectFor(ObjectKind::query, call.send().u64(), kQueryTable);
    if (query != nullptr) ++gLiveQueries;
    return query;
}

void treeFindDevices(HostObject*, DeviceList* list, uint32_t selector, HostObject* query, uint32_t flags,
                     tStatus* status)
{
    HostCall call(bridge::kFindDevices);
    call.out().u32(list != nullptr ? 1 : 0);
    call.out().u32(selector);
    call.out().u32(query != nullptr ? 1 : 0);
    call.out().u64(labIdOf(query, ObjectKind::query));
    call.out().u32(flags);
    call.out().u32(statusBits(status));
    bridge::Reader& reply = call.send();
    setStatus(status, reply.u32());
    const uint64_t arrayId = reply.u64();
    const uint32_t count = reply.u32();
    if (list == nullptr) return;
    list->devices = nullptr;
    list->count = 0;
    if (arrayId == 0) return;
    const uint64_t elements = count == 0 ? 1 : count;
    UsbDevice** array = static_cast<UsbDevice**>(karvelk::adoptBlock(arrayId, elements * sizeof(UsbDevice*), 0));
    if (array == nullptr) {
        karvelk::reportMisuse("the Windows side ran out of memory for a device array");
        return;
    }
    for (uint32_t i = 0; i < count; ++i) {
        HostObject* device = objectFor(ObjectKind::device, reply.u64(), kDeviceTable);
        array[i] = reinterpret_cast<UsbDevice*>(device);
    }
    list->devices = array;
    list->count = count;
}

const Slot kTreeTable[] = {reinterpret_cast<Slot>(&treeAddListener), reinterpret_cast<Slot>(&treeReleaseQuery),
                           reinterpret_cast<Slot>(&treeRemoveListener), reinterpret_cast<Slot>(&treeCreateQuery),
                           reinterpret_cast<Slot>(&treeFindDevices)};
// The same with releaseQuery and removeListener swapped: the mistake the
// host's own test makes on purpose.
const Slot kTreeTableSwapped[] = {reinterpret_cast<Slot>(&treeAddListener), reinterpret_cast<Slot>(&treeRemoveListener),
                                  reinterpret_cast<Slot>(&treeReleaseQuery), reinterpret_cast<Slot>(&treeCreateQuery),
                                  reinterpret_cast<Slot>(&treeFindDevices)};

void appendLine(char* text, uint32_t capacity, uint32_t& at, const char* what, uint32_t count)
{
    if (count == 0) return;
    char digits[12];
    uint32_t length = 0;
    do {
        digits[length++] = static_cast<char>('0' + count % 10);
        count /= 10;
    } while (count != 0);
    while (length != 0 && at + 1 < capacity) text[at++] = digits[--length];
    for (const char* c = what; *c != 0 && at + 1 < capacity; ++c) text[at++] = *c;
    if (at + 1 < capacity) text[at++] = '\n';
    text[at] = 0;
}

}  // namespace

iDeviceTree* iDeviceTree::getDeviceTree()
{
    HostCall call(bridge::kGetTree);
    if (call.send().u32() == 0) return nullptr;
    gTree.table = karvelk::hasMistake(kMistakeSlotOrder) ? kTreeTableSwapped : kTreeTable;
    return reinterpret_cast<iDeviceTree*>(&gTree);
}

extern "C" void karvelkDeliverEvent(uint64_t record, uint64_t device)
{
    // Read by layout, and the callback called through its table's first slot.
    const ListenerRecord* listener = reinterpret_cast<const ListenerRecord*>(static_cast<uintptr_t>(record));
    void* callback = listener->callback;
    using OnDeviceEvent = void (*)(void* self, void* device);
    OnDeviceEvent first = *reinterpret_cast<OnDeviceEvent const* const*>(callback)[0];
    first(callback, objectFor(ObjectKind::device, device, kDeviceTable));
}

extern "C" uint32_t karvelkLeftovers(char* text, uint32_t capacity)
{
    uint32_t at = 0;
    if (capacity == 0) return 0;
    text[0] = 0;
    uint32_t listeners = 0;
    for (uint64_t slot : gListeners) listeners += slot != 0 ? 1 : 0;
    appendLine(text, capacity, at, " block(s) of the module's still held by karvelk.sys", karvelk::liveBlocks());
    appendLine(text, capacity, at, " listener record(s) still added in karvelk.sys", listeners);
    appendLine(text, capacity, at, " device query(ies) not released in karvelk.sys", gLiveQueries);
    appendLine(text, capacity, at, " control stream(s) open in karvelk.sys", gOpenStreams);
    appendLine(text, capacity, at, " module still registered with karvelk.sys", karvelk::registeredModule() != nullptr);
    return at;
}
