// Reports the module's stack frames from the compiler's call-graph files
// (-fcallgraph-info=su) and the deepest chain of frames from a root
// function. Fails when a frame or the chain is over its limit.
//
// usage: stack_report [--limit N] [--chain-limit N] [--root NAME] DIR...
#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <map>
#include <regex>
#include <set>
#include <string>
#include <vector>

namespace {

struct Function {
    std::string name;  // demangled, from the label
    long bytes = -1;   // -1: not compiled here (another module or the host)
    std::set<std::string> callees;
};

// Defined functions are titled "file:symbol"; calls name external symbols
// plainly. Keying by symbol joins the two.
std::string symbolOf(const std::string& title)
{
    auto colon = title.rfind(':');
    return colon == std::string::npos ? title : title.substr(colon + 1);
}

void readCallGraph(const std::filesystem::path& file, std::map<std::string, Function>& functions)
{
    static const std::regex node(R"re(node: \{ title: "([^"]*)" label: "([^"\\]*)(?:\\n[^"\\]*)?(?:\\n(\d+) bytes[^"]*)?")re");
    static const std::regex edge(R"re(edge: \{ sourcename: "([^"]*)" targetname: "([^"]*)")re");
    std::ifstream in(file);
    std::string line;
    while (std::getline(in, line)) {
        std::smatch match;
        if (std::regex_search(line, match, node)) {
            Function& function = functions[symbolOf(match[1])];
            function.name = match[2];
            if (match[3].matched) function.bytes = std::stol(match[3]);
        } else if (std::regex_search(line, match, edge)) {
            functions[symbolOf(match[1])].callees.insert(symbolOf(match[2]));
        }
    }
}

struct Chain {
    long bytes = 0;
    std::vector<std::string> path;
};

Chain deepest(const std::map<std::string, Function>& functions, const std::string& symbol,
              std::set<std::string>& onPath)
{
    auto it = functions.find(symbol);
    if (it == functions.end() || it->second.bytes < 0 || onPath.count(symbol)) return {};
    onPath.insert(symbol);
    Chain best;
    for (const std::string& callee : it->second.callees) {
        Chain chain = deepest(functions, callee, onPath);
        if (chain.bytes > best.bytes) best = chain;
    }
    onPath.erase(symbol);
    best.bytes += it->second.bytes;
    best.path.insert(best.path.begin(), it->second.name);
    return best;
}

}  // namespace

int main(int argc, char** argv)
{
    long limit = 2048;
    long chainLimit = 0;
    std::string root = "updateFirmware";
    std::map<std::string, Function> functions;
    int files = 0;
    for (int i = 1; i < argc; ++i) {
        std::string argument = argv[i];
        if (argument == "--limit" && i + 1 < argc) {
            limit = std::atol(argv[++i]);
        } else if (argument == "--chain-limit" && i + 1 < argc) {
            chainLimit = std::atol(argv[++i]);
        } else if (argument == "--root" && i + 1 < argc) {
            root = argv[++i];
        } else if (std::filesystem::is_directory(argument)) {
            for (const auto& entry : std::filesystem::recursive_directory_iterator(argument)) {
                if (entry.path().extension() == ".ci") {
                    readCallGraph(entry.path(), functions);
                    ++files;
                }
            }
        }
    }
    if (files == 0) {
        std::cerr << "stack_report: no call-graph files found (build with -fcallgraph-info=su)\n";
        return 2;
    }

    std::vector<const Function*> defined;
    for (const auto& entry : functions) {
        if (entry.second.bytes >= 0) defined.push_back(&entry.second);
    }
    std::sort(defined.begin(), defined.end(), [](auto* a, auto* b) { return a->bytes > b->bytes; });
    bool ok = true;
    std::cout << "Stack frames of the module's functions (bytes):\n";
    for (const Function* function : defined) {
        bool over = function->bytes > limit;
        ok = ok && !over;
        std::cout << "  " << function->bytes << "\t" << function->name << (over ? "   <-- over the limit" : "") << "\n";
    }

    for (const auto& entry : functions) {
        if (entry.second.bytes < 0 || entry.second.name.find(root + "(") == std::string::npos) continue;
        std::set<std::string> onPath;
        Chain chain = deepest(functions, entry.first, onPath);
        std::cout << "\nDeepest chain from " << entry.second.name << ": " << chain.bytes
                  << " bytes (the host's and the kernel's own frames come on top)\n";
        for (const std::string& step : chain.path) std::cout << "  " << step << "\n";
        if (chainLimit > 0 && chain.bytes > chainLimit) {
            std::cout << "  <-- over the chain limit of " << chainLimit << "\n";
            ok = false;
        }
    }
    return ok ? 0 : 1;
}
