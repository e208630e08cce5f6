#include "progress.h"

namespace lab {

void Progress::show(const std::string& line)
{
    if (line == shown_) return;
    std::fprintf(out_, "\r\033[K%s", line.c_str());
    std::fflush(out_);
    shown_ = line;
}

void Progress::clear()
{
    if (shown_.empty()) return;
    std::fprintf(out_, "\r\033[K");
    std::fflush(out_);
    shown_.clear();
}

}  // namespace lab
