// The host's status convention: negative is failure, the first failure wins.
#pragma once

#include <stdint.h>

#if defined(_WIN32)
typedef long tStatus;
#else
typedef int32_t tStatus;
#endif

static_assert(sizeof(tStatus) == 4, "the status is a signed 32-bit value");

// Sets the status to a failure unless an earlier failure already stands.
inline void setFailure(tStatus& status, tStatus failure)
{
    if (status >= 0) status = failure;
}
