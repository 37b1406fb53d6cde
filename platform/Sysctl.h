// SPDX-License-Identifier: MIT
// Kernel variables in the manner of sysctlbyname, with its two-call protocol:
// a size query (oldp null) sets *oldlenp to the value's size; a second call
// with a buffer of at least that size copies the value and sets *oldlenp to
// the bytes copied.
#pragma once

#include <cstddef>
#include <memory>

namespace kolvrand {

// Returns 0 on success and -1 on failure with errno set: ENOENT for an unknown
// name, ENOMEM when the buffer is too small, EPERM for any attempt to write
// (newp non-null), EINVAL when oldlenp is null.
int sysctlbyname(const char* name, void* oldp, size_t* oldlenp, const void* newp, size_t newlen);

// The longest string value the daemon reads from a kernel variable; the ones
// it reads (a UUID, a target type) are a few dozen bytes.
inline constexpr size_t kMaxKernelStringSize = 64 * 1024;

// A zeroed buffer for a string value of `size` bytes as the size query
// reported it, one byte longer so that bytes without a NUL still end; nullptr
// for a size above kMaxKernelStringSize or memory that cannot be had, never
// an exception.
std::unique_ptr<char[]> allocateKernelStringBuffer(size_t size);

}  // namespace kolvrand
