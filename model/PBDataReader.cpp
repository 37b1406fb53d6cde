// SPDX-License-Identifier: MIT
#include "model/PBDataReader.h"

namespace kolvrand {

uint64_t PBDataReader::readVarintUnchecked() {
  const uint8_t* p = cursor();
  uint64_t value = 0;
  for (size_t i = 0; i < wire::kMaxVarintSize; ++i) {
    value |= uint64_t{p[i] & 0x7fu} << (7 * i);
    if (p[i] < 0x80) {
      pos_ += i + 1;
      return value;
    }
  }
  pos_ += wire::kMaxVarintSize;
  return 0;
}

uint64_t PBDataReader::readVarintChecked() {
  uint64_t value = 0;
  for (size_t i = 0; i < wire::kMaxVarintSize; ++i) {
    if (pos_ >= limit_) {
      error_ = true;
      return 0;
    }
    const uint8_t b = bytes_[pos_++];
    value |= uint64_t{b & 0x7fu} << (7 * i);
    if (b < 0x80) return value;
  }
  return 0;
}

void PBDataReader::makeFloats() {
  const size_t bound = (length_ - pos_) / 4;
  if (bound == 0) return;
  // Not zeroed: a list writes every element before it counts it.
  floats_ = std::make_shared_for_overwrite<float[]>(bound);
  floatsSize_ = bound;
}

}  // namespace kolvrand
