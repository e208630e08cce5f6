#include "registryKeyTree.h"

#include <stdexcept>

#include "kernelUtf16.h"

namespace sim::kernel {

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

}  // namespace sim::kernel
