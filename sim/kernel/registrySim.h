// The registry stand-in's controls.
#pragma once

namespace sim::kernel {

class Registry {
public:
    void reset();
};

Registry& registry();

}  // namespace sim::kernel
