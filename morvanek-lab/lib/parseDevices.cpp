// The devices of a scenario: what each is, what its flash holds, what it gets wrong.
#include <algorithm>
#include <set>

#include <fmt/format.h>

#include "parseParts.h"

namespace lab {

namespace {

uint16_t id16(const JsonNode& node)
{
    return static_cast<uint16_t>(node.unsignedNumber(0xFFFF));
}

sim::IdentityValues parseIdentity(const JsonNode& node)
{
    sim::IdentityValues identity;
    if (node.isString()) {
        std::string kind = node.text();
        if (kind == "blank") {
            identity.vendorId = 0xFFFF;
            return identity;
        }
        if (kind == "zeroed") return sim::IdentityValues{0, 0, 0, 0, 0};
        node.fail("an identity is \"blank\", \"zeroed\" or an object of vendorId, productId, serialNumber, "
                  "productIdCopy and altProductId");
    }
    node.allowOnly({"vendorId", "productId", "serialNumber", "productIdCopy", "altProductId"});
    if (auto value = node.optionalField("vendorId")) identity.vendorId = id16(*value);
    if (auto value = node.optionalField("productId")) identity.productId = id16(*value);
    if (auto value = node.optionalField("serialNumber")) identity.serialNumber = static_cast<uint32_t>(value->unsignedNumber(0xFFFFFFFF));
    if (auto value = node.optionalField("productIdCopy")) identity.productIdCopy = id16(*value);
    if (auto value = node.optionalField("altProductId")) identity.altProductId = id16(*value);
    return identity;
}

sim::RequestKind requestKind(const JsonNode& node)
{
    std::string name = node.text();
    if (name == "read") return sim::RequestKind::Read;
    if (name == "write") return sim::RequestKind::Write;
    if (name == "erase") return sim::RequestKind::Erase;
    if (name == "restart") return sim::RequestKind::Restart;
    node.fail(fmt::format("\"{}\" is not a request kind (read, write, erase, restart)", name));
}

sim::DeviceFaults parseFaults(const JsonNode& node)
{
    node.allowOnly({"stallRequests", "stallKinds", "readCorruptions", "shortReads", "unplugAtRequest",
                    "refuseOpenStream", "refuseAllocateBuffer", "failAttributes", "failGetDescriptor"});
    sim::DeviceFaults faults;
    if (auto list = node.optionalField("failAttributes")) {
        for (const JsonNode& item : list->itemsOrOne()) {
            item.allowOnly({"id", "status"});
            JsonNode id = item.field("id");
            uint64_t attribute = id.unsignedNumber(0xFFFFFFFF);
            if (attribute != 1 && attribute != 2 && attribute != 21)
                id.fail(fmt::format("the host reads attributes 1 (vendor ID), 2 (product ID) and 21 of a device; not {}",
                                    attribute));
            faults.attributeFailures[static_cast<uint32_t>(attribute)] = failureStatus(item.field("status"));
        }
    }
    if (auto status = node.optionalField("failGetDescriptor")) faults.descriptorFailure = failureStatus(*status);
    if (auto list = node.optionalField("stallRequests")) {
        for (const JsonNode& item : list->itemsOrOne()) {
            uint64_t number = item.unsignedNumber(1000000000);
            if (number == 0) item.fail("requests count from 1");
            faults.stallRequests.insert(number);
        }
    }
    if (auto list = node.optionalField("stallKinds")) {
        for (const JsonNode& item : list->itemsOrOne()) faults.stallKinds.insert(requestKind(item));
    }
    if (auto list = node.optionalField("readCorruptions")) {
        for (const JsonNode& item : list->itemsOrOne()) {
            item.allowOnly({"address", "xor", "replaceWith"});
            sim::ReadCorruption corruption;
            corruption.address = id16(item.field("address"));
            auto mask = item.optionalField("xor");
            auto replacement = item.optionalField("replaceWith");
            if (mask.has_value() == replacement.has_value())
                item.fail("a read corruption has exactly one of \"xor\" and \"replaceWith\"");
            if (mask) corruption.xorMask = static_cast<uint8_t>(mask->unsignedNumber(0xFF));
            if (replacement) corruption.replacement = static_cast<uint8_t>(replacement->unsignedNumber(0xFF));
            faults.readCorruptions.push_back(corruption);
        }
    }
    if (auto list = node.optionalField("shortReads")) {
        for (const JsonNode& item : list->itemsOrOne()) {
            item.allowOnly({"read", "bytes"});
            sim::ShortRead shortRead;
            shortRead.read = item.field("read").unsignedNumber(1000000000);
            if (shortRead.read == 0) item.field("read").fail("reads count from 1");
            // 64 bytes or more would be a whole IN data stage: not short.
            shortRead.bytes = static_cast<uint32_t>(item.field("bytes").unsignedNumber(63));
            faults.shortReads.push_back(shortRead);
        }
    }
    if (auto at = node.optionalField("unplugAtRequest")) faults.unplugAtRequest = at->unsignedNumber(1000000000);
    if (auto flag = node.optionalField("refuseOpenStream")) faults.refuseOpenStream = flag->flag();
    if (auto flag = node.optionalField("refuseAllocateBuffer")) faults.refuseAllocateBuffer = flag->flag();
    return faults;
}

DevicePlan parseDevice(const JsonNode& node, const std::filesystem::path& directory)
{
    node.allowOnly({"name", "loaderProductId", "vendorId", "attribute21", "present", "startsIn", "identity", "flashDump", "memory",
                    "faults", "timing", "maxLoaderComebacks"});
    DevicePlan device;
    device.name = node.field("name").text();
    if (device.name.empty()) node.field("name").fail("a device needs a name");
    sim::EmulatedDeviceOptions& options = device.options;
    options.name = device.name;
    // USB attributes are 32-bit; the module compares their low 16 bits.
    if (auto value = node.optionalField("loaderProductId"))
        options.loaderProductId = static_cast<uint32_t>(value->unsignedNumber(0xFFFFFFFF));
    if (auto value = node.optionalField("vendorId")) options.vendorId = static_cast<uint32_t>(value->unsignedNumber(0xFFFFFFFF));
    if (auto value = node.optionalField("attribute21")) options.attribute21 = static_cast<uint32_t>(value->unsignedNumber(0xFFFFFFFF));
    if (auto value = node.optionalField("present")) device.present = value->flag();
    bool hasLayout = sim::findLoaderFlashLayout(static_cast<uint16_t>(options.loaderProductId)) != nullptr;
    if (auto value = node.optionalField("startsIn")) {
        device.startsIn = powerUp(*value, false);
        if (device.startsIn == sim::PhysicalDevice::PowerUp::firmware && !hasLayout)
            value->fail("only a loader of the family (0x4A10 or 0x4A20) has firmware with an identity to start as");
    }
    if (auto value = node.optionalField("identity")) {
        if (!hasLayout)
            value->fail(fmt::format("a device enumerating with product ID 0x{:04X} has no identity block; only the "
                                    "loaders 0x4A10 and 0x4A20 (in the low 16 bits) have one",
                                    options.loaderProductId));
        device.identity = parseIdentity(*value);
    }
    if (auto value = node.optionalField("flashDump")) device.flashDump = readNamedFile(*value, directory, 0x10000);
    if (auto list = node.optionalField("memory")) {
        for (const JsonNode& item : list->items()) {
            item.allowOnly({"address", "hex", "copyOf"});
            sim::MemoryBytes bytes;
            bytes.address = id16(item.field("address"));
            auto hex = item.optionalField("hex");
            auto copy = item.optionalField("copyOf");
            if (hex.has_value() == copy.has_value()) item.fail("give the bytes as exactly one of \"hex\" and \"copyOf\"");
            bytes.bytes = hex ? hex->hexBytes() : readNamedFile(*copy, directory, 0x10000);
            if (bytes.address + bytes.bytes.size() > 0x10000)
                item.fail(fmt::format("{} bytes at 0x{:04X} run past the end of the device's memory at 0xFFFF",
                                      bytes.bytes.size(), bytes.address));
            device.memory.push_back(bytes);
        }
    }
    if (auto value = node.optionalField("faults")) options.faults = parseFaults(*value);
    if (auto value = node.optionalField("timing")) {
        if (!value->isNull()) {
            device.timingName = value->text();
            if (device.timingName == "fullSpeed") {
                options.timing = sim::TimingModel::fullSpeed();
            } else if (device.timingName == "highSpeed") {
                options.timing = sim::TimingModel::highSpeed();
            } else {
                value->fail("\"timing\" is \"fullSpeed\" or \"highSpeed\"");
            }
        }
    }
    if (auto value = node.optionalField("maxLoaderComebacks")) options.maxLoaderComebacks = static_cast<int>(value->unsignedNumber(1000));
    return device;
}

}  // namespace

sim::PhysicalDevice::PowerUp powerUp(const JsonNode& node, bool asFlashAllowed)
{
    std::string name = node.text();
    if (name == "loader") return sim::PhysicalDevice::PowerUp::loader;
    if (name == "product") return sim::PhysicalDevice::PowerUp::firmware;
    if (name == "flash" && asFlashAllowed) return sim::PhysicalDevice::PowerUp::asFlashSays;
    node.fail(asFlashAllowed ? "\"startsIn\" is \"loader\", \"product\" (its firmware runs) or \"flash\" (the firmware "
                               "when the completion marker is in place, the loader otherwise)"
                             : "\"startsIn\" is \"loader\" or \"product\" (its firmware runs)");
}

std::vector<DevicePlan> parseDevices(const JsonNode& node, const std::filesystem::path& directory)
{
    std::vector<DevicePlan> devices;
    for (const JsonNode& item : node.items()) {
        DevicePlan device = parseDevice(item, directory);
        if (std::any_of(devices.begin(), devices.end(), [&](const DevicePlan& d) { return d.name == device.name; }))
            item.field("name").fail(fmt::format("two devices are named \"{}\"", device.name));
        devices.push_back(std::move(device));
    }
    return devices;
}

}  // namespace lab
