// SPDX-License-Identifier: MIT
// printf-style formatting with %@ for objects.
#include "base/Format.h"

#include <cinttypes>
#include <cmath>
#include <cstdio>
#include <limits>

namespace kolvrand {

namespace {

enum class Length { None, hh, h, l, ll, j, z, t, L };

// Widths and precisions beyond this are clamped so a bad format cannot make
// a single message allocate without bound.
constexpr int kMaxField = 4096;

// The argument's bits as an integer, the way a C vararg would be read.
uint64_t integerBits(const LogArg& a) {
  struct V {
    uint64_t operator()(int64_t v) const { return static_cast<uint64_t>(v); }
    uint64_t operator()(uint64_t v) const { return v; }
    uint64_t operator()(double v) const {
      if (std::isnan(v)) return 0;
      if (v <= -9.2233720368547758e18) return static_cast<uint64_t>(INT64_MIN);
      if (v >= 1.8446744073709552e19) return UINT64_MAX;
      if (v < 0) return static_cast<uint64_t>(static_cast<int64_t>(v));
      return static_cast<uint64_t>(v);
    }
    uint64_t operator()(const void* p) const { return reinterpret_cast<uintptr_t>(p); }
    uint64_t operator()(const char* p) const { return reinterpret_cast<uintptr_t>(p); }
    uint64_t operator()(std::string_view) const { return 0; }
    uint64_t operator()(const LogArg::Object&) const { return 0; }
  };
  return std::visit(V{}, a.v);
}

double floatingValue(const LogArg& a) {
  if (auto* d = std::get_if<double>(&a.v)) return *d;
  if (auto* s = std::get_if<int64_t>(&a.v)) return static_cast<double>(*s);
  if (auto* u = std::get_if<uint64_t>(&a.v)) return static_cast<double>(*u);
  return 0;
}

// Text for %s and %@.
std::string textValue(const LogArg& a) {
  struct V {
    std::string operator()(int64_t v) const { return std::to_string(v); }
    std::string operator()(uint64_t v) const { return std::to_string(v); }
    std::string operator()(double v) const {
      char buf[64];
      std::snprintf(buf, sizeof buf, "%g", v);
      return buf;
    }
    std::string operator()(const void* p) const {
      if (!p) return "(null)";
      char buf[32];
      std::snprintf(buf, sizeof buf, "%p", p);
      return buf;
    }
    std::string operator()(const char* p) const { return p ? p : "(null)"; }
    std::string operator()(std::string_view s) const { return std::string(s); }
    std::string operator()(const LogArg::Object& o) const { return o.text ? *o.text : "(null)"; }
  };
  return std::visit(V{}, a.v);
}

template <typename T>
void appendPrintf(std::string& out, const std::string& fmt, T value) {
  char buf[256];
  int n = std::snprintf(buf, sizeof buf, fmt.c_str(), value);
  if (n < 0) return;
  if (static_cast<size_t>(n) < sizeof buf) {
    out.append(buf, static_cast<size_t>(n));
    return;
  }
  std::string big(static_cast<size_t>(n) + 1, '\0');
  std::snprintf(big.data(), big.size(), fmt.c_str(), value);
  out.append(big.data(), static_cast<size_t>(n));
}

struct Directive {
  std::string flags;
  int width = -1;
  int precision = -1;
  Length length = Length::None;
  char conversion = 0;

