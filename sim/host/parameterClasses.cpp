// The host's parameter classes. Their dynamic casts answer for their own class
// identity only; the module never uses them, but the vtables must be the host's.
#include "../../host/transferParameters.h"

namespace nQVKORD100 {

namespace {
const char kTransferParameterId = 0;
const char kTransferParameterUSBControlId = 0;
const char kStreamParameterId = 0;
const char kControlStreamParameterUSBId = 0;
}  // namespace

const void* tTransferParameter::___CPPKRLDynamicCast(const void* classId) const
{
    return classId == &kTransferParameterId ? this : nullptr;
}

void* tTransferParameter::___CPPKRLDynamicCast(const void* classId)
{
    return classId == &kTransferParameterId ? this : nullptr;
}

const void* tTransferParameterUSBControl::___CPPKRLDynamicCast(const void* classId) const
{
    if (classId == &kTransferParameterUSBControlId) return this;
    return tTransferParameter::___CPPKRLDynamicCast(classId);
}

void* tTransferParameterUSBControl::___CPPKRLDynamicCast(const void* classId)
{
    if (classId == &kTransferParameterUSBControlId) return this;
    return tTransferParameter::___CPPKRLDynamicCast(classId);
}

const void* tStreamParameter::___CPPKRLDynamicCast(const void* classId) const
{
    return classId == &kStreamParameterId ? this : nullptr;
}

void* tStreamParameter::___CPPKRLDynamicCast(const void* classId)
{
    return classId == &kStreamParameterId ? this : nullptr;
}

const void* tControlStreamParameterUSB::___CPPKRLDynamicCast(const void* classId) const
{
    if (classId == &kControlStreamParameterUSBId) return this;
    return tStreamParameter::___CPPKRLDynamicCast(classId);
}

void* tControlStreamParameterUSB::___CPPKRLDynamicCast(const void* classId)
{
    if (classId == &kControlStreamParameterUSBId) return this;
    return tStreamParameter::___CPPKRLDynamicCast(classId);
}

tUSBDeviceDescriptorProxy::tUSBDeviceDescriptorProxy() : descriptor{}, length(0) {}

tUSBDeviceDescriptorProxy::~tUSBDeviceDescriptorProxy() = default;

}  // namespace nQVKORD100
