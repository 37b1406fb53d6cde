// Kernel variables in the manner of sysctlbyname, with its two-call protocol:
// a size query (oldp null) sets *oldlenp to the value's size; a second call
// with a buffer of at least that size copies the value and sets *oldlenp to
// the bytes copied.
#pragma once

#include <cstddef>

namespace kolvrand {

// Returns 0 on success and -1 on failure with errno set: ENOENT for an unknown
// name, ENOMEM when the buffer is too small, EPERM for any attempt to write
// (newp non-null), EINVAL when oldlenp is null.
int sysctlbyname(const char* name, void* oldp, size_t* oldlenp, const void* newp, size_t newlen);

}  // namespace kolvrand
