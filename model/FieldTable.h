// SPDX-License-Identifier: MIT
// Field descriptors: one row per field of a message class, giving its number,
// kind, storage slot, presence bit and dictionary key. A message's table is
// the single description of its fields that every message operation walks.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "model/Wire.h"

namespace kolvrand {

class PBCodable;

namespace detail {

enum class FieldKind : uint8_t {
  SubMessage,     // shared reference, present when set
  RepeatedFloat,  // owned list, present when non-empty
  Uint32,         // always present, no has-bit
  OptionalFloat,  // has-bit
  OptionalEnum,   // signed 32-bit with a has-bit; its getter reads 0 while the bit is clear
};

struct FieldDescriptor {
  uint32_t number = 0;
  FieldKind kind = FieldKind::SubMessage;
  // Index into the storage array of the field's kind (sub-messages, lists,
  // floats, or integers, which hold both Uint32 and OptionalEnum).
  uint8_t slot = 0;
  uint8_t hasBit = 0;   // OptionalFloat, OptionalEnum
  uint8_t tagSize = 0;  // the tag as written: canonical varint of number and wire type
  std::array<uint8_t, 5> tag{};
  const char* name = "";  // the property name, which orders the has-bits
  const char* key = "";   // the dictionary key
  std::shared_ptr<PBCodable> (*makeMessage)() = nullptr;  // SubMessage: a new, empty instance
  std::string (*enumName)(int32_t) = nullptr;             // OptionalEnum: its dictionary form
  // OptionalEnum: the value a name stands for (0 for a string that names none).
  int32_t (*enumValue)(std::optional<std::string_view>) = nullptr;

  constexpr uint32_t hasMask() const { return uint32_t{1} << hasBit; }
  constexpr bool hasPresenceBit() const {
    return kind == FieldKind::OptionalFloat || kind == FieldKind::OptionalEnum;
  }
};

template <class Message>
std::shared_ptr<PBCodable> makeMessage() {
  return std::make_shared<Message>();
}

constexpr wire::WireType writtenWireType(FieldKind kind) {
  switch (kind) {
    case FieldKind::SubMessage:
      return wire::kLengthDelimited;
    case FieldKind::Uint32:
    case FieldKind::OptionalEnum:
      return wire::kVarint;
    default:
      return wire::kFixed32;
  }
}

constexpr FieldDescriptor field(uint32_t number, FieldKind kind, uint8_t slot, const char* name,
                                const char* key, uint8_t hasBit = 0) {
  FieldDescriptor d;
  d.number = number;
  d.kind = kind;
  d.slot = slot;
  d.hasBit = hasBit;
  d.name = name;
  d.key = key;
  d.tagSize = static_cast<uint8_t>(
      wire::encodeVarint(d.tag.data(), wire::makeTag(number, writtenWireType(kind))));
  return d;
}

constexpr FieldDescriptor subMessageField(uint32_t number, uint8_t slot, const char* name,
                                          const char* key, std::shared_ptr<PBCodable> (*make)()) {
  FieldDescriptor d = field(number, FieldKind::SubMessage, slot, name, key);
  d.makeMessage = make;
  return d;
}

constexpr FieldDescriptor optionalEnumField(uint32_t number, uint8_t slot, const char* name,
                                            const char* key, uint8_t hasBit,
                                            std::string (*enumName)(int32_t),
                                            int32_t (*enumValue)(std::optional<std::string_view>)) {
  FieldDescriptor d = field(number, FieldKind::OptionalEnum, slot, name, key, hasBit);
  d.enumName = enumName;
  d.enumValue = enumValue;
  return d;
}

// A table as the engine sees it.
struct MessageTable {
  const FieldDescriptor* fields;
  size_t count;
  const uint8_t* byNumber;  // field number -> row + 1, 0 for an unknown number
  uint32_t maxNumber;

  // The row of field `number`, or nullptr.
  const FieldDescriptor* find(uint32_t number) const {
    if (number > maxNumber) return nullptr;
    const uint8_t row = byNumber[number];
    return row ? &fields[row - 1] : nullptr;
  }
};

template <size_t N, uint32_t MaxNumber>
struct FieldTable {
  std::array<FieldDescriptor, N> fields{};
  std::array<uint8_t, MaxNumber + 1> byNumber{};

  constexpr MessageTable view() const { return {fields.data(), N, byNumber.data(), MaxNumber}; }
};

template <size_t N>
constexpr uint32_t maxFieldNumber(const FieldDescriptor (&fields)[N]) {
  uint32_t max = 0;
  for (const FieldDescriptor& d : fields) max = d.number > max ? d.number : max;
  return max;
}

template <uint32_t MaxNumber, size_t N>
constexpr FieldTable<N, MaxNumber> makeFieldTable(const FieldDescriptor (&fields)[N]) {
  static_assert(N < 256, "rows are indexed by one byte");
  FieldTable<N, MaxNumber> table;
  for (size_t i = 0; i < N; ++i) {
    table.fields[i] = fields[i];
    table.byNumber[fields[i].number] = static_cast<uint8_t>(i + 1);
  }
  return table;
}

constexpr bool bytewiseLess(const char* a, const char* b) {
  for (; *a && *a == *b; ++a, ++b) {
  }
  return static_cast<unsigned char>(*a) < static_cast<unsigned char>(*b);
}

// Checks, at compile time, what the engine relies on: field numbers from 1 up
// in strictly ascending order (the order every operation visits), each slot of
// each storage array used exactly once, and has-bits 0, 1, 2, ... given out in
// byte-wise order of the property names.
template <size_t N>
constexpr bool isValidFieldTable(const FieldDescriptor (&fields)[N], size_t subCount,
                                 size_t listCount, size_t floatCount, size_t intCount) {
  size_t used[4] = {};
  size_t bits = 0;
  for (size_t i = 0; i < N; ++i) {
    const FieldDescriptor& d = fields[i];
    if (d.number == 0 || (i > 0 && d.number <= fields[i - 1].number)) return false;
    if (d.number > (UINT32_MAX >> 3)) return false;
    const size_t array = d.kind == FieldKind::SubMessage      ? 0
                         : d.kind == FieldKind::RepeatedFloat ? 1
                         : d.kind == FieldKind::OptionalFloat ? 2
                                                              : 3;
    if (d.slot >= 64 || (used[array] >> d.slot) & 1) return false;
    used[array] |= size_t{1} << d.slot;
    if (!d.hasPresenceBit()) continue;
    ++bits;
    for (const FieldDescriptor& e : fields) {
      if (!e.hasPresenceBit() || &e == &d) continue;
      if ((e.hasBit < d.hasBit) != bytewiseLess(e.name, d.name)) return false;
    }
  }
  const size_t counts[4] = {subCount, listCount, floatCount, intCount};
  for (size_t a = 0; a < 4; ++a) {
    if (counts[a] >= 64 || used[a] != (size_t{1} << counts[a]) - 1) return false;
  }
  size_t bitsUsed = 0;
  for (const FieldDescriptor& d : fields) {
    if (d.hasPresenceBit()) bitsUsed |= size_t{1} << d.hasBit;
  }
  return bits < 32 && bitsUsed == (size_t{1} << bits) - 1;
}

}  // namespace detail
}  // namespace kolvrand
