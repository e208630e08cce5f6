#include "progress.h"

#include <cstring>

namespace lab {

Progress::Progress(std::FILE* out, Style style, Clock clock) : out_(out), style_(style), clock_(std::move(clock)) {}

Progress::Style Progress::styleFor(const char* term)
{
    return term != nullptr && std::strcmp(term, "dumb") == 0 ? Style::lines : Style::redraw;
}

std::chrono::milliseconds Progress::interval() const
{
    return style_ == Style::lines ? kLineInterval : kRedrawInterval;
}

bool Progress::due() const
{
    if (!active_) return true;  // the first call only starts the clock
    auto now = clock_();
    // A short run shows nothing at all: the first line waits one interval too.
    return now - started_ >= interval() && (shown_.empty() || now - drawn_ >= interval());
}

void Progress::show(const std::string& line)
{
    if (!active_) {
        active_ = true;
        started_ = clock_();
        return;
    }
    if (!due() || line == shown_) return;
    if (style_ == Style::lines) {
        std::fprintf(out_, "%s\n", line.c_str());
    } else {
        std::fprintf(out_, "\r\033[K%s", line.c_str());
    }
    std::fflush(out_);
    shown_ = line;
    drawn_ = clock_();
}

void Progress::clear()
{
    if (!shown_.empty() && style_ == Style::redraw) {
        std::fprintf(out_, "\r\033[K");
        std::fflush(out_);
    }
    shown_.clear();
    active_ = false;
}

}  // namespace lab
