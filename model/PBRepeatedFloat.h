// SPDX-License-Identifier: MIT
// The storage of a repeated float field: a growable array of floats, held as
// element array, count and capacity. The array is the list's own, or room
// that a decoder lent it inside an array its message keeps alive (see
// PBDataReader::takeFloats); the list moves to an array of its own as soon
// as it must grow, and a copy or a move always gets one.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>

#include "base/Value.h"

namespace kolvrand {

class PBRepeatedFloat {
 public:
  PBRepeatedFloat() = default;
  PBRepeatedFloat(const PBRepeatedFloat& other) { assign(other.elements(), other.size()); }
  PBRepeatedFloat& operator=(const PBRepeatedFloat& other) {
    assign(other.elements(), other.size());
    return *this;
  }
  PBRepeatedFloat(PBRepeatedFloat&& other) { *this = std::move(other); }
  PBRepeatedFloat& operator=(PBRepeatedFloat&& other) {
    if (&other == this) return *this;
    if (!other.owned_ && other.values_) {
      // Lent room stays with the message it was lent to.
      assign(other.values_, other.size_);
    } else {
      owned_ = std::move(other.owned_);
      values_ = other.values_;
      size_ = other.size_;
      capacity_ = other.capacity_;
    }
    other.clear();
    return *this;
  }

  size_t size() const { return size_; }
  bool empty() const { return size_ == 0; }
  size_t capacity() const { return capacity_; }

  // The live elements, or nullptr when the list is empty. Valid until the
  // list next changes.
  const float* elements() const { return size_ ? values_ : nullptr; }

  // Element `index`; throws NSRangeException when index >= size().
  float at(size_t index) const {
    if (index >= size_) throwOutOfRange(index, size_);
    return values_[index];
  }

  void add(float value) {
    if (size_ == capacity_) grow(1);
    values_[size_++] = value;
  }

  // Frees the array (lent room is merely let go).
  void clear() {
    owned_.reset();
    values_ = nullptr;
    size_ = capacity_ = 0;
  }

  // Takes `capacity` floats at `storage`, which must outlive the list's use
  // of them, as the array of this list, which must have no array yet.
  void lend(float* storage, size_t capacity) {
    values_ = storage;
    capacity_ = capacity;
  }

  // Replaces the contents with a copy of `count` floats at `values` (which
  // may lie inside this list). A null `values` gives an empty list.
  void assign(const float* values, size_t count);

  // Appends the elements of `other`, which may be this list.
  void append(const PBRepeatedFloat& other);

  // Grows the list by `count` elements whose values the caller writes at the
  // returned address before the list is next used. A list that must grow gets
  // exactly the room it needs when it is empty, else at least twice its
  // capacity, so that a list filled piece by piece is copied O(log n) times.
  float* appendUninitialized(size_t count) {
    if (count > capacity_ - size_) grow(count);
    float* out = values_ + size_;
    size_ += count;
    return out;
  }

 private:
  [[noreturn]] static void throwOutOfRange(size_t index, size_t count);
  // Makes room for `more` elements beyond size().
  void grow(size_t more);

  std::unique_ptr<float[]> owned_;  // the array when it is the list's own
  float* values_ = nullptr;
  size_t size_ = 0;
  size_t capacity_ = 0;
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
