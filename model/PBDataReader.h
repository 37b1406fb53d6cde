// SPDX-License-Identifier: MIT
// A cursor over one encoded message: the bytes, the read position, the limit at
// which the current (sub-)message ends, and a sticky error flag. The read
// functions of the messages work on this state directly.
//
// Invariant kept by every operation: position() <= limit() <= length(), so
// remaining() never wraps and no read touches a byte at or past the limit.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>

#include "model/Wire.h"

namespace kolvrand {

namespace detail {
struct FieldDescriptor;
}

// Told what the reader and the read functions meet, in the order they meet
// it, when one is set on the reader (rcmodel's wire check watches the
// daemon's own reading this way). Positions are offsets into the reader's
// bytes.
class WireObserver {
 public:
  virtual ~WireObserver() = default;
  // A message's fields begin and end; sub-messages nest.
  virtual void beginMessage() = 0;
  virtual void endMessage() = 0;
  // A tag of `size` bytes at `at`.
  virtual void tag(size_t at, uint64_t tag, size_t size) = 0;
  // A varint at `at` whose tenth byte still continues, read as 0.
  virtual void overLongVarint(size_t at) = 0;
  // The tag last told is an end-group tag that ends the message, `after`
  // bytes before the end of its run.
  virtual void endGroup(size_t after) = 0;
  // The tag last told names a known field.
  virtual void field(const detail::FieldDescriptor& field, uint8_t wireType) = 0;
  // The tag last told has a wire type that does not exist (6 or 7).
  virtual void noSuchWireType(uint8_t wireType) = 0;
};

// The limit that was in force before a length-delimited run was entered.
struct PBDataReaderMark {
  size_t limit = 0;
};

class PBDataReader {
 public:
  // Reads the `length` bytes at `data`, which must stay valid while the reader
  // is used. A null `data` reads as empty.
  PBDataReader(const uint8_t* data, size_t length) noexcept
      : bytes_(data), limit_(data ? length : 0), length_(data ? length : 0) {}

  const uint8_t* bytes() const { return bytes_; }
  size_t length() const { return length_; }
  size_t position() const { return pos_; }
  size_t limit() const { return limit_; }
  size_t remaining() const { return limit_ - pos_; }
  bool isAtEnd() const { return pos_ >= limit_; }
  bool hasError() const { return error_; }
  void setError() { error_ = true; }

  WireObserver* observer() const { return observer_; }
  void setObserver(WireObserver* observer) { observer_ = observer; }

  const uint8_t* cursor() const { return bytes_ + pos_; }
  // Requires n <= remaining().
  void advance(size_t n) { pos_ += n; }

  // A varint (wire::readVarint). Running into the limit sets the error flag
  // and yields 0. A 10th byte that still has its top bit set yields 0 without
  // an error; the 10 bytes are consumed.
  uint64_t readVarint() {
    // One and two bytes inline: every tag of the model and most lengths.
    if (remaining() >= 2) {
      const uint8_t b0 = bytes_[pos_];
      if (b0 < 0x80) {
        pos_ += 1;
        return b0;
      }
      const uint8_t b1 = bytes_[pos_ + 1];
      if (b1 < 0x80) {
        pos_ += 2;
        return (b0 & 0x7fu) | (uint64_t{b1} << 7);
      }
    }
    return readLongerVarint();
  }

  // Room for the floats of the lists being decoded. Every list decoded from
  // this reader draws on one array: each float takes at least four input
  // bytes, so an array of a quarter of the bytes left at the first request
  // holds them all, and the lists of a whole model cost one allocation.
  // `keepAlive` is the drawing message's reference to that array, set at its
  // first claim; a message that already holds another array draws nothing
  // (nullptr) and allocates for itself.
  //
  // The free part of the array, *available floats long, which a list may
  // fill before it claims what it used with claimFloats.
  float* floatRoom(const std::shared_ptr<float[]>& keepAlive, size_t* available) {
    if (!floats_) makeFloats();
    if (!floats_ || (keepAlive && keepAlive.get() != floats_.get())) {
      *available = 0;
      return nullptr;
    }
    *available = floatsSize_ - floatsUsed_;
    return floats_.get() + floatsUsed_;
  }
  // Claims the first `count` floats of floatRoom; requires count <= available.
  void claimFloats(size_t count, std::shared_ptr<float[]>& keepAlive) {
    if (!keepAlive) keepAlive = floats_;
    floatsUsed_ += count;
  }
  // Room for exactly `count` floats, or nullptr.
  float* takeFloats(size_t count, std::shared_ptr<float[]>& keepAlive) {
    size_t available;
    float* room = floatRoom(keepAlive, &available);
    if (!room || count == 0 || count > available) return nullptr;
    claimFloats(count, keepAlive);
    return room;
  }

  // Four little-endian bytes as an IEEE single. With fewer than four bytes
  // before the limit: sets the error flag, yields 0.0, does not move.
  float readFloat() {
    if (remaining() < 4) {
      error_ = true;
      return 0.0f;
    }
    const float value = wire::loadFloat(cursor());
    pos_ += 4;
    return value;
  }

 private:
  uint64_t readLongerVarint();
  void makeFloats();

  friend bool PBReaderPlaceMark(PBDataReader& reader, PBDataReaderMark& mark);
  friend void PBReaderRecallMark(PBDataReader& reader, const PBDataReaderMark& mark);

  const uint8_t* bytes_;
  size_t pos_ = 0;
  size_t limit_;
  size_t length_;
  bool error_ = false;
  WireObserver* observer_ = nullptr;
  std::shared_ptr<float[]> floats_;  // made at the first takeFloats
  size_t floatsUsed_ = 0;
  size_t floatsSize_ = 0;
};

// Reads a length varint and narrows the limit to the run of that many bytes
// that follows it, saving the old limit in `mark`. Fails (returns false, limit
// unchanged) when the length is cut short by the limit (error flag set) or when
// the run would reach past the limit. An over-long length varint reads as 0, as
// every varint does.
inline bool PBReaderPlaceMark(PBDataReader& reader, PBDataReaderMark& mark) {
  const uint64_t length = reader.readVarint();
  if (reader.error_ || length > reader.remaining()) return false;
  mark.limit = reader.limit_;
  reader.limit_ = reader.pos_ + static_cast<size_t>(length);
  return true;
}

// Restores the limit saved by PBReaderPlaceMark on the same reader. The
// position stays where the run's reading left it.
inline void PBReaderRecallMark(PBDataReader& reader, const PBDataReaderMark& mark) {
  reader.limit_ = mark.limit;
}

inline constexpr size_t kMaxGroupDepth = 64;

// Skips one value of `wireType` (varint, fixed64, length-delimited, a whole
// group up to its matching end tag, or fixed32) for field `fieldNumber`.
// Returns false for wire types 6 and 7, an end-group tag with no group open or
// for another field, groups nested more than kMaxGroupDepth deep, and data cut
// short by the limit (which also sets the error flag).
bool PBReaderSkipValueWithTag(PBDataReader& reader, uint32_t fieldNumber, uint8_t wireType);

}  // namespace kolvrand
