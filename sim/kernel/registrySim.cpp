#include "registrySim.h"

#include <cstdio>
#include <cstring>
#include <fstream>
#include <iterator>
#include <stdexcept>

#include "kernelHandles.h"
#include "kernelUtf16.h"
#include "regFileExport.h"
#include "regFileImport.h"

namespace sim::kernel {

struct StoredValue {
    std::u16string name;
    uint32_t type = 0;
    std::vector<uint8_t> data;
};

struct RegistryKey {
    std::u16string name;
    int depth = 0;  // 0: the object namespace's root; 1: \Registry; 2: \Registry\Machine
    bool deleted = false;
    std::map<std::u16string, std::shared_ptr<RegistryKey>> subkeys;  // by folded name
    std::map<std::u16string, StoredValue> values;                    // by folded name
};

namespace {

constexpr int kMachineDepth = 2;
constexpr uint32_t kPartialInformationHeader = 12;  // title index, type, data length

// The registry compares names without regard to case. ASCII and Latin-1
// letters are folded, which covers every name the module uses.
std::u16string folded(std::u16string text)
{
    for (char16_t& c : text) {
        if ((c >= u'a' && c <= u'z') || (c >= 0xE0 && c <= 0xFE && c != 0xF7)) c = static_cast<char16_t>(c - 0x20);
    }
    return text;
}

// The components of a path that begins with a backslash; empty ones included,
// so that callers can refuse "\\" and a trailing backslash.
std::vector<std::u16string> splitComponents(const std::u16string& path)
{
    std::vector<std::u16string> parts;
    size_t start = 1;
    for (;;) {
        size_t end = path.find(u'\\', start);
        parts.push_back(path.substr(start, end == std::u16string::npos ? end : end - start));
        if (end == std::u16string::npos) return parts;
        start = end + 1;
    }
}

std::u16string foldedPath(const std::vector<std::u16string>& components)
{
    std::u16string out;
    for (const std::u16string& component : components) out += u'\\' + folded(component);
    return out;
}

// A control's key path: "\Registry\Machine" or below it.
std::vector<std::u16string> controlPath(const std::string& path)
{
    std::u16string text = toUtf16(path);
    std::vector<std::u16string> parts;
    if (!text.empty() && text[0] == u'\\') parts = splitComponents(text);
    bool wellFormed = parts.size() >= 2 && folded(parts[0]) == u"REGISTRY" && folded(parts[1]) == u"MACHINE";
    for (const std::u16string& part : parts) wellFormed = wellFormed && !part.empty();
    if (!wellFormed)
        throw std::invalid_argument("not a key path of the form \\Registry\\Machine\\...: \"" + path + "\"");
    return parts;
}

std::shared_ptr<RegistryKey> child(const RegistryKey& key, const std::u16string& name)
{
    auto it = key.subkeys.find(folded(name));
    return it == key.subkeys.end() ? nullptr : it->second;
}

std::shared_ptr<RegistryKey> addChild(RegistryKey& parent, const std::u16string& name)
{
    auto key = std::make_shared<RegistryKey>();
    key->name = name;
    key->depth = parent.depth + 1;
    parent.subkeys[folded(name)] = key;
    return key;
}

RegistryKey& makeKey(RegistryKey& root, const std::vector<std::u16string>& components)
{
    RegistryKey* key = &root;
    for (const std::u16string& name : components) {
        std::shared_ptr<RegistryKey> next = child(*key, name);
        key = next ? next.get() : addChild(*key, name).get();
    }
    return *key;
}

// Handles still open on a deleted key must see it gone, not its old values.
void markDeleted(RegistryKey& key)
{
    key.deleted = true;
    for (auto& entry : key.subkeys) markDeleted(*entry.second);
}

void collectContent(const RegistryKey& key, const std::string& path, std::vector<RegistryKeyContent>& out)
{
    // The hive's roots are only listed when something was put on them directly.
    if (key.depth > kMachineDepth || !key.values.empty()) {
        RegistryKeyContent content{path, {}};
        for (const auto& entry : key.values)
            content.values.push_back(RegistryValue{toUtf8(entry.second.name), entry.second.type, entry.second.data});
        out.push_back(std::move(content));
    }
    for (const auto& entry : key.subkeys) collectContent(*entry.second, path + "\\" + toUtf8(entry.second->name), out);
}

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
    if (attributes->Attributes != kObjCaseInsensitive)
        return "object attributes " + hexNumber(attributes->Attributes) + ", not OBJ_CASE_INSENSITIVE (0x40)";
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

std::vector<uint8_t> utf16leBytes(const std::string& text, bool withTerminator)
{
    std::u16string units = toUtf16(text);
    if (withTerminator) units += u'\0';
    std::vector<uint8_t> bytes;
    for (char16_t unit : units) {
        bytes.push_back(static_cast<uint8_t>(unit & 0xFF));
        bytes.push_back(static_cast<uint8_t>(unit >> 8));
    }
    return bytes;
}

std::vector<uint8_t> multiStringBytes(const std::vector<std::string>& texts)
{
    std::vector<uint8_t> bytes;
    for (const std::string& text : texts) {
        std::vector<uint8_t> one = utf16leBytes(text, true);
        bytes.insert(bytes.end(), one.begin(), one.end());
    }
    bytes.insert(bytes.end(), {0, 0});
    return bytes;
}

Registry::Registry()
{
    reset();
}

void Registry::reset()
{
    root_ = std::make_shared<RegistryKey>();
    addChild(*addChild(*root_, u"Registry"), u"Machine");
    openKeys_.clear();
    clearFaults();
    calls_.clear();
}

RegistryKey* Registry::findKey(const std::string& path) const
{
    RegistryKey* key = root_.get();
    for (const std::u16string& name : controlPath(path)) {
        key = child(*key, name).get();
        if (key == nullptr) return nullptr;
    }
    return key;
}

void Registry::createKey(const std::string& path)
{
    makeKey(*root_, controlPath(path));
}

bool Registry::keyExists(const std::string& path) const
{
    return findKey(path) != nullptr;
}

void Registry::deleteKey(const std::string& path)
{
    std::vector<std::u16string> components = controlPath(path);
    if (components.size() <= static_cast<size_t>(kMachineDepth))
        throw std::invalid_argument("the machine hive's root cannot be deleted");
    std::u16string name = components.back();
    components.pop_back();
    RegistryKey* parent = root_.get();
    for (const std::u16string& component : components) {
        parent = child(*parent, component).get();
        if (parent == nullptr) return;
    }
    auto it = parent->subkeys.find(folded(name));
    if (it == parent->subkeys.end()) return;
    markDeleted(*it->second);
    parent->subkeys.erase(it);
}

void Registry::setValue(const std::string& keyPath, const std::string& name, uint32_t type, std::vector<uint8_t> data)
{
    RegistryKey& key = makeKey(*root_, controlPath(keyPath));
    std::u16string name16 = toUtf16(name);
    // An existing value keeps the spelling of its name, as in the kernel.
    StoredValue& stored = key.values.try_emplace(folded(name16), StoredValue{name16, 0, {}}).first->second;
    stored.type = type;
    stored.data = std::move(data);
}

void Registry::setString(const std::string& keyPath, const std::string& name, const std::string& text,
                         bool withTerminator)
{
    setValue(keyPath, name, kRegSz, utf16leBytes(text, withTerminator));
}

void Registry::setDword(const std::string& keyPath, const std::string& name, uint32_t value)
{
    std::vector<uint8_t> data(4);
    for (size_t i = 0; i < 4; ++i) data[i] = static_cast<uint8_t>(value >> (8 * i));
    setValue(keyPath, name, kRegDword, std::move(data));
}

void Registry::deleteValue(const std::string& keyPath, const std::string& name)
{
    if (RegistryKey* key = findKey(keyPath)) key->values.erase(folded(toUtf16(name)));
}

std::optional<RegistryValue> Registry::value(const std::string& keyPath, const std::string& name) const
{
    const RegistryKey* key = findKey(keyPath);
    if (key == nullptr) return std::nullopt;
    auto it = key->values.find(folded(toUtf16(name)));
    if (it == key->values.end()) return std::nullopt;
    return RegistryValue{toUtf8(it->second.name), it->second.type, it->second.data};
}

void Registry::importText(const std::string& text, const std::string& sourceName)
{
    for (RegistryEdit& edit : parseRegistryExport(text, sourceName)) {
        switch (edit.kind) {
        case RegistryEdit::Kind::createKey:
            createKey(edit.keyPath);
            break;
        case RegistryEdit::Kind::deleteKey:
            deleteKey(edit.keyPath);
            break;
        case RegistryEdit::Kind::setValue:
            setValue(edit.keyPath, edit.valueName, edit.type, std::move(edit.data));
            break;
        case RegistryEdit::Kind::deleteValue:
            deleteValue(edit.keyPath, edit.valueName);
            break;
        }
    }
}

void Registry::importFile(const std::string& path)
{
    std::ifstream file(path, std::ios::binary);
    if (!file) throw std::runtime_error("cannot open " + path);
    std::string bytes((std::istreambuf_iterator<char>(file)), std::istreambuf_iterator<char>());
    if (file.bad()) throw std::runtime_error("cannot read " + path);
    importText(bytes, path);
}

void Registry::failCreateKey(const std::string& path, NTSTATUS status)
{
    createFaults_[foldedPath(controlPath(path))] = status;
}

void Registry::failQuery(const std::string& keyPath, const std::string& valueName, NTSTATUS status)
{
    queryFaults_[{foldedPath(controlPath(keyPath)), folded(toUtf16(valueName))}] = status;
}

void Registry::clearFaults()
{
    createFaults_.clear();
    queryFaults_.clear();
}

std::vector<std::string> Registry::createdKeys() const
{
    std::vector<std::string> result;
    for (const RegistryCall& call : calls_)
        if (call.kind == RegistryCall::Kind::createKey && call.created) result.push_back(call.keyPath);
    return result;
}

std::string Registry::exportText() const
{
    std::vector<RegistryKeyContent> keys;
    const RegistryKey& machine = *child(*child(*root_, u"Registry"), u"Machine");
    collectContent(machine, "\\Registry\\Machine", keys);
    return formatRegistryExport(keys);
}

Registry& registry()
{
    static Registry instance;
    return instance;
}

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
    return sim::kernel::RegistryKernelSide::createKey(sim::kernel::registry(), keyHandle, desiredAccess,
                                                      objectAttributes, keyClass, createOptions, disposition);
}

extern "C" NTSTATUS ZwQueryValueKey(HANDLE keyHandle, UNICODE_STRING* valueName, int informationClass,
                                    void* information, uint32_t length, uint32_t* resultLength)
{
    return sim::kernel::RegistryKernelSide::queryValue(sim::kernel::registry(), keyHandle, valueName,
                                                       informationClass, information, length, resultLength);
}
