// Strings made from bytes in the manner of stringWithUTF8String: nil unless
// the bytes are well-formed UTF-8 (no overlong forms, no surrogates, nothing
// above U+10FFFF).
#pragma once

#include <cstdint>
#include <cstring>
#include <optional>
#include <string>
#include <string_view>

namespace kolvrand {

inline bool isValidUTF8(std::string_view s) {
  const auto* p = reinterpret_cast<const uint8_t*>(s.data());
  const auto* end = p + s.size();
  while (p < end) {
    uint8_t c = *p++;
    if (c < 0x80) continue;
    int extra;
    uint32_t cp;
    if (c >= 0xC2 && c <= 0xDF) {
      extra = 1, cp = c & 0x1F;
    } else if (c >= 0xE0 && c <= 0xEF) {
      extra = 2, cp = c & 0x0F;
    } else if (c >= 0xF0 && c <= 0xF4) {
      extra = 3, cp = c & 0x07;
    } else {
      return false;
    }
    if (end - p < extra) return false;
    for (int i = 0; i < extra; ++i) {
      if ((p[i] & 0xC0) != 0x80) return false;
      cp = (cp << 6) | (p[i] & 0x3F);
    }
    p += extra;
    if ((extra == 2 && cp < 0x800) || (extra == 3 && cp < 0x10000) || cp > 0x10FFFF ||
        (cp >= 0xD800 && cp <= 0xDFFF))
      return false;
  }
  return true;
}

// The NUL-terminated bytes at `bytes` as a string, or nullopt when they are
// not UTF-8 or `bytes` is null.
inline std::optional<std::string> stringWithUTF8String(const char* bytes) {
  if (!bytes) return std::nullopt;
  std::string_view s(bytes, std::strlen(bytes));
  if (!isValidUTF8(s)) return std::nullopt;
  return std::string(s);
}

}  // namespace kolvrand
