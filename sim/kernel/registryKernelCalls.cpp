// The kernel's registry entry points as the module calls them: argument
// checks, faults, handles and the partial-information record.
#include <cstdio>
#include <cstring>

#include "kernelHandles.h"
#include "kernelLock.h"
#include "kernelUtf16.h"
#include "registryKeyTree.h"
#include "registrySim.h"

namespace sim::kernel {
namespace {

constexpr uint32_t kPartialInformationHeader = 12;  // title index, type, data length

std::string hexNumber(uint64_t number)
{
    char text[24];
    std::snprintf(text, sizeof text, "0x%llX", static_cast<unsigned long long>(number));
    return text;
}

// Empty when the counted string is one the kernel would accept.
std::string countedStringProblem(const UNICODE_STRING& text, const char* what)
{
    if (text.Length % 2 != 0) return std::string(what) + " has an odd length of " + std::to_string(text.Length);
    if (text.Length > text.MaximumLength)
        return std::string(what) + " is longer (" + std::to_string(text.Length) + ") than its maximum (" +
               std::to_string(text.MaximumLength) + ")";
    if (text.Length != 0 && text.Buffer == nullptr) return std::string(what) + " has a length but no buffer";
    return {};
}

std::u16string countedText(const UNICODE_STRING& text)
{
    return text.Length == 0 ? std::u16string() : std::u16string(text.Buffer, text.Length / sizeof(WCHAR));
}

// The arguments the module must pass: a full path, case-insensitive, nothing else.
std::string createKeyArgumentProblem(HANDLE* keyHandle, const OBJECT_ATTRIBUTES* attributes,
                                     const UNICODE_STRING* keyClass, uint32_t createOptions)
{
    if (keyHandle == nullptr) return "no place for the key handle";
    if (attributes == nullptr) return "no object attributes";
    if (attributes->Length != sizeof(OBJECT_ATTRIBUTES))
        return "object attributes of length " + std::to_string(attributes->Length) + ", not 48";
    if (attributes->RootDirectory != nullptr) return "a root directory was given; keys are opened by full path";
    if (attributes->ObjectName == nullptr) return "no object name";
    std::string nameProblem = countedStringProblem(*attributes->ObjectName, "the object name");
    if (!nameProblem.empty()) return nameProblem;
    // A handle without OBJ_KERNEL_HANDLE belongs to whatever process the
    // calling thread runs in, where user mode can reach it.
    if (attributes->Attributes != (kObjCaseInsensitive | kObjKernelHandle))
        return "object attributes " + hexNumber(attributes->Attributes) +
               ", not OBJ_CASE_INSENSITIVE | OBJ_KERNEL_HANDLE (0x240)";
    if (attributes->SecurityDescriptor != nullptr) return "a security descriptor was given";
    if (attributes->SecurityQualityOfService != nullptr) return "a security quality of service was given";
    if (keyClass != nullptr) return "a key class was given";
    if (createOptions != 0) return "create options " + hexNumber(createOptions) + ", not 0";
    return {};
}

void putWord(void* record, size_t offset, uint32_t word)
{
    std::memcpy(static_cast<uint8_t*>(record) + offset, &word, sizeof word);
}

}  // namespace

// The kernel's side of the registry: what ZwCreateKey and ZwQueryValueKey do.
struct RegistryKernelSide {
    static NTSTATUS createKey(Registry& registry, HANDLE* keyHandle, uint32_t desiredAccess,
                              OBJECT_ATTRIBUTES* attributes, UNICODE_STRING* keyClass, uint32_t createOptions,
                              uint32_t* disposition)
    {
        RegistryCall call;
        call.kind = RegistryCall::Kind::createKey;
        call.desiredAccess = desiredAccess;
        auto finish = [&](NTSTATUS result) {
            call.result = result;
            registry.calls_.push_back(call);
            return result;
        };

        std::string problem = createKeyArgumentProblem(keyHandle, attributes, keyClass, createOptions);
        if (!problem.empty()) {
            reportMisuse("ZwCreateKey: " + problem);
            return finish(kStatusInvalidParameter);
        }
        std::u16string name = countedText(*attributes->ObjectName);
        call.keyPath = toUtf8(name);
        if (name.empty()) return finish(kStatusObjectNameInvalid);
        if (name[0] != u'\\') return finish(kStatusObjectPathSyntaxBad);
        std::vector<std::u16string> components = splitComponents(name);
        for (const std::u16string& component : components)
            if (component.empty()) return finish(kStatusObjectNameInvalid);

        std::u16string pathKey = foldedPath(components);
        auto fault = registry.createFaults_.find(pathKey);
        if (fault != registry.createFaults_.end()) return finish(fault->second);

        // Open every component; only the last may be created, and only inside
        // the hive: the roots above it take no new keys.
        std::shared_ptr<RegistryKey> key = registry.root_;
        bool created = false;
        for (size_t i = 0; i < components.size(); ++i) {
            std::shared_ptr<RegistryKey> next = child(*key, components[i]);
            if (next == nullptr) {
                if (i + 1 < components.size() || key->depth == 0) return finish(kStatusObjectNameNotFound);
                if (key->depth <= kMachineDepth) return finish(kStatusAccessDenied);
                next = addChild(*key, components[i]);
                created = true;
            }
            key = next;
        }

        // The close callback needs the handle, which exists only once opened.
        auto handleValue = std::make_shared<intptr_t>(0);
        Registry* owner = &registry;
        HANDLE handle = openHandle(
            HandleKind::registryKey, [owner, handleValue] { owner->openKeys_.erase(*handleValue); },
            "registry key " + call.keyPath);
        *handleValue = reinterpret_cast<intptr_t>(handle);
        registry.openKeys_[*handleValue] = Registry::OpenKey{key, call.keyPath, pathKey};

        *keyHandle = handle;
        if (disposition != nullptr) *disposition = created ? kRegCreatedNewKey : kRegOpenedExistingKey;
        call.created = created;
        return finish(kStatusSuccess);
    }

