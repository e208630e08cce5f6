// Runs a program against an emulated bus: as a child process under umockdev's
// preload, with the bus's folder, its output collected in files.
#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

namespace usbtestbed {

// Restarts the calling program under umockdev's preload unless it already
// runs there. The test bed sends udev events through libudev, which must see
// the bed's /sys as the programs under test do. Call it first thing.
void runUnderUmockdev();

struct ProgramOutput {
    int exitCode = -1;  // 128 + signal when a signal ended it
    std::string out;
    std::string errors;
};

class ProgramRun {
  public:
    // Starts the command (program first) with UMOCKDEV_DIR set to the bus
    // folder; standard output and error go to files in the output folder.
    ProgramRun(const std::vector<std::string>& command, const std::string& busFolder, const std::string& outputFolder);
    void signal(int number);
    // Waits until the program's standard output holds the text; false on time-out.
    bool waitForOutput(const std::string& text, int timeoutMs) const;
    // Sends the signal (0: none) and waits for the program to end.
    ProgramOutput finish(int signal = 0);

  private:
    pid_t child_;
    std::string outFile_;
    std::string errFile_;
};

}  // namespace usbtestbed
