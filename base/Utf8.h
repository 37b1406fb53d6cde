// SPDX-License-Identifier: MIT
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

// The length of the well-formed UTF-8 sequence that starts at `p` (before
// `end`), or 0 when the bytes there are none.
inline size_t utf8SequenceLength(const uint8_t* p, const uint8_t* end) {
  const uint8_t c = *p;
  if (c < 0x80) return 1;
  size_t extra;
  uint32_t cp;
  if (c >= 0xC2 && c <= 0xDF) {
    extra = 1, cp = c & 0x1F;
  } else if (c >= 0xE0 && c <= 0xEF) {
    extra = 2, cp = c & 0x0F;
  } else if (c >= 0xF0 && c <= 0xF4) {
    extra = 3, cp = c & 0x07;
  } else {
    return 0;
  }
  if (static_cast<size_t>(end - p) <= extra) return 0;
  for (size_t i = 1; i <= extra; ++i) {
    if ((p[i] & 0xC0) != 0x80) return 0;
    cp = (cp << 6) | (p[i] & 0x3F);
  }
  if ((extra == 2 && cp < 0x800) || (extra == 3 && cp < 0x10000) || cp > 0x10FFFF ||
      (cp >= 0xD800 && cp <= 0xDFFF))
    return 0;
  return extra + 1;
}

inline bool isValidUTF8(std::string_view s) {
  const auto* p = reinterpret_cast<const uint8_t*>(s.data());
  const auto* end = p + s.size();
  while (p < end) {
    const size_t n = utf8SequenceLength(p, end);
    if (n == 0) return false;
    p += n;
  }
  return true;
}

// Text from outside (a file name, a kernel variable, a value of a file) as it
// may be shown on a terminal or in a line of a log: well-formed UTF-8 stays as
// it is, but control characters (C0, DEL and C1) become visible escapes (\n,
// \r, \t, \xNN, \u0085) and bytes that are no UTF-8 become \xNN, so that
// nothing shown ends a line, moves the cursor or sets a terminal's state.
inline std::string visibleText(std::string_view s) {
  static constexpr char kHex[] = "0123456789abcdef";
  std::string out;
  out.reserve(s.size());
  const auto* p = reinterpret_cast<const uint8_t*>(s.data());
  const auto* end = p + s.size();
  while (p < end) {
    const size_t n = utf8SequenceLength(p, end);
    if (n == 1 && *p >= 0x20 && *p != 0x7F) {
      out += static_cast<char>(*p);
    } else if (n == 1 && (*p == '\n' || *p == '\r' || *p == '\t')) {
      out += *p == '\n' ? "\\n" : *p == '\r' ? "\\r" : "\\t";
    } else if (n == 2 && p[0] == 0xC2 && p[1] < 0xA0) {
      out += "\\u00";
      out += kHex[p[1] >> 4];
      out += kHex[p[1] & 15];
    } else if (n > 1) {
      out.append(reinterpret_cast<const char*>(p), n);
    } else {
      out += "\\x";
      out += kHex[*p >> 4];
      out += kHex[*p & 15];
      p += 1;
      continue;
    }
    p += n;
  }
  return out;
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
