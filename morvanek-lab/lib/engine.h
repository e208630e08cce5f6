// Which build of the module a run loads: the Linux module against the kernel
// stand-in, the real morvanek.sys under Wine against Wine's kernel, or both,
// one after the other, with their reports compared.
#pragma once

namespace lab {

enum class Engine { linuxModule, windowsDriver, both };

}  // namespace lab