    static NTSTATUS queryValue(Registry& registry, HANDLE keyHandle, UNICODE_STRING* valueName,
                               int informationClass, void* information, uint32_t length, uint32_t* resultLength)
    {
        RegistryCall call;
        call.kind = RegistryCall::Kind::queryValue;
        call.bufferLength = length;
        auto finish = [&](NTSTATUS result) {
            call.result = result;
            registry.calls_.push_back(call);
            return result;
        };

        if (findHandle(keyHandle, HandleKind::registryKey) == nullptr) {
            char text[96];
            std::snprintf(text, sizeof text, "ZwQueryValueKey on handle %p, which is not an open registry key",
                          keyHandle);
            reportMisuse(text);
            return finish(kStatusInvalidHandle);
        }
        auto open = registry.openKeys_.find(reinterpret_cast<intptr_t>(keyHandle));
        if (open != registry.openKeys_.end()) call.keyPath = open->second.name;

        std::string problem;
        if (valueName == nullptr) problem = "no value name";
        else problem = countedStringProblem(*valueName, "the value name");
        if (problem.empty() && resultLength == nullptr) problem = "no place for the result length";
        if (problem.empty() && information == nullptr && length != 0)
            problem = "no record, but a record length of " + std::to_string(length);
        if (!problem.empty()) {
            reportMisuse("ZwQueryValueKey: " + problem);
            return finish(kStatusInvalidParameter);
        }
        std::u16string name = countedText(*valueName);
        call.valueName = toUtf8(name);

        // Only the partial-information record is modelled.
        if (informationClass != kKeyValuePartialInformation) return finish(kStatusInvalidParameter);
        if (open == registry.openKeys_.end() || open->second.key->deleted) return finish(kStatusKeyDeleted);

        auto fault = registry.queryFaults_.find({open->second.foldedPath, folded(name)});
        if (fault != registry.queryFaults_.end()) return finish(fault->second);

        const RegistryKey& key = *open->second.key;
        auto found = key.values.find(folded(name));
        if (found == key.values.end()) return finish(kStatusObjectNameNotFound);

        const StoredValue& value = found->second;
        uint32_t dataLength = static_cast<uint32_t>(value.data.size());
        *resultLength = kPartialInformationHeader + dataLength;
        if (length < kPartialInformationHeader) return finish(kStatusBufferTooSmall);
        putWord(information, offsetof(KEY_VALUE_PARTIAL_INFORMATION, TitleIndex), 0);
        putWord(information, offsetof(KEY_VALUE_PARTIAL_INFORMATION, Type), value.type);
        putWord(information, offsetof(KEY_VALUE_PARTIAL_INFORMATION, DataLength), dataLength);
        // Data that does not fit is not copied at all, not even in part.
        if (length < *resultLength) return finish(kStatusBufferOverflow);
        if (dataLength != 0)
            std::memcpy(static_cast<uint8_t*>(information) + kPartialInformationHeader, value.data.data(), dataLength);
        return finish(kStatusSuccess);
    }
};

}  // namespace sim::kernel

extern "C" NTSTATUS ZwCreateKey(HANDLE* keyHandle, uint32_t desiredAccess, OBJECT_ATTRIBUTES* objectAttributes,
                                uint32_t /*titleIndex: ignored by the kernel*/, UNICODE_STRING* keyClass,
                                uint32_t createOptions, uint32_t* disposition)
{
    std::lock_guard<std::recursive_mutex> callLock(sim::kernel::kernelCallLock());
    return sim::kernel::RegistryKernelSide::createKey(sim::kernel::registry(), keyHandle, desiredAccess,
                                                      objectAttributes, keyClass, createOptions, disposition);
}

extern "C" NTSTATUS ZwQueryValueKey(HANDLE keyHandle, UNICODE_STRING* valueName, int informationClass,
                                    void* information, uint32_t length, uint32_t* resultLength)
{
    std::lock_guard<std::recursive_mutex> callLock(sim::kernel::kernelCallLock());
    return sim::kernel::RegistryKernelSide::queryValue(sim::kernel::registry(), keyHandle, valueName,
                                                       informationClass, information, length, resultLength);
}
