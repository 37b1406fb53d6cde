#include "model/PBRepeatedFloat.h"

#include <algorithm>
#include <bit>
#include <cstring>

#include "model/NSRangeException.h"
#include "model/Wire.h"

namespace kolvrand {

void PBRepeatedFloat::throwOutOfRange(size_t index, size_t count) {
  throw NSRangeException(index, count);
}

void PBRepeatedFloat::assign(const float* values, size_t count) {
  // A fresh vector, so `values` may point into the one it replaces.
  if (!values) count = 0;
  std::vector<float>(values, values + count).swap(values_);
}

void PBRepeatedFloat::append(const PBRepeatedFloat& other) {
  const size_t n = other.values_.size();
  const size_t old = values_.size();
  // After the resize other.values_ still starts with its n original elements
  // even when it is values_, and [0, n) does not overlap [old, old + n).
  values_.resize(old + n);
  std::copy_n(other.values_.data(), n, values_.data() + old);
}

void PBRepeatedFloat::appendLittleEndian(const uint8_t* bytes, size_t count) {
  const size_t old = values_.size();
  values_.resize(old + count);
  float* out = values_.data() + old;
  if constexpr (std::endian::native == std::endian::little) {
    if (count) std::memcpy(out, bytes, count * sizeof(float));
  } else {
    for (size_t i = 0; i < count; ++i) out[i] = wire::loadFloat(bytes + 4 * i);
  }
}

void PBRepeatedFloat::appendStrided(const uint8_t* bytes, size_t count, size_t stride) {
  const size_t old = values_.size();
  values_.resize(old + count);
  float* out = values_.data() + old;
  for (size_t i = 0; i < count; ++i) out[i] = wire::loadFloat(bytes + i * stride);
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
