// SPDX-License-Identifier: MIT
// Helpers of the model tests: byte strings written as hex text, decoding, and
// lists as vectors.
#pragma once

#include <cstdint>
#include <sstream>
#include <vector>

#include "model/PBCodable.h"

namespace kolvrand::test {

// "90 01 0a" -> {0x90, 0x01, 0x0a}: hex bytes apart by white space.
inline std::vector<uint8_t> fromHex(const std::string& hex) {
  std::istringstream in(hex);
  std::vector<uint8_t> out;
  for (unsigned byte; in >> std::hex >> byte;) out.push_back(static_cast<uint8_t>(byte));
  return out;
}

inline std::vector<float> list(const float* elements, size_t count) {
  return elements ? std::vector<float>(elements, elements + count) : std::vector<float>{};
}

inline bool decode(PBCodable& message, const std::vector<uint8_t>& bytes) {
  PBDataReader reader(bytes.data(), bytes.size());
  return message.readFrom(reader);
}

}  // namespace kolvrand::test
