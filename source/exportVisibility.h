// Marks the module's exported functions. On Windows the driver's .def file
// names the exports; on Linux the names must be visible for the version
// script to export them.
#pragma once

#if defined(_WIN32)
#define MODULE_EXPORT
#else
#define MODULE_EXPORT __attribute__((visibility("default")))
#endif
