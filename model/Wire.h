// SPDX-License-Identifier: MIT
// Encoding helpers shared by the reader, the writer and the field tables.
#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>

namespace kolvrand::wire {

enum WireType : uint8_t {
  kVarint = 0,
  kFixed64 = 1,
  kLengthDelimited = 2,
  kStartGroup = 3,
  kEndGroup = 4,
  kFixed32 = 5,
};

inline constexpr size_t kMaxVarintSize = 10;

// What reading one varint found.
enum class VarintStatus : uint8_t {
  Ok,
  CutShort,  // the bytes ended before a byte with a clear top bit
  OverLong,  // the tenth byte still has its top bit set
};

struct Varint {
  uint64_t value;  // 0 unless Ok
  size_t size;     // the bytes taken: all there were when cut short, ten when over-long
  VarintStatus status;
};

// The base-128 varint, least significant group first, at `p`, before which
// `available` bytes remain; at most kMaxVarintSize bytes are read. Every
// reader of the wire format reads its varints with this, and decides itself
// what a cut-short or over-long one means.
constexpr Varint readVarint(const uint8_t* p, size_t available) {
  const size_t n = available < kMaxVarintSize ? available : kMaxVarintSize;
  uint64_t value = 0;
  for (size_t i = 0; i < n; ++i) {
    value |= uint64_t{p[i] & 0x7fu} << (7 * i);
    if (p[i] < 0x80) return {value, i + 1, VarintStatus::Ok};
  }
  if (n < kMaxVarintSize) return {0, n, VarintStatus::CutShort};
  return {0, kMaxVarintSize, VarintStatus::OverLong};
}

constexpr size_t varintSize(uint64_t value) {
  size_t n = 1;
  for (; value >= 0x80; value >>= 7) ++n;
  return n;
}

// Writes `value` as a base-128 varint at `out`, which must have room for
// varintSize(value) bytes; returns the number of bytes written.
constexpr size_t encodeVarint(uint8_t* out, uint64_t value) {
  size_t n = 0;
  for (; value >= 0x80; value >>= 7) out[n++] = static_cast<uint8_t>(value | 0x80);
  out[n++] = static_cast<uint8_t>(value);
  return n;
}

constexpr uint64_t makeTag(uint32_t fieldNumber, WireType type) {
  return (uint64_t{fieldNumber} << 3) | type;
}

// An int32 goes on the wire sign-extended to 64 bits, so -1 takes ten bytes.
constexpr uint64_t int32AsVarint(int32_t value) {
  return static_cast<uint64_t>(static_cast<int64_t>(value));
}

// Four little-endian bytes at `p` as an IEEE single. Requires 4 readable bytes.
inline float loadFloat(const uint8_t* p) {
  uint32_t bits;
  std::memcpy(&bits, p, sizeof bits);
  if constexpr (std::endian::native == std::endian::big) bits = __builtin_bswap32(bits);
  return std::bit_cast<float>(bits);
}

// Requires 4 writable bytes at `p`.
inline void storeFloat(uint8_t* p, float value) {
  uint32_t bits = std::bit_cast<uint32_t>(value);
  if constexpr (std::endian::native == std::endian::big) bits = __builtin_bswap32(bits);
  std::memcpy(p, &bits, sizeof bits);
}

// `count` floats stored little-endian at `p`, which must have room for
// 4 * count bytes.
inline void storeFloats(uint8_t* p, const float* values, size_t count) {
  if constexpr (std::endian::native == std::endian::little) {
    if (count) std::memcpy(p, values, count * sizeof(float));
  } else {
    for (size_t i = 0; i < count; ++i) storeFloat(p + 4 * i, values[i]);
  }
}

}  // namespace kolvrand::wire
