// The messages between the lab and the Windows-side host, and their encoding.
// Built freestanding for the MSVC target (karvelk.sys), with mingw-w64 (the
// harness) and on Linux (the lab), so only fixed-width fields cross: 32- and
// 64-bit little-endian numbers, byte strings and texts with a length in front.
//
// Every message is a call that gets exactly one reply. A side that waits for
// its reply serves the calls that arrive meanwhile, so calls nest: the lab
// calls the module, the module calls the host, the host asks the lab.
#pragma once

#include <stddef.h>
#include <stdint.h>

namespace bridge {

constexpr uint32_t kMaxPayload = 16 * 1024;
constexpr uint32_t kNullText = 0xFFFFFFFFu;

struct Header {
    uint32_t kind;
    uint32_t size;  // payload bytes after the header
};
static_assert(sizeof(Header) == 8, "two 32-bit words");

enum Kind : uint32_t {
    kReply = 1,

    // The lab asks the Windows side.
    kLoad = 0x100,          // text16 registry path -> u32 NTSTATUS
    kUnload,                // -> u32 NTSTATUS
    kWrapperMain,           // u32 reason -> u32 status
    kModuleMain,            // u32 reason -> u32 status, through the registered record
    kSetWdmLoadState,       // u32 state -> u32 null, 16 bytes
    kSetLegacyLoadState,    // u32 state ->
    kVersionQuery,          // u32 oldest?, u32 status -> u32 packed, u32 status
    kCompareVersion,        // u32 newest, u32 oldest, u32 status, text component -> u32 status
    kCompareFirmwareVersion,// u32 version, u32 productId, u32 status -> u32 status
    kDeviceEvent,           // u64 listener record, u64 device ->
    kPrepareKernel,         // see kernelWorld: registry snapshot and import, held files, faults ->
    kFinish,                // -> u32 count, texts: what the Windows side still holds

    // The Windows side asks the lab: the host's calls, carried over.
    kIsInitialized = 0x200,
    kPackageEvent,
    kRegister,
    kUnregister,
    kAllocate,
    kRelease,
    kLogEvent,
    kDebugLine,
    kHexValue,
    kVersionText,
    kGetTree,
    kAddListener,
    kRemoveListener,
    kCreateQuery,
    kReleaseQuery,
    kFindDevices,
    kQuerySetAttribute,
    kQueryGetId,
    kGetAttribute,
    kOpenStream,
    kCloseStream,
    kGetDescriptor,
    kAllocateBuffer,
    kFreeBuffer,
    kTransfer,
    kMisuse,         // text: what the host saw wrong ->
    kRegistryCall,   // a kernel registry call as Wine's kernel answered it ->
    kFileOpen,       // a kernel file open as Wine's kernel answered it ->
};

class Writer {
public:
    Writer(uint8_t* buffer, uint32_t capacity) : buffer_(buffer), capacity_(capacity) {}

    void u32(uint32_t value) { little(value, 4); }
    void u64(uint64_t value) { little(value, 8); }
    void bytes(const void* data, uint32_t length)
    {
        u32(length);
        raw(data, length);
    }
    // NUL-terminated 8-bit text, or null.
    void text(const char* value)
    {
        if (value == nullptr) return u32(kNullText);
        uint32_t length = 0;
        while (value[length] != 0) ++length;
        bytes(value, length);
    }
    // NUL-terminated UTF-16 text, or null; the length counts code units.
    void text16(const uint16_t* value)
    {
        if (value == nullptr) return u32(kNullText);
        uint32_t length = 0;
        while (value[length] != 0) ++length;
        text16(value, length);
    }
    void text16(const uint16_t* value, uint32_t units)
    {
        u32(units);
        raw(value, units * 2);
    }

    uint32_t size() const { return size_; }
    bool overflowed() const { return overflowed_; }

private:
    void little(uint64_t value, uint32_t width)
    {
        if (width > capacity_ - size_) {
            overflowed_ = true;
            return;
        }
        for (uint32_t i = 0; i < width; ++i) buffer_[size_++] = static_cast<uint8_t>(value >> (8 * i));
    }
    void raw(const void* data, uint32_t length)
    {
        if (length > capacity_ - size_) {
            overflowed_ = true;
            return;
        }
        const uint8_t* from = static_cast<const uint8_t*>(data);
        for (uint32_t i = 0; i < length; ++i) buffer_[size_++] = from[i];
    }

    uint8_t* buffer_;
    uint32_t capacity_;
    uint32_t size_ = 0;
    bool overflowed_ = false;
};

// Reads what a Writer wrote; reading past the end gives zeros and marks the
// reader broken, so a short message can never be read out of bounds.
class Reader {
public:
    Reader(const uint8_t* buffer, uint32_t size) : buffer_(buffer), size_(size) {}

    uint32_t u32() { return static_cast<uint32_t>(little(4)); }
    uint64_t u64() { return little(8); }
    // A byte string or text: its length (kNullText for null) and where it
    // starts in the message; nothing is copied.
    uint32_t span(const uint8_t** start, uint32_t unitSize = 1)
    {
        const uint32_t length = u32();
        *start = nullptr;
        if (length == kNullText) return kNullText;
        const uint64_t bytes = static_cast<uint64_t>(length) * unitSize;
        if (bytes > size_ - at_) {
            broken_ = true;
            at_ = size_;
            return 0;
        }
        *start = buffer_ + at_;
        at_ += static_cast<uint32_t>(bytes);
        return length;
    }
    // Copies a byte string into `out`, cut to `capacity`; gives its full length.
    uint32_t bytes(void* out, uint32_t capacity)
    {
        const uint8_t* start = nullptr;
        const uint32_t length = span(&start);
        if (length == kNullText) return 0;
        uint8_t* to = static_cast<uint8_t*>(out);
        for (uint32_t i = 0; i < length && i < capacity; ++i) to[i] = start[i];
        return length;
    }

    bool broken() const { return broken_; }

private:
    uint64_t little(uint32_t width)
    {
        if (width > size_ - at_) {
            broken_ = true;
            at_ = size_;
            return 0;
        }
        uint64_t value = 0;
        for (uint32_t i = 0; i < width; ++i) value |= static_cast<uint64_t>(buffer_[at_++]) << (8 * i);
        return value;
    }

    const uint8_t* buffer_;
    uint32_t size_;
    uint32_t at_ = 0;
    bool broken_ = false;
};

}  // namespace bridge
