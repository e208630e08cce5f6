#include "registrySim.h"

#include <stdexcept>

#include "kernelUtf16.h"
#include "registryKeyTree.h"

namespace sim::kernel {

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

std::vector<std::string> Registry::createdKeys() const
{
    std::vector<std::string> result;
    for (const RegistryCall& call : calls_)
        if (call.kind == RegistryCall::Kind::createKey && call.created) result.push_back(call.keyPath);
    return result;
}

std::vector<RegistryKeyContent> Registry::contents() const
{
    std::vector<RegistryKeyContent> keys;
    const RegistryKey& machine = *child(*child(*root_, u"Registry"), u"Machine");
    collectContent(machine, "\\Registry\\Machine", keys);
    return keys;
}

Registry& registry()
{
    static Registry instance;
    return instance;
}

}  // namespace sim::kernel
