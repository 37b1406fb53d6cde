// SPDX-License-Identifier: MIT
// The stored values of a message: one array per kind of field, indexed by the
// slots of its field table, and the has-bit record.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <memory>

#include "model/PBRepeatedFloat.h"

namespace kolvrand {

class PBCodable;

namespace detail {

// What the engine works on: the arrays of one message.
struct MutableFields {
  std::shared_ptr<PBCodable>* subs;
  PBRepeatedFloat* lists;
  float* floats;
  uint32_t* ints;  // unsigned values, and signed ones as their bit pattern
  uint32_t* has;
  // The array the decoder lent room in to this message's lists, kept alive
  // as long as the message (see PBDataReader::takeFloats).
  std::shared_ptr<float[]>* lentFloats = nullptr;
};

struct ConstFields {
  const std::shared_ptr<PBCodable>* subs;
  const PBRepeatedFloat* lists;
  const float* floats;
  const uint32_t* ints;
  uint32_t has;
};

template <size_t NSub, size_t NList, size_t NFloat, size_t NInt>
struct FieldStorage {
  // Declared before the lists, so that it outlives them.
  std::shared_ptr<float[]> lentFloats;
  std::array<std::shared_ptr<PBCodable>, NSub> subs{};
  std::array<PBRepeatedFloat, NList> lists{};
  std::array<float, NFloat> floats{};
  std::array<uint32_t, NInt> ints{};
  uint32_t has = 0;

  MutableFields view() {
    return {subs.data(), lists.data(), floats.data(), ints.data(), &has, &lentFloats};
  }
  ConstFields view() const { return {subs.data(), lists.data(), floats.data(), ints.data(), has}; }

  bool hasBit(unsigned bit) const { return (has >> bit) & 1u; }
  void setHasBit(unsigned bit, bool value) {
    has = value ? has | (uint32_t{1} << bit) : has & ~(uint32_t{1} << bit);
  }
};

}  // namespace detail
}  // namespace kolvrand
