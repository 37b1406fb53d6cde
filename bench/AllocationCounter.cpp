// SPDX-License-Identifier: MIT
// The allocator of the benchmark binary: glibc's, behind counters. Defining
// the malloc family in the executable replaces it for every library (glibc
// documents this as replacing malloc); __libc_* are glibc's own entry points.
#include "bench/AllocationCounter.h"

#include <atomic>
#include <cerrno>
#include <cstddef>

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
#define KOLVRAND_BENCH_COUNT_ALLOCATIONS 0
#else
#define KOLVRAND_BENCH_COUNT_ALLOCATIONS 1
#endif

namespace kolvrand::bench {

namespace {
std::atomic<int> gCounting{0};
std::atomic<uint64_t> gCalls{0};
std::atomic<uint64_t> gBytes{0};

AllocationCount totals() {
  return {gCalls.load(std::memory_order_relaxed), gBytes.load(std::memory_order_relaxed)};
}
}  // namespace

CountAllocations::CountAllocations() : start_(totals()) {
  gCounting.fetch_add(1, std::memory_order_relaxed);
}

CountAllocations::~CountAllocations() {
  gCounting.fetch_sub(1, std::memory_order_relaxed);
}

AllocationCount CountAllocations::count() const {
  return totals() - start_;
}

bool allocationCountEnabled() {
  return KOLVRAND_BENCH_COUNT_ALLOCATIONS;
}

}  // namespace kolvrand::bench

#if KOLVRAND_BENCH_COUNT_ALLOCATIONS

extern "C" {
void* __libc_malloc(size_t);
void* __libc_calloc(size_t, size_t);
void* __libc_realloc(void*, size_t);
void* __libc_memalign(size_t, size_t);
void __libc_free(void*);
}

namespace {

inline void count(size_t bytes) {
  if (__builtin_expect(kolvrand::bench::gCounting.load(std::memory_order_relaxed) == 0, 1)) return;
  kolvrand::bench::gCalls.fetch_add(1, std::memory_order_relaxed);
  kolvrand::bench::gBytes.fetch_add(bytes, std::memory_order_relaxed);
}

}  // namespace

extern "C" {

void* malloc(size_t size) {
  count(size);
  return __libc_malloc(size);
}

void* calloc(size_t n, size_t size) {
  count(n * size);
  return __libc_calloc(n, size);
}

void* realloc(void* p, size_t size) {
  count(size);
  return __libc_realloc(p, size);
}

void free(void* p) {
  __libc_free(p);
}

void* memalign(size_t alignment, size_t size) {
  count(size);
  return __libc_memalign(alignment, size);
}

void* aligned_alloc(size_t alignment, size_t size) {
  count(size);
  return __libc_memalign(alignment, size);
}

int posix_memalign(void** out, size_t alignment, size_t size) {
  if (alignment % sizeof(void*) != 0 || (alignment & (alignment - 1)) != 0) return EINVAL;
  count(size);
  void* p = __libc_memalign(alignment, size);
  if (!p) return ENOMEM;
  *out = p;
  return 0;
}

}  // extern "C"

#endif
