// The file stand-in's controls.
#pragma once

namespace sim::kernel {

class FileSystem {
public:
    void reset();
};

FileSystem& files();

}  // namespace sim::kernel
