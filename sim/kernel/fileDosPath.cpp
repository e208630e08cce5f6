#include "fileDosPath.h"

#include <algorithm>
#include <cctype>
#include <string_view>
#include <system_error>
#include <vector>

#include "fileStatus.h"
#include "kernelUtf16.h"

namespace sim::kernel {
namespace {

namespace fs = std::filesystem;

const std::u16string kDosDevicesPrefix = u"\\??\\";

std::vector<std::u16string> splitAtBackslashes(const std::u16string& text)
{
    std::vector<std::u16string> parts(1);
    for (char16_t c : text) {
        if (c == u'\\') {
            parts.emplace_back();
        } else {
            parts.back() += c;
        }
    }
    return parts;
}

bool isSurrogate(char16_t c, char16_t first)
{
    return c >= first && c <= first + 0x3FF;
}

// What NTFS refuses in a name. "." and ".." are refused too: the kernel does
// not fold them away, and here they would climb out of the drive's folder.
// Lone surrogates are refused because no host file name can carry them.
bool isValidComponent(const std::u16string& component)
{
    if (component.empty() || component == u"." || component == u"..") return false;
    for (size_t i = 0; i < component.size(); ++i) {
        char16_t c = component[i];
        if (c < 0x20) return false;
        if (std::u16string_view(u"/:*?\"<>|").find(c) != std::u16string_view::npos) return false;
        if (isSurrogate(c, 0xDC00)) return false;
        if (isSurrogate(c, 0xD800) && !(i + 1 < component.size() && isSurrogate(component[++i], 0xDC00))) return false;
    }
    return true;
}

char asciiLower(char c)
{
    return (c >= 'A' && c <= 'Z') ? static_cast<char>(c - 'A' + 'a') : c;
}

bool equalIgnoringAsciiCase(const std::string& a, const std::string& b)
{
    return a.size() == b.size() &&
           std::equal(a.begin(), a.end(), b.begin(), [](char x, char y) { return asciiLower(x) == asciiLower(y); });
}

// The entry of the directory the component names, or empty when none does.
std::string findEntry(const fs::path& directory, const std::string& component)
{
    std::vector<std::string> candidates;
    std::error_code error;
    for (fs::directory_iterator it(directory, error), end; !error && it != end; it.increment(error)) {
        std::string entry = it->path().filename().string();
        if (entry == component) return entry;
        if (equalIgnoringAsciiCase(entry, component)) candidates.push_back(entry);
    }
    // Directory order is arbitrary; pick the same one every time.
    if (candidates.empty()) return {};
    return *std::min_element(candidates.begin(), candidates.end());
}

// Every path here is canonical, so comparing components is enough.
bool isInside(const fs::path& path, const fs::path& folder)
{
    auto mismatch = std::mismatch(folder.begin(), folder.end(), path.begin(), path.end());
    return mismatch.first == folder.end();
}

DosPathResolution failure(NTSTATUS status)
{
    DosPathResolution result;
    result.status = status;
    return result;
}

} // namespace

DosPathResolution resolveDosPath(const std::u16string& name, const std::map<char, fs::path>& drives)
{
    if (name.compare(0, kDosDevicesPrefix.size(), kDosDevicesPrefix) != 0)
        return failure(fileStatus::objectNameInvalid);
    std::vector<std::u16string> parts = splitAtBackslashes(name.substr(kDosDevicesPrefix.size()));

    // The first part names a DOS device; only mapped drive letters exist.
    const std::u16string& device = parts.front();
    if (device.empty()) return failure(fileStatus::objectNameInvalid);
    char letter = device.size() == 2 && device[1] == u':' && device[0] < 0x80 ? static_cast<char>(device[0]) : 0;
    letter = static_cast<char>(std::toupper(static_cast<unsigned char>(letter)));
    auto drive = drives.find(letter);
    // The device is looked up as one name in the DOS devices directory: when
    // nothing follows it ("\??\C:/dir/file", slashes being no separators) a
    // missing device is a missing name, not a missing path.
    if (letter < 'A' || letter > 'Z' || drive == drives.end())
        return failure(parts.size() == 1 ? fileStatus::objectNameNotFound : fileStatus::objectPathNotFound);

    // "C:" and "C:\" both name the drive's root; otherwise a trailing
    // backslash asks for a directory.
    std::vector<std::u16string> components(parts.begin() + 1, parts.end());
    bool wantsDirectory = false;
    if (!components.empty() && components.back().empty()) {
        components.pop_back();
        wantsDirectory = true;
    }
    std::vector<std::string> names;
    for (const std::u16string& component : components) {
        if (!isValidComponent(component)) return failure(fileStatus::objectNameInvalid);
        names.push_back(toUtf8(component));
    }

    std::error_code error;
    fs::path root = fs::canonical(drive->second, error);
    if (error || !fs::is_directory(root, error)) return failure(fileStatus::objectPathNotFound);

    fs::path current = root;
    for (size_t i = 0; i < names.size(); ++i) {
        bool last = i + 1 == names.size();
        NTSTATUS missing = last ? fileStatus::objectNameNotFound : fileStatus::objectPathNotFound;
        if (!fs::is_directory(current, error)) return failure(fileStatus::objectPathNotFound);
        std::string entry = findEntry(current, names[i]);
        if (entry.empty()) return failure(missing);
        fs::path next = current / entry;
        if (fs::is_symlink(next, error)) {
            next = fs::canonical(next, error);
            if (error) return failure(missing); // dangling
            if (!isInside(next, root)) return failure(fileStatus::objectNameInvalid);
        }
        current = next;
    }

    DosPathResolution result;
    result.isDirectory = fs::is_directory(current, error);
    if (wantsDirectory && !result.isDirectory) return failure(fileStatus::objectNameInvalid);
    result.hostPath = current;
    return result;
}

} // namespace sim::kernel
