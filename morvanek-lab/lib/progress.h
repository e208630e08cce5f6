// A one-line progress display for long updates, on a terminal only.
#pragma once

#include <cstdio>
#include <string>

namespace lab {

class Progress {
public:
    explicit Progress(std::FILE* out) : out_(out) {}
    void show(const std::string& line);
    void clear();

private:
    std::FILE* out_;
    std::string shown_;
};

}  // namespace lab
