// SPDX-License-Identifier: MIT
#include "model/PBRepeatedFloat.h"

#include <algorithm>
#include <bit>
#include <cstring>
#include <new>

#include "model/NSRangeException.h"
#include "model/Wire.h"

namespace kolvrand {

void PBRepeatedFloat::throwOutOfRange(size_t index, size_t count) {
  throw NSRangeException(index, count);
}

void PBRepeatedFloat::grow(size_t more) {
  constexpr size_t kMaxElements = SIZE_MAX / sizeof(float);
  if (more > kMaxElements - size_) throw std::bad_array_new_length();
  const size_t needed = size_ + more;
  const size_t doubled = capacity_ <= kMaxElements / 2 ? 2 * capacity_ : kMaxElements;
  const size_t capacity = std::max(needed, doubled);
  // Not zeroed: every element below size_ is written before it is read.
  auto values = std::make_unique_for_overwrite<float[]>(capacity);
  if (size_) std::memcpy(values.get(), values_, size_ * sizeof(float));
  owned_ = std::move(values);
  values_ = owned_.get();
  capacity_ = capacity;
}

void PBRepeatedFloat::assign(const float* values, size_t count) {
  if (!values) count = 0;
  // A fresh array, so `values` may point into the one it replaces.
  PBRepeatedFloat fresh;
  if (count) std::memcpy(fresh.appendUninitialized(count), values, count * sizeof(float));
  *this = std::move(fresh);
}

void PBRepeatedFloat::append(const PBRepeatedFloat& other) {
  const size_t n = other.size_;
  if (n == 0) return;
  if (&other == this) {
    // Growing may move the array; the first n elements are copied from
    // wherever it ends up, and [0, n) does not overlap [n, 2n).
    float* out = appendUninitialized(n);
    std::memcpy(out, values_, n * sizeof(float));
    return;
  }
  std::memcpy(appendUninitialized(n), other.values_, n * sizeof(float));
}

bool PBRepeatedFloatIsEqual(const PBRepeatedFloat& a, const PBRepeatedFloat& b) {
  if (a.size() != b.size()) return false;
  return std::equal(a.elements(), a.elements() + a.size(), b.elements());
}

uint64_t PBRepeatedFloatHash(const PBRepeatedFloat& list) {
  // FNV-1a over the elements' bits, with -0.0 folded onto 0.0 because the two
  // compare equal.
  if (list.empty()) return 0;
  uint64_t h = 0xcbf29ce484222325u;
  for (const float *p = list.elements(), *end = p + list.size(); p != end; ++p) {
    h ^= *p == 0.0f ? 0u : std::bit_cast<uint32_t>(*p);
    h *= 0x100000001b3u;
  }
  return h;
}

Array PBRepeatedFloatNSArray(const PBRepeatedFloat& list) {
  Array array;
  array.reserve(list.size());
  for (size_t i = 0; i < list.size(); ++i)
    array.emplace_back(Number::fromFloat(list.elements()[i]));
  return array;
}

}  // namespace kolvrand
