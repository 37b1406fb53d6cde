// SPDX-License-Identifier: MIT
// printf-style formatting with %@ for objects. Each directive is handed to the
// C library's snprintf with its argument made the type the directive names,
// so a format and an argument that disagree print a wrong number at worst,
// never read memory the argument does not own.
#include "base/Format.h"

#include <algorithm>
#include <cstdio>

namespace kolvrand {

namespace {

// Widths and precisions above this are refused (the directive is printed as
// it stands), so that a bad format cannot make one message allocate without
// bound.
constexpr int kMaxField = 4096;

struct AsInteger {
  uint64_t operator()(int64_t v) const { return static_cast<uint64_t>(v); }
  uint64_t operator()(uint64_t v) const { return v; }
  uint64_t operator()(double v) const {
    // Truncated toward zero, saturated, NaN as 0, as a conversion in C would
    // be were it defined.
    if (!(v == v)) return 0;
    if (v <= -9.2233720368547758e18) return static_cast<uint64_t>(INT64_MIN);
    if (v >= 1.8446744073709552e19) return UINT64_MAX;
    return v < 0 ? static_cast<uint64_t>(static_cast<int64_t>(v)) : static_cast<uint64_t>(v);
  }
  uint64_t operator()(const void* p) const { return reinterpret_cast<uintptr_t>(p); }
  uint64_t operator()(const char* p) const { return reinterpret_cast<uintptr_t>(p); }
  uint64_t operator()(std::string_view) const { return 0; }
  uint64_t operator()(const LogArg::Object&) const { return 0; }
};

struct AsText {
  std::string operator()(int64_t v) const { return std::to_string(v); }
  std::string operator()(uint64_t v) const { return std::to_string(v); }
  std::string operator()(double v) const { return print("%g", v); }
  std::string operator()(const void* p) const { return p ? print("%p", p) : "(null)"; }
  std::string operator()(const char* p) const { return p ? p : "(null)"; }
  std::string operator()(std::string_view s) const { return std::string(s); }
  std::string operator()(const LogArg::Object& o) const { return o.text ? *o.text : "(null)"; }

  template <typename T>
  static std::string print(const char* format, T value) {
    char buffer[64];
    std::snprintf(buffer, sizeof buffer, format, value);
    return buffer;
  }
};

double asDouble(const LogArg& a) {
  if (auto* d = std::get_if<double>(&a.v)) return *d;
  if (auto* s = std::get_if<int64_t>(&a.v)) return static_cast<double>(*s);
  if (auto* u = std::get_if<uint64_t>(&a.v)) return static_cast<double>(*u);
  return 0;
}

// The width in bits of an integer argument of the length modifier.
int integerBits(std::string_view length) {
  if (length == "hh") return 8;
  if (length == "h") return 16;
  if (length == "l") return 8 * sizeof(long);
  if (length == "z" || length == "t") return 8 * sizeof(size_t);
  if (length == "ll" || length == "j") return 64;
  return 8 * sizeof(int);
}

template <typename T>
void appendPrintf(std::string& out, const std::string& directive, T value) {
  const int n = std::snprintf(nullptr, 0, directive.c_str(), value);
  if (n <= 0) return;
  const size_t at = out.size();
  out.resize(at + static_cast<size_t>(n) + 1);
  std::snprintf(out.data() + at, static_cast<size_t>(n) + 1, directive.c_str(), value);
  out.resize(at + static_cast<size_t>(n));
}

// Moves `i` past the digits there; false when they make more than kMaxField.
bool skipNumber(std::string_view format, size_t& i) {
  int n = 0;
  for (; i < format.size() && format[i] >= '0' && format[i] <= '9'; ++i)
    n = std::min(n * 10 + (format[i] - '0'), kMaxField + 1);
  return n <= kMaxField;
}

}  // namespace

std::string formatLogMessage(std::string_view format, std::span<const LogArg> args) {
  std::string out;
  out.reserve(format.size() + 32);
  size_t next = 0;  // the next argument not yet used
  for (size_t i = 0; i < format.size();) {
    const size_t percent = format.find('%', i);
    out.append(format.substr(i, percent - i));
    if (percent == std::string_view::npos) break;
    // The directive: flags, width, precision, length modifier, conversion.
    size_t end = percent + 1;
    while (end < format.size() &&
           std::string_view("-+ #0").find(format[end]) != std::string_view::npos)
      ++end;
    bool bounded = skipNumber(format, end);
    if (end < format.size() && format[end] == '.') bounded = skipNumber(format, ++end) && bounded;
    const size_t lengthAt = end;
    while (end < format.size() &&
           std::string_view("hljztL").find(format[end]) != std::string_view::npos)
      ++end;
    if (end >= format.size() || !bounded) {  // cut off by the format's end, or too wide
      out.append(format.substr(percent, end - percent));
      i = end;
      continue;
    }
    const char conversion = format[end];
    const std::string_view length = format.substr(lengthAt, end - lengthAt);
    // The directive without its length modifier, which the argument's type
    // replaces.
    std::string directive(format.substr(percent, lengthAt - percent));
    i = end + 1;
    if (conversion == '%') {
      out += '%';
      continue;
    }
    if (std::string_view("diuxXocpsfFeEgGaA@").find(conversion) == std::string_view::npos) {
      out.append(format.substr(percent, i - percent));
      continue;
    }
    // A directive without its argument prints nothing.
    if (next == args.size()) continue;
    const LogArg& a = args[next++];
    switch (conversion) {
      case 'd':
      case 'i': {
        const int shift = 64 - integerBits(length);
        const auto v = static_cast<int64_t>(std::visit(AsInteger{}, a.v) << shift) >> shift;
        appendPrintf(out, directive + "lld", static_cast<long long>(v));
        break;
      }
      case 'u':
      case 'x':
      case 'X':
      case 'o': {
        const int shift = 64 - integerBits(length);
        const uint64_t v = std::visit(AsInteger{}, a.v) << shift >> shift;
        appendPrintf(out, directive + "ll" + conversion, static_cast<unsigned long long>(v));
        break;
      }
      case 'c':
        appendPrintf(out, directive + 'c', static_cast<int>(std::visit(AsInteger{}, a.v) & 0xff));
        break;
      case 'p':
        appendPrintf(
            out, directive + 'p',
            reinterpret_cast<const void*>(static_cast<uintptr_t>(std::visit(AsInteger{}, a.v))));
        break;
      case 's':
      case '@':
        if (directive.size() == 1) {
          out += std::visit(AsText{}, a.v);
        } else {
          appendPrintf(out, directive + 's', std::visit(AsText{}, a.v).c_str());
        }
        break;
      default:
        appendPrintf(out, directive + conversion, asDouble(a));
    }
  }
  return out;
}

}  // namespace kolvrand
