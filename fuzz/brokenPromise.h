// A promise a fuzzer found broken: said on standard error, then a crash that
// libFuzzer records together with the input that caused it.
#pragma once

#include <cstdio>
#include <cstdlib>
#include <string>
#include <vector>

namespace fuzzing {

[[noreturn]] inline void brokenPromise(const std::string& what)
{
    std::fprintf(stderr, "broken promise: %s\n", what.c_str());
    std::abort();
}

inline void require(bool condition, const std::string& what)
{
    if (!condition) brokenPromise(what);
}

inline void requireNone(const std::vector<std::string>& problems, const std::string& what)
{
    if (problems.empty()) return;
    std::string text = what + ":";
    for (const std::string& problem : problems) text += "\n  " + problem;
    brokenPromise(text);
}

}  // namespace fuzzing
