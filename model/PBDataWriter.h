// SPDX-License-Identifier: MIT
// Appends an encoded message to an owned byte buffer.
#pragma once

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <vector>

#include "model/Wire.h"

namespace kolvrand {

class PBCodable;

class PBDataWriter {
 public:
  const std::vector<uint8_t>& data() const { return buffer_; }
  // Hands over the bytes written so far; the writer is empty afterwards.
  std::vector<uint8_t> takeData() {
    std::vector<uint8_t> out;
    out.swap(buffer_);
    return out;
  }
  size_t size() const { return buffer_.size(); }

  // Makes room for `n` more bytes, growing geometrically so that a run of
  // reservations stays linear.
  void reserve(size_t n) {
    const size_t need = buffer_.size() + n;
    if (need > buffer_.capacity()) buffer_.reserve(std::max(need, 2 * buffer_.capacity()));
  }

  // Appends `n` bytes and returns where they start, for the caller to fill
  // before the next write.
  uint8_t* append(size_t n) {
    const size_t old = buffer_.size();
    buffer_.resize(old + n);
    return buffer_.data() + old;
  }

  void writeBytes(const uint8_t* bytes, size_t n) {
    buffer_.insert(buffer_.end(), bytes, bytes + n);
  }
  void writeVarint(uint64_t value) {
    uint8_t encoded[wire::kMaxVarintSize];
    writeBytes(encoded, wire::encodeVarint(encoded, value));
  }
  void writeTag(uint32_t fieldNumber, wire::WireType type) {
    writeVarint(wire::makeTag(fieldNumber, type));
  }
  void writeFloat(float value) { wire::storeFloat(append(4), value); }

 private:
  std::vector<uint8_t> buffer_;
};

// Tag (wire type 5) and the 4-byte little-endian float.
void PBDataWriterWriteFloatField(PBDataWriter& writer, float value, uint32_t fieldNumber);
// Tag (wire type 0) and the value sign-extended to 64 bits as a varint.
void PBDataWriterWriteInt32Field(PBDataWriter& writer, int32_t value, uint32_t fieldNumber);
// Tag (wire type 0) and the value as a varint.
void PBDataWriterWriteUint32Field(PBDataWriter& writer, uint32_t value, uint32_t fieldNumber);
// Tag (wire type 2), the message's encoded length, then the message.
void PBDataWriterWriteSubmessage(PBDataWriter& writer, const PBCodable& message,
                                 uint32_t fieldNumber);

}  // namespace kolvrand
