#include "physicalDevice.h"

#include <stdexcept>

#include "enumeratedDevice.h"

namespace sim {

namespace {

constexpr LoaderFlashLayout kLayouts[] = {
    {0x4A10, 0x0200, 0x3600},
    {0x4A20, 0x0600, 0x7C00},
};

// The identity block is the last 16 bytes of the identity page; its fields by offset in the block.
constexpr uint16_t kIdentityBlockOffset = 0x1F0;
constexpr uint16_t kIdentityBlockSize = 16;
constexpr size_t kProductIdAt = 0;
constexpr size_t kProductIdCopyAt = 2;
constexpr size_t kVendorIdAt = 8;
constexpr size_t kAltProductIdAt = 10;
constexpr size_t kSerialNumberAt = 12;
constexpr uint16_t kMarkerOffset = 6;

void putBigEndian(std::vector<uint8_t>& bytes, size_t at, uint32_t value, int width)
{
    for (int i = 0; i < width; ++i) bytes[at + i] = static_cast<uint8_t>(value >> (8 * (width - 1 - i)));
}

uint32_t getBigEndian(const std::vector<uint8_t>& bytes, size_t at, int width)
{
    uint32_t value = 0;
    for (int i = 0; i < width; ++i) value = (value << 8) | bytes[at + i];
    return value;
}

}  // namespace

const LoaderFlashLayout* findLoaderFlashLayout(uint16_t loaderProductId)
{
    for (const LoaderFlashLayout& layout : kLayouts) {
        if (layout.loaderProductId == loaderProductId) return &layout;
    }
    return nullptr;
}

PhysicalDevice::PhysicalDevice(const EmulatedDeviceOptions& options)
    : faults(options.faults), timing(options.timing), traceEnabled(options.trace), options_(options)
{
    if (options.identity) setIdentity(*options.identity);
    if (!options.image.empty()) loadImage(options.image);
    for (const MemoryBytes& bytes : options.memory) flash.load(bytes.address, bytes.bytes);
    options_.image.clear();  // already in flash; no need to keep a second copy
}

static const LoaderFlashLayout& requireLayout(const PhysicalDevice& device)
{
    const LoaderFlashLayout* layout = device.layout();
    if (layout == nullptr) throw std::invalid_argument("an emulated loader without a flash layout has no identity "
                                                       "block or firmware base");
    return *layout;
}

void PhysicalDevice::setIdentity(const IdentityValues& identity)
{
    uint16_t blockStart = static_cast<uint16_t>(requireLayout(*this).identityPage + kIdentityBlockOffset);
    std::vector<uint8_t> block(kIdentityBlockSize, 0xFF);
    putBigEndian(block, kProductIdAt, identity.productId, 2);
    putBigEndian(block, kProductIdCopyAt, identity.productIdCopy, 2);
    putBigEndian(block, kVendorIdAt, identity.vendorId, 2);
    putBigEndian(block, kAltProductIdAt, identity.altProductId, 2);
    putBigEndian(block, kSerialNumberAt, identity.serialNumber, 4);
    flash.load(blockStart, block);
}

IdentityValues PhysicalDevice::identity() const
{
    uint16_t blockStart = static_cast<uint16_t>(requireLayout(*this).identityPage + kIdentityBlockOffset);
    std::vector<uint8_t> block = flash.read(blockStart, kIdentityBlockSize);
    IdentityValues identity;
    identity.productId = static_cast<uint16_t>(getBigEndian(block, kProductIdAt, 2));
    identity.productIdCopy = static_cast<uint16_t>(getBigEndian(block, kProductIdCopyAt, 2));
    identity.vendorId = static_cast<uint16_t>(getBigEndian(block, kVendorIdAt, 2));
    identity.altProductId = static_cast<uint16_t>(getBigEndian(block, kAltProductIdAt, 2));
    identity.serialNumber = getBigEndian(block, kSerialNumberAt, 4);
    return identity;
}

void PhysicalDevice::loadImage(const std::vector<uint8_t>& image)
{
    flash.load(requireLayout(*this).firmwareBase, image);
}

bool PhysicalDevice::completionMarkerInPlace() const
{
    const LoaderFlashLayout* map = layout();
    if (map == nullptr) return false;
    uint16_t marker = static_cast<uint16_t>(map->firmwareBase + kMarkerOffset);
    return flash.at(marker) == 0xAA && flash.at(static_cast<uint16_t>(marker + 1)) == 0x55;
}

void PhysicalDevice::attach(EnumeratedDevice& enumeration)
{
    if (current_ == nullptr) {
        current_ = &enumeration;
        ++enumerations_;
    } else {
        enumeration.markGone();
    }
}

void PhysicalDevice::forget(const EnumeratedDevice& enumeration)
{
    if (current_ == &enumeration) current_ = nullptr;
}

std::shared_ptr<PhysicalDevice> makeEmulatedDevice(const EmulatedDeviceOptions& options)
{
    return std::make_shared<PhysicalDevice>(options);
}

LoaderModeDevice& plugInLoaderDevice(const EmulatedDeviceOptions& options)
{
    return makeEmulatedDevice(options)->plugIn(*Host::get().tree());
}

}  // namespace sim
