// SPDX-License-Identifier: MIT
#include "model/PBDataReader.h"

namespace kolvrand {

uint64_t PBDataReader::readLongerVarint() {
  const wire::Varint v = wire::readVarint(cursor(), remaining());
  if (v.status == wire::VarintStatus::CutShort) error_ = true;
  if (v.status == wire::VarintStatus::OverLong && observer_) observer_->overLongVarint(pos_);
  pos_ += v.size;
  return v.value;
}

void PBDataReader::makeFloats() {
  const size_t bound = (length_ - pos_) / 4;
  if (bound == 0) return;
  // Not zeroed: a list writes every element before it counts it.
  floats_ = std::make_shared_for_overwrite<float[]>(bound);
  floatsSize_ = bound;
}

}  // namespace kolvrand
