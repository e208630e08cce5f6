// The module binary itself: it exports exactly the driver's names, imports
// only from its host and the kernel, and has no static constructors.
#include <gtest/gtest.h>

#include <cstdio>
#include <memory>
#include <set>
#include <sstream>
#include <string>

namespace {

std::string run(const std::string& command)
{
    std::unique_ptr<FILE, int (*)(FILE*)> pipe(popen(command.c_str(), "r"), pclose);
    if (!pipe) return {};
    std::string output;
    char buffer[4096];
    size_t n;
    while ((n = fread(buffer, 1, sizeof buffer, pipe.get())) > 0) output.append(buffer, n);
    return output;
}

std::set<std::string> words(const std::string& text, size_t column)
{
    std::set<std::string> result;
    std::istringstream lines(text);
    std::string line;
    while (std::getline(lines, line)) {
        std::istringstream fields(line);
        std::string field;
        for (size_t i = 0; i <= column && fields >> field; ++i) {
            if (i == column) result.insert(field);
        }
    }
    return result;
}

const std::string kModule = MORVANEK_MODULE_FILE;

TEST(ModuleBinary, ExportsExactlyTheDriversNames)
{
    std::set<std::string> exported = words(run("nm -D --defined-only " + kModule), 2);
    std::set<std::string> expected = {
        "DllInitialize",
        "DllUnload",
        "pkgSetWDMWrapperLoadStateAndGetGUID",
        "pkgWDMWrapperCallSSMain",
        "pkgSetLegacyWrapperLoadState",
        "_ZN12nMORVANE_1_417getCurrentVersionERi",
        "_ZN12nMORVANE_1_426getOldestCompatibleVersionERi",
        "_ZN12nMORVANE_1_414compareVersionERK10tSSVersionS2_RiPKc",
        "_ZN12nMORVANE_1_222compareFirmwareVersionE10tSSVersiontRi",
    };
    EXPECT_EQ(exported, expected);
}

TEST(ModuleBinary, ImportsOnlyFromTheHostAndTheKernel)
{
    std::set<std::string> needed;
    std::istringstream lines(run("readelf -d " + kModule));
    std::string line;
    while (std::getline(lines, line)) {
        auto open = line.find("Shared library: [");
        if (open != std::string::npos) needed.insert(line.substr(open + 17, line.find(']') - open - 17));
    }
#ifdef MORVANEK_SANITIZED_BUILD
    needed.erase("libasan.so.8");
    needed.erase("libubsan.so.1");
    needed.erase("libstdc++.so.6");
    needed.erase("libm.so.6");
    needed.erase("libgcc_s.so.1");
    needed.erase("libc.so.6");
#endif
    EXPECT_EQ(needed, (std::set<std::string>{"libkarvelk.so", "libntoskrnl.so"}));

#ifndef MORVANEK_SANITIZED_BUILD
    // Every undefined name is bound to the host's or the kernel's version, so
    // that the C library's wcschr can never stand in for the kernel's.
    std::istringstream symbols(run("nm -D --undefined-only " + kModule));
    while (std::getline(symbols, line)) {
        if (line.find("w ") != std::string::npos && line.find("@") == std::string::npos) continue;  // weak
        bool bound = line.find("@KARVELK") != std::string::npos || line.find("@NTOSKRNL") != std::string::npos;
        EXPECT_TRUE(bound) << line;
    }
#endif
}

TEST(ModuleBinary, HasNoStaticConstructors)
{
#ifdef MORVANEK_SANITIZED_BUILD
    GTEST_SKIP() << "the sanitizers add constructors of their own";
#endif
    std::string sections = run("readelf -S -W " + kModule);
    for (const char* name : {".init_array", ".ctors", ".fini_array", ".dtors"}) {
        std::istringstream lines(sections);
        std::string line;
        while (std::getline(lines, line)) {
            if (line.find(std::string(" ") + name + " ") == std::string::npos) continue;
            // An entry would be eight bytes of size at least.
            std::istringstream fields(line.substr(line.find(name)));
            std::string field, type, address, offset, size;
            fields >> field >> type >> address >> offset >> size;
            EXPECT_EQ(std::stoul(size, nullptr, 16), 0u) << line;
        }
    }
}

}  // namespace
