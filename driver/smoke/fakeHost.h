// Shared inside the test karvelk.sys: its one state record and its formatter.
#pragma once

#include <stdarg.h>
#include <stddef.h>
#include <stdint.h>

#include "fakeHostProbe.h"

FakeHostState& fakeHost();

// printf-style into a buffer of `capacity` bytes, always NUL-terminated:
// %d %i %u %x %X %c %s %% with an optional 0 flag and width. Enough for the
// lines the module writes; anything else is copied as written.
void formatText(char* out, size_t capacity, const char* format, va_list arguments);
// The same, taking the arguments directly.
void formatInto(char* out, size_t capacity, const char* format, ...);
