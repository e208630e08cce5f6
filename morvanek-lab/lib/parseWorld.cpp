// The world's parts of a scenario: host, registry, drives and file faults.
#include <algorithm>
#include <cctype>
#include <fstream>
#include <set>
#include <sstream>
#include <string_view>

#include <fmt/format.h>

#include "generatedImage.h"
#include "parseParts.h"
#include "regfile/regFileImport.h"
#include "sim/kernel/registrySim.h"

namespace lab {

namespace {

constexpr size_t kMaxFileSize = 16 * 1024 * 1024;

bool startsWithNoCase(const std::string& text, const std::string& prefix)
{
    if (text.size() < prefix.size()) return false;
    for (size_t i = 0; i < prefix.size(); ++i) {
        if (std::toupper(static_cast<unsigned char>(text[i])) != std::toupper(static_cast<unsigned char>(prefix[i])))
            return false;
    }
    return true;
}

uint32_t registryType(const JsonNode& node)
{
    static const std::pair<const char*, uint32_t> kTypes[] = {
        {"REG_NONE", 0}, {"REG_SZ", 1},    {"REG_EXPAND_SZ", 2}, {"REG_BINARY", 3},
        {"REG_DWORD", 4}, {"REG_MULTI_SZ", 7}, {"REG_QWORD", 11},
    };
    if (!node.isString()) return static_cast<uint32_t>(node.unsignedNumber(0xFFFFFFFF));
    std::string name = node.text();
    for (const auto& type : kTypes) {
        if (name == type.first) return type.second;
    }
    if (auto number = parseNumberText(name); number && *number >= 0 && *number <= 0xFFFFFFFF)
        return static_cast<uint32_t>(*number);
    node.fail(fmt::format("unknown registry type \"{}\" (REG_SZ, REG_EXPAND_SZ, REG_MULTI_SZ, REG_DWORD, REG_QWORD, "
                          "REG_BINARY, REG_NONE or a number)",
                          name));
}

RegistryValuePlan parseRegistryValue(const std::string& name, const JsonNode& node)
{
    RegistryValuePlan value;
    value.name = name;
    if (node.isString()) {
        value.type = 1;
        value.data = sim::kernel::utf16leBytes(node.text());
        return value;
    }
    node.allowOnly({"type", "value", "hex", "terminated"});
    value.type = registryType(node.field("type"));
    auto given = node.optionalField("value");
    auto hex = node.optionalField("hex");
    if (given.has_value() == hex.has_value()) node.fail("give the value's data as exactly one of \"value\" and \"hex\"");
    bool terminated = true;
    if (auto flag = node.optionalField("terminated")) terminated = flag->flag();
    if (hex) {
        value.data = hex->hexBytes();
    } else if (value.type == 1 || value.type == 2) {
        value.data = sim::kernel::utf16leBytes(given->text(), terminated);
    } else if (value.type == 7) {
        std::vector<std::string> texts;
        for (const JsonNode& item : given->items()) texts.push_back(item.text());
        value.data = sim::kernel::multiStringBytes(texts);
    } else if (value.type == 4 || value.type == 11) {
        uint64_t number = given->unsignedNumber(value.type == 4 ? 0xFFFFFFFFu : UINT64_MAX >> 2);
        for (int i = 0; i < (value.type == 4 ? 4 : 8); ++i) value.data.push_back(static_cast<uint8_t>(number >> (8 * i)));
    } else {
        given->fail("for this type give the data as \"hex\"");
    }
    return value;
}

// The longest name one folder entry may have on the host (and on NTFS, in UTF-16 units).
constexpr size_t kMaxNameBytes = 255;
// Room for the temporary folder in front: the host's paths stop at 4096 bytes.
constexpr size_t kMaxDrivePathBytes = 2048;

// Drive-relative path of a file: "WINDOWS\system32\x.bin". Refuses any name
// that the drive's folder could not hold, or that no Windows path can name,
// so that a scenario fails here and not halfway through its run.
std::string driveRelativePath(const JsonNode& node, const std::string& raw)
{
    std::string path;
    for (char c : raw) path += c == '/' ? '\\' : c;
    while (!path.empty() && path[0] == '\\') path.erase(0, 1);
    if (path.size() >= 2 && path[1] == ':')
        node.fail("a file name inside a drive is given without its drive letter (\"WINDOWS\\\\system32\\\\...\")");
    if (path.empty()) node.fail("empty file name");
    // A trailing separator names a folder, which the lab cannot write as a file.
    if (path.back() == '\\') node.fail("a file name may not end in \"\\\" or \"/\"");
    if (path.size() > kMaxDrivePathBytes)
        node.fail(fmt::format("a path of {} bytes; the lab takes paths of at most {} bytes inside a drive", path.size(),
                              kMaxDrivePathBytes));
    std::stringstream parts(path);
    std::string part;
    while (std::getline(parts, part, '\\')) {
        if (part.empty() || part == "." || part == "..") node.fail("a file name may not contain empty, \".\" or \"..\" parts");
        if (part.size() > kMaxNameBytes)
            node.fail(fmt::format("the name \"{}...\" has {} bytes; a file or folder name has at most {}",
                                  part.substr(0, 16), part.size(), kMaxNameBytes));
        for (char c : part) {
            if (static_cast<unsigned char>(c) < 0x20)
                node.fail(fmt::format("a file name may not hold the control character 0x{:02X}", static_cast<int>(c)));
            if (std::string_view(":*?\"<>|").find(c) != std::string_view::npos)
                node.fail(fmt::format("a file name may not hold '{}' (none of : * ? \" < > | can be in a Windows name)", c));
        }
    }
    return path;
}

GeneratedImagePlan parseGenerated(const JsonNode& node)
{
    node.allowOnly({"size", "fill", "seed", "header", "headerAs", "markerRoom"});
    GeneratedImagePlan plan;
    plan.size = node.field("size").unsignedNumber(kMaxFileSize);
    if (auto fill = node.optionalField("fill")) {
        if (!(fill->isString() && fill->text() == "counting")) plan.fillByte = static_cast<uint8_t>(fill->unsignedNumber(0xFF));
    }
    if (auto seed = node.optionalField("seed")) plan.seed = static_cast<uint8_t>(seed->unsignedNumber(0xFF));
    if (auto header = node.optionalField("header")) {
        if (header->isNull()) {
            plan.header.reset();
        } else {
            plan.header = header->text();
        }
    }
    if (auto as = node.optionalField("headerAs")) {
        std::string text = as->text();
        if (text != "bytes" && text != "utf16") as->fail("\"headerAs\" is \"bytes\" or \"utf16\"");
        plan.headerAsUtf16 = text == "utf16";
    }
    if (auto room = node.optionalField("markerRoom")) plan.markerRoom = room->flag();
    return plan;
}

// A file's bytes, given as exactly one of "hex", "text", "generate" and "copyOf".
std::vector<uint8_t> fileContent(const JsonNode& node, const std::filesystem::path& directory)
{
    FilePlan file;
    int sources = 0;
    if (auto hex = node.optionalField("hex")) {
        file.bytes = hex->hexBytes();
        ++sources;
    }
    if (auto text = node.optionalField("text")) {
        std::string content = text->text();
        file.bytes.assign(content.begin(), content.end());
        ++sources;
    }
    if (auto generate = node.optionalField("generate")) {
        file.bytes = generateImage(parseGenerated(*generate));
        ++sources;
    }
    if (auto copy = node.optionalField("copyOf")) {
        file.bytes = readNamedFile(*copy, directory, kMaxFileSize);
        ++sources;
    }
    if (sources != 1) node.fail("give the file's content as exactly one of \"hex\", \"text\", \"generate\" and \"copyOf\"");
    return file.bytes;
}

FilePlan parseFile(const std::string& name, const JsonNode& node, const std::filesystem::path& directory)
{
    FilePlan file;
    file.path = driveRelativePath(node, name);
    node.allowOnly({"hex", "text", "generate", "copyOf", "heldOpenElsewhere"});
    file.bytes = fileContent(node, directory);
    if (auto held = node.optionalField("heldOpenElsewhere")) file.heldOpenElsewhere = held->flag();
    return file;
}

ContentChangePlan parseContentChange(const JsonNode& node, const std::filesystem::path& directory)
{
    node.allowOnly({"file", "afterOpens", "hex", "text", "generate", "copyOf"});
    ContentChangePlan change;
    change.pointer = node.pointer();
    change.dosPath = dosFilePath(node.field("file"));
    if (auto opens = node.optionalField("afterOpens")) {
        change.afterOpens = static_cast<unsigned>(opens->unsignedNumber(1000000));
        if (change.afterOpens == 0) opens->fail("a file that changes before its first open is just another file");
    }
    change.bytes = fileContent(node, directory);
    return change;
}

}  // namespace

std::filesystem::path resolveNamedPath(const JsonNode& node, const std::filesystem::path& directory)
{
    std::filesystem::path path = node.text();
    if (path.empty()) node.fail("empty file name");
    if (path.is_relative()) path = directory / path;
    return path;
}

std::vector<uint8_t> readNamedFile(const JsonNode& node, const std::filesystem::path& directory, size_t maximumSize)
{
    std::filesystem::path path = resolveNamedPath(node, directory);
    std::error_code error;
    if (!std::filesystem::is_regular_file(path, error)) node.fail(fmt::format("no such file: {}", path.string()));
    uintmax_t size = std::filesystem::file_size(path, error);
    if (error) node.fail(fmt::format("cannot read {}: {}", path.string(), error.message()));
    if (size > maximumSize) node.fail(fmt::format("{} has {} bytes; at most {} are taken here", path.string(), size, maximumSize));
    std::ifstream in(path, std::ios::binary);
    std::vector<uint8_t> bytes(static_cast<size_t>(size));
    if (!in.read(reinterpret_cast<char*>(bytes.data()), static_cast<std::streamsize>(bytes.size())))
        node.fail(fmt::format("cannot read {}", path.string()));
    return bytes;
}

std::string kernelKeyPath(const JsonNode& node)
{
    std::string path = node.text();
    std::string rest;
    if (startsWithNoCase(path, "\\Registry\\Machine")) {
        rest = path.substr(17);
    } else if (startsWithNoCase(path, "HKEY_LOCAL_MACHINE")) {
        rest = path.substr(18);
    } else if (startsWithNoCase(path, "HKLM")) {
        rest = path.substr(4);
    } else {
        node.fail(fmt::format("\"{}\" is not a key of the machine hive: write \\Registry\\Machine\\... or "
                              "HKEY_LOCAL_MACHINE\\...",
                              path));
    }
    if (!rest.empty() && rest[0] != '\\') node.fail(fmt::format("\"{}\" is not a key of the machine hive", path));
    while (!rest.empty() && rest.back() == '\\') rest.pop_back();
    if (rest.find("\\\\") != std::string::npos) node.fail(fmt::format("\"{}\" has an empty key name in it", path));
    return "\\Registry\\Machine" + rest;
}

HostPlan parseHost(const JsonNode& node)
{
    node.allowOnly({"ready", "deviceTree", "failAllocations", "failAllAllocations", "registrationFailure",
                    "unregistrationFailure", "failCreateQuery", "failSetAttribute", "failFindDevices",
                    "failAddListener"});
    HostPlan host;
    if (auto ready = node.optionalField("ready")) host.ready = ready->flag();
    if (auto tree = node.optionalField("deviceTree")) host.deviceTree = tree->flag();
    if (auto fail = node.optionalField("failAllocations")) {
        for (const JsonNode& item : fail->itemsOrOne()) {
            uint64_t nth = item.unsignedNumber(1000000);
            if (nth == 0) item.fail("allocations count from 1");
            host.failAllocations.push_back(static_cast<size_t>(nth));
        }
    }
    if (auto all = node.optionalField("failAllAllocations")) host.failAllAllocations = all->flag();
    if (auto status = node.optionalField("registrationFailure")) {
        host.registrationFailure = status->status();
        if (host.registrationFailure >= 0) status->fail("a registration failure is a negative status");
    }
    if (auto status = node.optionalField("unregistrationFailure")) {
        host.unregistrationFailure = status->status();
        if (host.unregistrationFailure >= 0) status->fail("an unregistration failure is a negative status");
    }
    if (auto calls = node.optionalField("failCreateQuery")) host.failCreateQuery = parseCallFailures(*calls, false);
    if (auto calls = node.optionalField("failSetAttribute")) host.failSetAttribute = parseCallFailures(*calls, false);
    if (auto calls = node.optionalField("failFindDevices")) host.failFindDevices = parseCallFailures(*calls, false);
    if (auto calls = node.optionalField("failAddListener")) host.failAddListener = parseCallFailures(*calls, false);
    return host;
}

RegistryPlan parseRegistry(const JsonNode& node, const std::filesystem::path& directory)
{
    node.allowOnly({"import", "keys", "faults"});
    RegistryPlan registry;
    if (auto imports = node.optionalField("import")) {
        for (const JsonNode& item : imports->itemsOrOne()) {
            std::filesystem::path path = resolveNamedPath(item, directory);
            std::error_code error;
            if (!std::filesystem::is_regular_file(path, error)) item.fail(fmt::format("no such file: {}", path.string()));
            // Read now, so that a malformed export is refused before anything runs.
            std::vector<uint8_t> bytes = readNamedFile(item, directory, kMaxFileSize);
            try {
                sim::regfile::parseRegistryExport(std::string(bytes.begin(), bytes.end()), path.filename().string());
            } catch (const std::runtime_error& problem) {
                item.fail(problem.what());
            }
            registry.imports.push_back(path);
        }
    }
    if (auto keys = node.optionalField("keys")) {
        for (const auto& [name, values] : keys->members()) {
            RegistryKeyPlan key;
            // The key's name is judged at the place of its values, which is where it stands.
            nlohmann::json nameText = name;
            try {
                key.path = kernelKeyPath(JsonNode(nameText, values.file()));
            } catch (const ScenarioError& error) {
                values.fail(error.problem());
            }
            for (const auto& [valueName, value] : values.members()) key.values.push_back(parseRegistryValue(valueName, value));
            registry.keys.push_back(key);
        }
    }
    if (auto faults = node.optionalField("faults")) {
        for (const JsonNode& item : faults->items()) {
            item.allowOnly({"key", "value", "status", "number"});
            RegistryFaultPlan fault;
            fault.keyPath = kernelKeyPath(item.field("key"));
            if (auto value = item.optionalField("value")) fault.valueName = value->text();
            fault.status = failureStatus(item.field("status"));
            if (auto number = item.optionalField("number")) {
                fault.number = number->unsignedNumber(1000000);
                if (fault.number == 0) number->fail("calls count from 1");
            }
            registry.faults.push_back(fault);
        }
    }
    return registry;
}

std::vector<DrivePlan> parseDrives(const JsonNode& node, const std::filesystem::path& directory)
{
    std::vector<DrivePlan> drives;
    for (const auto& [letter, drive] : node.members()) {
        if (letter.size() != 1 || !std::isalpha(static_cast<unsigned char>(letter[0])))
            drive.fail(fmt::format("\"{}\" is not a drive letter; name drives \"C\", \"D\", ...", letter));
        drive.allowOnly({"folder", "files"});
        DrivePlan plan;
        plan.letter = static_cast<char>(std::toupper(static_cast<unsigned char>(letter[0])));
        if (std::any_of(drives.begin(), drives.end(), [&](const DrivePlan& d) { return d.letter == plan.letter; }))
            drive.fail(fmt::format("drive {} is given twice", plan.letter));
        if (auto folder = drive.optionalField("folder")) {
            std::filesystem::path path = resolveNamedPath(*folder, directory);
            std::error_code error;
            if (!std::filesystem::is_directory(path, error)) folder->fail(fmt::format("no such folder: {}", path.string()));
            plan.folder = path;
        }
        if (auto files = drive.optionalField("files")) {
            if (plan.folder) files->fail("a drive is either a real \"folder\" or a set of \"files\", not both");
            std::set<std::string> seen;
            for (const auto& [name, file] : files->members()) {
                FilePlan parsed = parseFile(name, file, directory);
                std::string folded = parsed.path;
                for (char& c : folded) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
                if (!seen.insert(folded).second) file.fail("this file is given twice (names ignore case)");
                plan.files.push_back(parsed);
            }
        }
        drives.push_back(plan);
    }
    return drives;
}

std::string dosFilePath(const JsonNode& node)
{
    std::string path = node.text();
    if (path.size() < 3 || !std::isalpha(static_cast<unsigned char>(path[0])) || path[1] != ':' ||
        (path[2] != '\\' && path[2] != '/'))
        node.fail(fmt::format("\"{}\" is not a DOS path with its drive letter, such as \"C:\\\\WINDOWS\\\\x.bin\"", path));
    std::string letter(1, static_cast<char>(std::toupper(static_cast<unsigned char>(path[0]))));
    return letter + ":\\" + driveRelativePath(node, path.substr(3));
}

FileFaultPlan parseFileFaults(const JsonNode& node, const std::filesystem::path& directory)
{
    node.allowOnly({"failReads", "failRead", "failSizeQuery", "failSetPosition", "failOpen", "shortReads",
                    "changeContent"});
    FileFaultPlan faults;
    if (auto status = node.optionalField("failReads")) faults.everyRead = failureStatus(*status);
    if (auto reads = node.optionalField("failRead")) {
        for (const JsonNode& item : reads->itemsOrOne()) {
            item.allowOnly({"number", "status"});
            uint64_t number = item.field("number").unsignedNumber(1000000);
            if (number == 0) item.field("number").fail("reads count from 1");
            faults.readNumbers.emplace_back(static_cast<unsigned>(number), failureStatus(item.field("status")));
        }
    }
    if (auto failures = node.optionalField("failSizeQuery")) {
        for (CallFailurePlan& failure : parseCallFailures(*failures, true)) {
            if (failure.number == 0 && !failure.file) {
                faults.sizeQuery = failure.status;
            } else {
                faults.sizeQueries.push_back(failure);
            }
        }
    }
    if (auto status = node.optionalField("failSetPosition")) faults.setPosition = failureStatus(*status);
    if (auto failures = node.optionalField("failOpen")) faults.opens = parseCallFailures(*failures, true);
    if (auto reads = node.optionalField("shortReads")) {
        for (const JsonNode& item : reads->itemsOrOne()) {
            item.allowOnly({"number", "bytes"});
            uint64_t number = item.field("number").unsignedNumber(1000000);
            if (number == 0) item.field("number").fail("reads count from 1");
            faults.shortReads.emplace_back(static_cast<unsigned>(number),
                                           static_cast<uint32_t>(item.field("bytes").unsignedNumber(0xFFFFFFFF)));
        }
    }
    if (auto changes = node.optionalField("changeContent")) {
        for (const JsonNode& item : changes->itemsOrOne()) faults.contentChanges.push_back(parseContentChange(item, directory));
    }
    return faults;
}

}  // namespace lab
