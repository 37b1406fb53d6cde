// Helpers of the model tests: byte strings written and compared as hex text (so
// a failing test shows the bytes it got), decoding, and lists as vectors.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "model/PBCodable.h"

namespace kolvrand::test {

// "90 01 0a" -> {0x90, 0x01, 0x0a}: pairs of digits, one space apart.
inline std::vector<uint8_t> fromHex(std::string_view hex) {
  std::vector<uint8_t> out;
  for (size_t i = 0; i + 1 < hex.size(); i += 3)
    out.push_back(static_cast<uint8_t>(std::stoi(std::string(hex.substr(i, 2)), nullptr, 16)));
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
