// Helpers of the model tests: byte strings written and compared as hex text (so
// a failing test shows the bytes it got), decoding, and lists as vectors.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "model/PBCodable.h"

namespace kolvrand::test {

// "90 01 0a" -> {0x90, 0x01, 0x0a}; spaces are ignored.
inline std::vector<uint8_t> fromHex(std::string_view hex) {
  std::vector<uint8_t> out;
  int high = -1;
  for (char c : hex) {
    if (c == ' ') continue;
    const int v = c <= '9' ? c - '0' : (c | 0x20) - 'a' + 10;
    if (high < 0) {
      high = v;
    } else {
      out.push_back(static_cast<uint8_t>(high << 4 | v));
      high = -1;
    }
  }
  return out;
}

inline std::string toHex(const std::vector<uint8_t>& bytes) {
  static const char* digits = "0123456789ABCDEF";
  std::string out;
  for (uint8_t b : bytes) {
    if (!out.empty()) out += ' ';
    out += digits[b >> 4];
    out += digits[b & 15];
  }
  return out;
}

inline std::vector<float> list(const float* elements, size_t count) {
  if (!elements) return {};
  return std::vector<float>(elements, elements + count);
}

inline bool decode(PBCodable& message, const std::vector<uint8_t>& bytes) {
  PBDataReader reader(bytes.data(), bytes.size());
  return message.readFrom(reader);
}

}  // namespace kolvrand::test
