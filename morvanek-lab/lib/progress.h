// A progress display for long runs, on standard error when it is a terminal:
// one line redrawn in place, or, where TERM is "dumb", plain lines with no
// control sequences. Nothing is drawn before a run has lasted long enough to
// need it, nor redrawn faster than a person can read.
#pragma once

#include <chrono>
#include <cstdio>
#include <functional>
#include <string>

namespace lab {

class Progress {
public:
    enum class Style { redraw, lines };
    using Clock = std::function<std::chrono::steady_clock::time_point()>;

    static constexpr std::chrono::milliseconds kRedrawInterval{250};
    static constexpr std::chrono::milliseconds kLineInterval{2000};

    Progress(std::FILE* out, Style style, Clock clock = std::chrono::steady_clock::now);
    // The style a terminal of this TERM wants; null means unset.
    static Style styleFor(const char* term);

    // Whether show() would draw now; callers skip building the line otherwise.
    bool due() const;
    void show(const std::string& line);
    // Removes a redrawn line; plain lines stay. The next show() waits again.
    void clear();

private:
    std::chrono::milliseconds interval() const;

    std::FILE* out_;
    Style style_;
    Clock clock_;
    std::chrono::steady_clock::time_point started_{};  // the first show() since the last clear()
    std::chrono::steady_clock::time_point drawn_{};
    bool active_ = false;
    std::string shown_;
};

}  // namespace lab
