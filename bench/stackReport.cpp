// Measures the stack of the driver as it ships: frame sizes from the unwind
// data of the Windows objects (what the kernel itself unwinds by), call edges
// from their disassembly, and the deepest chain from every entry point the
// kernel or the host calls. Fails when a frame or a chain is over its limit.
//
// usage: stack_report --objdump TOOL --readobj TOOL [--undname TOOL] [--exports DEF]
//                     [--root TEXT]... [--call CALLER=CALLEE]... [--limit N] [--chain-limit N] OBJECT...
//
// --exports names the .def file whose exports are entry points; --root adds
// every function whose decorated name contains TEXT (what the host reaches
// through a record or a virtual table); --call adds an edge the disassembly
// cannot show, a call through a pointer into the module itself.
#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <iostream>
#include <map>
#include <memory>
#include <regex>
#include <set>
#include <sstream>
#include <string>
#include <vector>

namespace {

struct Function {
    long frame = 8;  // the return address; a function without unwind data uses no more
    std::set<std::string> calls;
    std::set<std::string> tailJumps;  // leave the frame before they jump
};

using Functions = std::map<std::string, Function>;

std::string run(const std::string& command)
{
    std::unique_ptr<FILE, int (*)(FILE*)> pipe(popen(command.c_str(), "r"), pclose);
    if (!pipe) {
        std::cerr << "stack_report: cannot run " << command << "\n";
        std::exit(2);
    }
    std::string output;
    char buffer[65536];
    size_t count;
    while ((count = fread(buffer, 1, sizeof buffer, pipe.get())) > 0) output.append(buffer, count);
    return output;
}

std::string quoted(const std::string& text)
{
    std::string result = "'";
    for (char c : text) result += c == '\'' ? std::string("'\\''") : std::string(1, c);
    return result + "'";
}

// Functions defined in the object and the calls and jumps that leave them.
void readCalls(const std::string& disassembly, Functions& functions)
{
    static const std::regex start(R"re(^[0-9a-f]+ <(.+)>:$)re");
    static const std::regex instruction(R"re(^\s+[0-9a-f]+:\s+(\S+)\s*(.*)$)re");
    static const std::regex relocation(R"re(^\s+[0-9a-f]+:\s+IMAGE_REL_AMD64_\S+\s+(\S+)$)re");
    static const std::regex localTarget(R"re(<([^+>]+)>$)re");
    std::istringstream lines(disassembly);
    std::string line;
    std::string current;
    std::string mnemonic;  // of the last instruction, until its target is known
    std::string operands;
    auto leave = [&](const std::string& target) {
        if (mnemonic.rfind("call", 0) == 0) functions[current].calls.insert(target);
        if (mnemonic[0] == 'j') functions[current].tailJumps.insert(target);
        mnemonic.clear();
    };
    // A call or jump within the object needs no relocation; its target shows
    // by name, without an offset.
    auto settle = [&] {
        std::smatch target;
        if (!mnemonic.empty() && std::regex_search(operands, target, localTarget) && target[1] != current)
            leave(target[1]);
        mnemonic.clear();
    };
    while (std::getline(lines, line)) {
        std::smatch match;
        if (std::regex_match(line, match, start)) {
            settle();
            current = match[1];
            functions[current];
        } else if (current.empty()) {
            continue;
        } else if (std::regex_match(line, match, relocation)) {
            if (!mnemonic.empty()) leave(match[1]);
        } else if (std::regex_match(line, match, instruction)) {
            settle();
            mnemonic = match[1];
            operands = match[2];
        }
    }
    settle();
}

// Frame sizes from the unwind codes: pushes and allocations, plus the return
// address. A function split into several runtime entries takes the largest.
void readFrames(const std::string& unwind, Functions& functions)
{
    static const std::regex start(R"re(^\s+StartAddress: (\S+) \()re");
    static const std::regex push(R"re(^\s+0x[0-9A-F]+: PUSH_NONVOL)re");
    static const std::regex alloc(R"re(^\s+0x[0-9A-F]+: ALLOC_(?:SMALL|LARGE) size=(\d+))re");
    std::istringstream lines(unwind);
    std::string line;
    std::string current;
    long bytes = 0;
    auto finish = [&] {
        if (current.empty()) return;
        Function& function = functions[current];
        function.frame = std::max(function.frame, 8 + bytes);
    };
    while (std::getline(lines, line)) {
        std::smatch match;
        if (std::regex_search(line, match, start)) {
            finish();
            current = match[1];
            bytes = 0;
        } else if (std::regex_search(line, match, push)) {
            bytes += 8;
        } else if (std::regex_search(line, match, alloc)) {
            bytes += std::stol(match[1]);
        }
    }
    finish();
}

std::vector<std::string> exportNames(const std::string& defFile)
{
    std::vector<std::string> names;
    std::ifstream in(defFile);
    std::string line;
    bool inExports = false;
    while (std::getline(in, line)) {
        std::istringstream words(line);
        std::string word;
        if (!(words >> word) || word[0] == ';') continue;
        if (word == "EXPORTS") {
            inExports = true;
        } else if (inExports) {
            names.push_back(word);
        }
    }
    return names;
}

struct Chain {
    long bytes = 0;
    std::vector<std::string> path;
};

Chain deepest(const Functions& functions, const std::string& name, std::set<std::string>& onPath, bool& recursive)
{
    auto it = functions.find(name);
    if (it == functions.end()) return {};  // the host's or the kernel's: on top
    if (onPath.count(name) != 0) {
        recursive = true;
        return {};
    }
    onPath.insert(name);
    Chain below;
    for (const std::string& callee : it->second.calls) {
        Chain chain = deepest(functions, callee, onPath, recursive);
        if (chain.bytes > below.bytes) below = chain;
    }
    Chain here = below;
    here.bytes += it->second.frame;
    here.path.insert(here.path.begin(), name);
    for (const std::string& target : it->second.tailJumps) {
        Chain chain = deepest(functions, target, onPath, recursive);
        if (chain.bytes > here.bytes) {
            here = chain;
            here.path.insert(here.path.begin(), name + " (jumps to)");
        }
    }
    onPath.erase(name);
    return here;
}

std::map<std::string, std::string> demangled(const std::string& undname, const Functions& functions)
{
    std::map<std::string, std::string> names;
    for (const auto& entry : functions) names[entry.first] = entry.first;
    if (undname.empty()) return names;
    std::string input;
    for (const auto& entry : functions) input += entry.first + "\n";
    std::string listing = run("printf '%s' " + quoted(input) + " | " + quoted(undname) + " 2>/dev/null");
    std::istringstream lines(listing);
    std::string mangled;
    std::string plain;
    while (std::getline(lines, mangled)) {
        if (mangled.empty() || !std::getline(lines, plain)) continue;
        if (names.count(mangled) != 0 && !plain.empty() && plain.find("invalid mangled") == std::string::npos)
            names[mangled] = plain;
    }
    return names;
}

}  // namespace