  // A printf directive with only the flags that are defined for the
  // conversion, so snprintf never sees an undefined combination.
  std::string printfFormat(std::string_view allowedFlags, std::string_view lengthModifier,
                           char conv, bool withPrecision = true) const {
    std::string f = "%";
    for (char c : flags)
      if (allowedFlags.find(c) != std::string_view::npos) f += c;
    if (width >= 0) f += std::to_string(width);
    if (withPrecision && precision >= 0) {
      f += '.';
      f += std::to_string(precision);
    }
    f.append(lengthModifier);
    f += conv;
    return f;
  }
};

long long asSigned(uint64_t bits, Length length) {
  switch (length) {
    case Length::hh:
      return static_cast<signed char>(bits);
    case Length::h:
      return static_cast<short>(bits);
    case Length::None:
      return static_cast<int>(bits);
    case Length::l:
      return static_cast<long>(bits);
    case Length::ll:
      return static_cast<long long>(bits);
    case Length::j:
      return static_cast<intmax_t>(bits);
    case Length::z:
      return static_cast<ssize_t>(bits);
    case Length::t:
      return static_cast<ptrdiff_t>(bits);
    case Length::L:
      return static_cast<long long>(bits);
  }
  return static_cast<int>(bits);
}

unsigned long long asUnsigned(uint64_t bits, Length length) {
  switch (length) {
    case Length::hh:
      return static_cast<unsigned char>(bits);
    case Length::h:
      return static_cast<unsigned short>(bits);
    case Length::None:
      return static_cast<unsigned int>(bits);
    case Length::l:
      return static_cast<unsigned long>(bits);
    case Length::ll:
      return static_cast<unsigned long long>(bits);
    case Length::j:
      return static_cast<uintmax_t>(bits);
    case Length::z:
      return static_cast<size_t>(bits);
    case Length::t:
      return static_cast<size_t>(bits);
    case Length::L:
      return static_cast<unsigned long long>(bits);
  }
  return static_cast<unsigned int>(bits);
}

void appendPadded(std::string& out, std::string text, const Directive& d) {
  if (d.precision >= 0 && text.size() > static_cast<size_t>(d.precision)) text.resize(d.precision);
  size_t pad =
      d.width > 0 && text.size() < static_cast<size_t>(d.width) ? d.width - text.size() : 0;
  bool left = d.flags.find('-') != std::string::npos;
  if (!left) out.append(pad, ' ');
  out += text;
  if (left) out.append(pad, ' ');
}

int parseNumber(std::string_view format, size_t& i) {
  long n = 0;
  while (i < format.size() && format[i] >= '0' && format[i] <= '9') {
    n = n * 10 + (format[i] - '0');
    if (n > kMaxField) n = kMaxField;
    ++i;
  }
  return static_cast<int>(n);
}

}  // namespace

std::string formatLogMessage(std::string_view format, std::span<const LogArg> args) {
  std::string out;
  out.reserve(format.size() + 32);
  size_t next = 0;  // index of the next unused argument
  auto take = [&]() -> const LogArg* { return next < args.size() ? &args[next++] : nullptr; };

  for (size_t i = 0; i < format.size();) {
    char c = format[i];
    if (c != '%') {
      size_t end = format.find('%', i);
      if (end == std::string_view::npos) end = format.size();
      out.append(format.substr(i, end - i));
      i = end;
      continue;
    }
    size_t start = i++;
    // Privacy annotations such as %{public}s carry no meaning here.
    if (i < format.size() && format[i] == '{') {
      size_t close = format.find('}', i);
      if (close != std::string_view::npos) i = close + 1;
    }
    Directive d;
    while (i < format.size() && std::string_view("-+ #0").find(format[i]) != std::string_view::npos)
      d.flags += format[i++];
    if (i < format.size() && format[i] == '*') {
      ++i;
      if (const LogArg* a = take()) {
        long long w = static_cast<int>(integerBits(*a));
        if (w < 0) {
          d.flags += '-';
          w = -w;
        }
        d.width = static_cast<int>(std::min<long long>(w, kMaxField));
      }
    } else if (i < format.size() && format[i] >= '0' && format[i] <= '9') {
      d.width = parseNumber(format, i);
    }
    if (i < format.size() && format[i] == '.') {
      ++i;
      if (i < format.size() && format[i] == '*') {
        ++i;
        const LogArg* a = take();
        int p = a ? static_cast<int>(integerBits(*a)) : -1;
        d.precision = p < 0 ? -1 : std::min(p, kMaxField);
      } else {
        d.precision = parseNumber(format, i);
      }
    }
    if (format.substr(i, 2) == "hh") {
      d.length = Length::hh;
      i += 2;
    } else if (format.substr(i, 2) == "ll") {
      d.length = Length::ll;
      i += 2;
    } else if (i < format.size()) {
      switch (format[i]) {
        case 'h':
          d.length = Length::h;
          ++i;
          break;
        case 'l':
          d.length = Length::l;
          ++i;
          break;
        case 'j':
          d.length = Length::j;
          ++i;
          break;
        case 'z':
          d.length = Length::z;
          ++i;
          break;
        case 't':
          d.length = Length::t;
          ++i;
          break;
        case 'L':
          d.length = Length::L;
          ++i;
          break;
        case 'q':
          d.length = Length::ll;
          ++i;
          break;
        default:
          break;
      }
    }
    if (i >= format.size()) {  // a directive cut off by the end of the format
      out.append(format.substr(start));
      break;
    }
    d.conversion = format[i++];

    switch (d.conversion) {
      case '%':
        out += '%';
        break;
      case 'd':
      case 'i':
        if (const LogArg* a = take())
          appendPrintf(out, d.printfFormat("-+ 0", "ll", 'd'), asSigned(integerBits(*a), d.length));
        break;
      case 'u':
      case 'x':
      case 'X':
      case 'o':
        if (const LogArg* a = take())
          appendPrintf(out, d.printfFormat("-#0", "ll", d.conversion),
                       asUnsigned(integerBits(*a), d.length));
        break;
      case 'f':
      case 'F':
      case 'e':
      case 'E':
      case 'g':
      case 'G':
      case 'a':
      case 'A':
        if (const LogArg* a = take())
          appendPrintf(out, d.printfFormat("-+ #0", "", d.conversion), floatingValue(*a));
        break;
      case 'c':
        if (const LogArg* a = take())
          appendPrintf(out, d.printfFormat("-", "", 'c', false),
                       static_cast<int>(static_cast<unsigned char>(integerBits(*a))));
        break;
      case 'p':
        if (const LogArg* a = take())
          appendPrintf(out, d.printfFormat("-", "", 'p', false),
                       reinterpret_cast<const void*>(static_cast<uintptr_t>(integerBits(*a))));
        break;
      case 's':
      case '@':
        if (const LogArg* a = take()) appendPadded(out, textValue(*a), d);
        break;
      case 'n':
        take();
        break;  // never writes through an argument
      default:
        out.append(format.substr(start, i - start));
        break;
    }
  }
  return out;
}

}  // namespace kolvrand
