// SPDX-License-Identifier: MIT
// Counts every heap allocation of the process: the malloc family is replaced
// in this binary (forwarding to glibc's allocator), so operator new, the C
// library and every other library are all seen.
#pragma once

#include <cstdint>

namespace kolvrand::bench {

struct AllocationCount {
  uint64_t calls = 0;  // malloc, calloc, realloc, aligned allocations
  uint64_t bytes = 0;  // bytes requested by those calls

  AllocationCount operator-(const AllocationCount& earlier) const {
    return {calls - earlier.calls, bytes - earlier.bytes};
  }
  AllocationCount operator+(const AllocationCount& other) const {
    return {calls + other.calls, bytes + other.bytes};
  }
};

// Counts the allocations of every thread while it lives. Outside such a scope
// an allocation costs one test of a flag more than glibc's own, so timed
// loops run with counting off and count in a separate call.
class CountAllocations {
 public:
  CountAllocations();
  ~CountAllocations();
  CountAllocations(const CountAllocations&) = delete;
  CountAllocations& operator=(const CountAllocations&) = delete;

  // What was allocated since the scope began.
  AllocationCount count() const;

 private:
  AllocationCount start_;
};

// False when the allocator could not be replaced (sanitizer builds bring their
// own): nothing is counted then.
bool allocationCountEnabled();

}  // namespace kolvrand::bench
