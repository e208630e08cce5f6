#include "programRun.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <sstream>
#include <thread>

namespace usbtestbed {

namespace {

std::string readFile(const std::string& path)
{
    std::ifstream in(path);
    std::stringstream text;
    text << in.rdbuf();
    return text.str();
}

}  // namespace

void runUnderUmockdev()
{
    const char* preload = std::getenv("LD_PRELOAD");
    if (preload != nullptr && std::strstr(preload, "libumockdev-preload") != nullptr) return;
    std::ifstream commandLine("/proc/self/cmdline", std::ios::binary);
    std::vector<std::string> words;
    for (std::string word; std::getline(commandLine, word, '\0');) words.push_back(word);
    std::vector<char*> argv;
    for (std::string& word : words) argv.push_back(word.data());
    argv.push_back(nullptr);
    std::string preloads =
        std::string("libumockdev-preload.so.0") + (preload != nullptr ? std::string(":") + preload : "");
    setenv("LD_PRELOAD", preloads.c_str(), 1);
    // The preload comes before the sanitizer's runtime, which must accept that.
    setenv("ASAN_OPTIONS", "verify_asan_link_order=0", 1);
    execv("/proc/self/exe", argv.data());
}

ProgramRun::ProgramRun(const std::vector<std::string>& command, const std::string& busFolder,
                       const std::string& outputFolder)
    : outFile_(outputFolder + "/out.txt"), errFile_(outputFolder + "/err.txt")
{
    std::vector<std::string> words = command;
    child_ = fork();
    if (child_ == 0) {
        setenv("UMOCKDEV_DIR", busFolder.c_str(), 1);
        int outFd = open(outFile_.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
        int errFd = open(errFile_.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
        dup2(outFd, 1);
        dup2(errFd, 2);
        std::vector<char*> argv;
        for (std::string& word : words) argv.push_back(word.data());
        argv.push_back(nullptr);
        execv(argv[0], argv.data());
        _exit(127);
    }
}

bool ProgramRun::waitForOutput(const std::string& text, int timeoutMs) const
{
    auto deadline = std::chrono::steady_clock::now() + std::chrono::milliseconds(timeoutMs);
    for (;;) {
        if (readFile(outFile_).find(text) != std::string::npos) return true;
        if (std::chrono::steady_clock::now() >= deadline) return false;
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
    }
}

void ProgramRun::signal(int number)
{
    kill(child_, number);
}

ProgramOutput ProgramRun::finish(int signal)
{
    if (signal != 0) kill(child_, signal);
    int status = 0;
    waitpid(child_, &status, 0);
    ProgramOutput output;
    output.exitCode = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
    output.out = readFile(outFile_);
    output.errors = readFile(errFile_);
    return output;
}

}  // namespace usbtestbed
