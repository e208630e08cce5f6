#include "registryText.h"

#include <fstream>
#include <iterator>
#include <stdexcept>

#include "regFileExport.h"
#include "regFileImport.h"

namespace sim::regfile {

void importRegistryText(kernel::Registry& registry, const std::string& text, const std::string& sourceName)
{
    // Parsed whole first, so a malformed file changes nothing.
    for (RegistryEdit& edit : parseRegistryExport(text, sourceName)) {
        switch (edit.kind) {
        case RegistryEdit::Kind::createKey:
            registry.createKey(edit.keyPath);
            break;
        case RegistryEdit::Kind::deleteKey:
            registry.deleteKey(edit.keyPath);
            break;
        case RegistryEdit::Kind::setValue:
            registry.setValue(edit.keyPath, edit.valueName, edit.type, std::move(edit.data));
            break;
        case RegistryEdit::Kind::deleteValue:
            registry.deleteValue(edit.keyPath, edit.valueName);
            break;
        }
    }
}

void importRegistryFile(kernel::Registry& registry, const std::string& path)
{
    std::ifstream file(path, std::ios::binary);
    if (!file) throw std::runtime_error("cannot open " + path);
    std::string bytes((std::istreambuf_iterator<char>(file)), std::istreambuf_iterator<char>());
    if (file.bad()) throw std::runtime_error("cannot read " + path);
    importRegistryText(registry, bytes, path);
}

std::string exportRegistryText(const kernel::Registry& registry)
{
    return formatRegistryExport(registry.contents());
}

}  // namespace sim::regfile
