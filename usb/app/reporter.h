// Everything the program says: lines for people on standard error, or JSON
// lines on standard output; and, on a terminal, one progress line for the
// devices being updated. Safe to call from any thread.
#pragma once

#include <map>
#include <mutex>
#include <string>
#include <vector>

#include "../host/usbHost.h"

namespace usbapp {

class Reporter {
  public:
    Reporter(bool json, bool progress);

    void event(const usbhost::HostEvent& event);
    void note(const std::string& text);
    void error(const std::string& text);
    void summary(int exitCode, const std::vector<usbhost::UpdateRecord>& updates,
                 const std::vector<usbhost::Comeback>& comebacks, const std::vector<std::string>& leftovers);

  private:
    void line(const std::string& text);  // with the mutex held
    void clearProgress();
    void drawProgress();

    std::mutex mutex_;
    bool json_;
    bool progress_;
    bool progressShown_ = false;
    std::map<std::string, std::string> progressByDevice_;
};

// A host or module status in words, for people.
std::string statusText(int32_t status);

}  // namespace usbapp
