// The host's parameter classes for control streams and control transfers.
// The host reads them by layout, so every field sits at a fixed offset.
#pragma once

#include <stddef.h>
#include <stdint.h>

namespace nQVKORD100 {

// The host's tables hold the const dynamic-cast overload in slot 0, the
// non-const one in slot 1 and the destructor after them. The Itanium ABI lays
// out virtual functions in declaration order; the MSVC ABI groups the
// overloads of one name and lays them out in reverse, so there the pair is
// declared the other way round. The driver build checks the order in its
// objects' tables.
#if defined(_MSC_VER)
#define HOST_DYNAMIC_CAST_PAIR(specifier)                              \
    virtual void* ___CPPKRLDynamicCast(const void* classId) specifier; \
    virtual const void* ___CPPKRLDynamicCast(const void* classId) const specifier
#else
#define HOST_DYNAMIC_CAST_PAIR(specifier)                                          \
    virtual const void* ___CPPKRLDynamicCast(const void* classId) const specifier; \
    virtual void* ___CPPKRLDynamicCast(const void* classId) specifier
#endif

class tTransferParameter {
public:
    HOST_DYNAMIC_CAST_PAIR();
    virtual ~tTransferParameter() {}
};

class tTransferParameterUSBControl : public tTransferParameter {
public:
    HOST_DYNAMIC_CAST_PAIR(override);
    ~tTransferParameterUSBControl() override {}

    void* data = nullptr;  // null for a request without a data stage
    uint32_t length = 0;   // bytes of the data stage
    uint8_t reserved0[4];
    uint8_t bmRequestType = 0;
    uint8_t bRequest = 0;
    uint16_t wValue = 0;
    uint16_t wIndex = 0;
    uint8_t reserved1[2];
};

class tStreamParameter {
public:
    HOST_DYNAMIC_CAST_PAIR();
    virtual ~tStreamParameter() {}
};

class tControlStreamParameterUSB : public tStreamParameter {
public:
    HOST_DYNAMIC_CAST_PAIR(override);
    ~tControlStreamParameterUSB() override {}

    uint32_t first = 0;
    uint32_t second = 0;
};

// The host fills it with the device descriptor; the module never reads it.
// The module places it on its stack, but only the host knows the class's real
// size, and its constructor writes all of it: the module gives it several
// times the 20 bytes of the fields it knows, so that a larger host class
// cannot run over the frame.
class tUSBDeviceDescriptorProxy {
public:
    tUSBDeviceDescriptorProxy();
    ~tUSBDeviceDescriptorProxy();

    uint8_t descriptor[18];
    uint16_t length;
    alignas(8) uint8_t room[104];
};
static_assert(sizeof(tUSBDeviceDescriptorProxy) == 128, "the descriptor proxy has 128 bytes of room");

}  // namespace nQVKORD100

// Both compilers lay out these classes as the host does: the vtable pointer
// first, then the fields. offsetof on them is supported by both.
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Winvalid-offsetof"
static_assert(sizeof(nQVKORD100::tTransferParameterUSBControl) == 32, "control request is 32 bytes");
static_assert(offsetof(nQVKORD100::tTransferParameterUSBControl, data) == 8, "data pointer at 8");
static_assert(offsetof(nQVKORD100::tTransferParameterUSBControl, length) == 16, "length at 16");
static_assert(offsetof(nQVKORD100::tTransferParameterUSBControl, bmRequestType) == 24, "bmRequestType at 24");
static_assert(offsetof(nQVKORD100::tTransferParameterUSBControl, bRequest) == 25, "bRequest at 25");
static_assert(offsetof(nQVKORD100::tTransferParameterUSBControl, wValue) == 26, "wValue at 26");
static_assert(offsetof(nQVKORD100::tTransferParameterUSBControl, wIndex) == 28, "wIndex at 28");
static_assert(sizeof(nQVKORD100::tControlStreamParameterUSB) == 16, "stream parameter is 16 bytes");
static_assert(offsetof(nQVKORD100::tControlStreamParameterUSB, first) == 8, "first value at 8");
static_assert(offsetof(nQVKORD100::tControlStreamParameterUSB, second) == 12, "second value at 12");
#pragma GCC diagnostic pop
