// The storage of a repeated float field: an owned, growable array of floats.
#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

#include "platform/Value.h"

namespace kolvrand {

class PBRepeatedFloat {
 public:
  size_t size() const { return values_.size(); }
  bool empty() const { return values_.empty(); }

  // The live elements, or nullptr when the list is empty. Valid until the
  // list next changes.
  const float* elements() const { return values_.empty() ? nullptr : values_.data(); }

  // Element `index`; throws NSRangeException when index >= size().
  float at(size_t index) const {
    if (index >= values_.size()) throwOutOfRange(index, values_.size());
    return values_[index];
  }

  void add(float value) { values_.push_back(value); }

  // Frees the array.
  void clear() { std::vector<float>().swap(values_); }

  // Replaces the contents with a copy of `count` floats at `values` (which
  // may lie inside this list). A null `values` gives an empty list.
  void assign(const float* values, size_t count);

  // Appends the elements of `other`, which may be this list.
  void append(const PBRepeatedFloat& other);

  // Appends `count` floats stored little-endian at `bytes`, which must hold
  // 4 * count readable bytes.
  void appendLittleEndian(const uint8_t* bytes, size_t count);

  // Appends `count` little-endian floats, the i-th at bytes + i * stride;
  // requires those 4-byte spans to be readable.
  void appendStrided(const uint8_t* bytes, size_t count, size_t stride);

 private:
  [[noreturn]] static void throwOutOfRange(size_t index, size_t count);

  std::vector<float> values_;
};

// The list operations the message classes are written against.
inline void PBRepeatedFloatAdd(PBRepeatedFloat& list, float value) {
  list.add(value);
}
inline void PBRepeatedFloatClear(PBRepeatedFloat& list) {
  list.clear();
}
inline void PBRepeatedFloatSet(PBRepeatedFloat& list, const float* values, size_t count) {
  list.assign(values, count);
}
inline void PBRepeatedFloatCopy(PBRepeatedFloat& destination, const PBRepeatedFloat& source) {
  destination.assign(source.elements(), source.size());
}

// Same count and every pair of elements equal as floats: NaN never equals
// itself, 0.0 equals -0.0.
bool PBRepeatedFloatIsEqual(const PBRepeatedFloat& a, const PBRepeatedFloat& b);

// Consistent with PBRepeatedFloatIsEqual; 0 for every empty list.
uint64_t PBRepeatedFloatHash(const PBRepeatedFloat& list);

// One 32-bit float number per element, in order.
Array PBRepeatedFloatNSArray(const PBRepeatedFloat& list);

}  // namespace kolvrand
