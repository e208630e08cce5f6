// Runs the lab's command as a user would, for its exit code and standard output.
#pragma once

#include <sys/wait.h>

#include <cstdio>
#include <string>

namespace lab_tests {

struct Outcome {
    int exitCode = -1;
    std::string output;  // standard output only
};

inline Outcome runLab(const std::string& arguments)
{
    Outcome outcome;
    std::string command = std::string(MORVANEK_LAB_EXECUTABLE) + " " + arguments + " 2>/dev/null";
    FILE* pipe = popen(command.c_str(), "r");
    if (pipe == nullptr) return outcome;
    char buffer[4096];
    for (size_t n; (n = fread(buffer, 1, sizeof buffer, pipe)) > 0;) outcome.output.append(buffer, n);
    int status = pclose(pipe);
    outcome.exitCode = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    return outcome;
}

}  // namespace lab_tests