int main(int argc, char** argv)
{
    long limit = 2048;
    long chainLimit = 0;
    std::string objdump;
    std::string readobj;
    std::string undname;
    std::vector<std::string> roots;
    std::vector<std::string> exported;
    std::vector<std::pair<std::string, std::string>> extraCalls;
    std::vector<std::string> objects;
    for (int i = 1; i < argc; ++i) {
        std::string argument = argv[i];
        auto value = [&]() -> std::string {
            if (i + 1 >= argc) {
                std::cerr << "stack_report: " << argument << " needs a value\n";
                std::exit(2);
            }
            return argv[++i];
        };
        if (argument == "--limit") {
            limit = std::atol(value().c_str());
        } else if (argument == "--chain-limit") {
            chainLimit = std::atol(value().c_str());
        } else if (argument == "--objdump") {
            objdump = value();
        } else if (argument == "--readobj") {
            readobj = value();
        } else if (argument == "--undname") {
            undname = value();
        } else if (argument == "--exports") {
            exported = exportNames(value());
        } else if (argument == "--root") {
            roots.push_back(value());
        } else if (argument == "--call") {
            std::string edge = value();
            auto equals = edge.find('=');
            if (equals == std::string::npos) {
                std::cerr << "stack_report: --call takes CALLER=CALLEE\n";
                return 2;
            }
            extraCalls.emplace_back(edge.substr(0, equals), edge.substr(equals + 1));
        } else {
            objects.push_back(argument);
        }
    }
    if (objdump.empty() || readobj.empty() || objects.empty()) {
        std::cerr << "stack_report: give --objdump, --readobj and the objects\n";
        return 2;
    }

    Functions functions;
    for (const std::string& object : objects) {
        readCalls(run(quoted(objdump) + " -dr --no-show-raw-insn " + quoted(object)), functions);
        readFrames(run(quoted(readobj) + " --unwind " + quoted(object)), functions);
    }
    auto matching = [&](const std::string& text) {
        std::vector<std::string> found;
        for (const auto& entry : functions) {
            if (entry.first.find(text) != std::string::npos) found.push_back(entry.first);
        }
        return found;
    };
    bool ok = true;
    for (const auto& [caller, callee] : extraCalls) {
        std::vector<std::string> callers = matching(caller);
        std::vector<std::string> callees = matching(callee);
        if (callers.empty() || callees.empty()) {
            std::cerr << "stack_report: no function for the call " << caller << "=" << callee << "\n";
            ok = false;
        }
        for (const std::string& from : callers) {
            for (const std::string& to : callees) functions[from].calls.insert(to);
        }
    }
    std::set<std::string> entries;
    for (const std::string& name : exported) {
        if (functions.count(name) == 0) {
            std::cerr << "stack_report: the export " << name << " is not in the objects\n";
            ok = false;
        }
        entries.insert(name);
    }
    for (const std::string& root : roots) {
        std::vector<std::string> found = matching(root);
        if (found.empty()) {
            std::cerr << "stack_report: no function matches the root " << root << "\n";
            ok = false;
        }
        entries.insert(found.begin(), found.end());
    }
    std::map<std::string, std::string> names = demangled(undname, functions);

    std::vector<std::pair<long, std::string>> frames;
    for (const auto& entry : functions) frames.emplace_back(entry.second.frame, entry.first);
    std::sort(frames.rbegin(), frames.rend());
    std::cout << "Stack frames of the driver's functions, return address included (bytes):\n";
    for (const auto& [bytes, name] : frames) {
        if (bytes <= 8) continue;
        bool over = bytes > limit;
        ok = ok && !over;
        std::cout << "  " << bytes << "\t" << names[name] << (over ? "   <-- over the limit" : "") << "\n";
    }

    std::vector<std::pair<Chain, std::string>> chains;
    for (const std::string& entry : entries) {
        std::set<std::string> onPath;
        bool recursive = false;
        Chain chain = deepest(functions, entry, onPath, recursive);
        if (recursive) {
            std::cout << "\n" << names[entry] << " can recurse: its stack has no bound\n";
            ok = false;
        }
        chains.emplace_back(chain, entry);
    }
    std::sort(chains.begin(), chains.end(), [](const auto& a, const auto& b) { return a.first.bytes > b.first.bytes; });
    std::cout << "\nDeepest chain from each entry point (the host's and the kernel's frames come on top):\n";
    for (const auto& [chain, entry] : chains) {
        bool over = chainLimit > 0 && chain.bytes > chainLimit;
        ok = ok && !over;
        std::cout << "  " << chain.bytes << "\t" << names[entry] << (over ? "   <-- over the chain limit" : "") << "\n";
    }
    if (!chains.empty()) {
        std::cout << "\nThe deepest, " << chains.front().first.bytes << " bytes:\n";
        for (const std::string& step : chains.front().first.path) {
            std::string base = step.substr(0, step.find(' '));
            std::string note = step.size() > base.size() ? step.substr(base.size()) : "";
            std::cout << "  " << functions[base].frame << "\t" << names[base] << note << "\n";
        }
    }
    return ok ? 0 : 1;
}
