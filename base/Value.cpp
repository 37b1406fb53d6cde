// SPDX-License-Identifier: MIT
#include "base/Value.h"

#include <algorithm>
#include <bit>
#include <charconv>
#include <cmath>
#include <cstdio>
#include <limits>

namespace kolvrand {

namespace {

template <typename Int>
Int saturate(double d) {
  if (std::isnan(d)) return 0;
  if (d <= static_cast<double>(std::numeric_limits<Int>::min()))
    return std::numeric_limits<Int>::min();
  if (d >= static_cast<double>(std::numeric_limits<Int>::max()))
    return std::numeric_limits<Int>::max();
  return static_cast<Int>(d);
}

template <typename T>
std::string shortest(T v) {
  if (std::isnan(v)) return "nan";
  if (std::isinf(v)) return v < 0 ? "-inf" : "inf";
  char buf[64];
  auto r = std::to_chars(buf, buf + sizeof buf, v);
  return std::string(buf, r.ptr);
}

void appendQuoted(std::string& out, std::string_view s) {
  out += '"';
  for (unsigned char c : s) {
    switch (c) {
      case '"':
        out += "\\\"";
        break;
      case '\\':
        out += "\\\\";
        break;
      case '\n':
        out += "\\n";
        break;
      case '\t':
        out += "\\t";
        break;
      default:
        if (c < 0x20) {
          out += "\\u00";
          out += hexString(&c, 1);
        } else {
          out += static_cast<char>(c);
        }
    }
  }
  out += '"';
}

}  // namespace

int64_t Number::int64Value() const {
  switch (kind_) {
    case Kind::Signed:
      return s_;
    case Kind::Unsigned:
      return static_cast<int64_t>(u_);
    case Kind::Float:
      return saturate<int64_t>(f_);
    case Kind::Double:
      return saturate<int64_t>(d_);
  }
  return 0;
}

uint64_t Number::uint64Value() const {
  switch (kind_) {
    case Kind::Signed:
      return static_cast<uint64_t>(s_);
    case Kind::Unsigned:
      return u_;
    case Kind::Float:
      return saturate<uint64_t>(f_);
    case Kind::Double:
      return saturate<uint64_t>(d_);
  }
  return 0;
}

double Number::doubleValue() const {
  switch (kind_) {
    case Kind::Signed:
      return static_cast<double>(s_);
    case Kind::Unsigned:
      return static_cast<double>(u_);
    case Kind::Float:
      return f_;
    case Kind::Double:
      return d_;
  }
  return 0;
}

std::string Number::description() const {
  switch (kind_) {
    case Kind::Signed:
      return std::to_string(s_);
    case Kind::Unsigned:
      return std::to_string(u_);
    case Kind::Float:
      return shortest(f_);
    case Kind::Double:
      return shortest(d_);
  }
  return {};
}

bool Number::operator==(const Number& other) const {
  if (kind_ != other.kind_) return false;
  switch (kind_) {
    case Kind::Signed:
      return s_ == other.s_;
    case Kind::Unsigned:
      return u_ == other.u_;
    case Kind::Float:
      return std::bit_cast<uint32_t>(f_) == std::bit_cast<uint32_t>(other.f_);
    case Kind::Double:
      return std::bit_cast<uint64_t>(d_) == std::bit_cast<uint64_t>(other.d_);
  }
  return false;
}

Dictionary::Dictionary(std::initializer_list<Entry> entries) {
  for (const auto& e : entries) set(e.first, e.second);
}

const Value* Dictionary::find(std::string_view key) const {
  for (const auto& e : entries_)
    if (e.first == key) return &e.second;
  return nullptr;
}

Value* Dictionary::find(std::string_view key) {
  for (auto& e : entries_)
    if (e.first == key) return &e.second;
  return nullptr;
}

void Dictionary::set(std::string key, Value value) {
  if (Value* existing = find(key)) {
    *existing = std::move(value);
    return;
  }
  entries_.emplace_back(std::move(key), std::move(value));
}

bool Dictionary::operator==(const Dictionary& other) const {
  if (size() != other.size()) return false;
  for (const auto& [k, v] : entries_) {
    const Value* o = other.find(k);
    if (!o || !(*o == v)) return false;
  }
  return true;
}

void renderValue(std::string& out, const Value& value, const ValueTextStyle& style) {
  switch (value.type()) {
    case Value::Type::Boolean:
      out += *value.asBoolean() ? "true" : "false";
      break;
    case Value::Type::Number:
      style.number(out, *value.asNumber());
      break;
    case Value::Type::String:
      style.string(out, *value.asString());
      break;
    case Value::Type::Data:
      out += style.dataOpen;
      out += hexString(value.asData()->data(), value.asData()->size());
      out += style.dataClose;
      break;
    case Value::Type::Array: {
      out += '[';
      bool first = true;
      for (const Value& element : *value.asArray()) {
        if (!first) out += style.elementSeparator;
        first = false;
        renderValue(out, element, style);
      }
      out += ']';
      break;
    }
    case Value::Type::Dictionary: {
      out += '{';
      bool first = true;
      for (const auto& [key, element] : *value.asDictionary()) {
        if (!first) out += style.elementSeparator;
        first = false;
        style.string(out, key);
        out += style.keySeparator;
        renderValue(out, element, style);
      }
      out += '}';
      break;
    }
  }
}

std::string Value::description() const {
  static constexpr ValueTextStyle kReadable{", ",
                                            ": ",
                                            "<",
                                            ">",
                                            [](std::string& out, const Number& n) { out += n.description(); },
                                            appendQuoted};
  std::string out;
  renderValue(out, *this, kReadable);
  return out;
}

std::string joinPath(std::string_view outer, std::string_view inner) {
  if (inner.empty()) return std::string(outer);
  if (outer.empty()) return std::string(inner);
  return std::string(outer) + (inner.front() == '[' ? "" : ".") + std::string(inner);
}

std::string dictionaryPathKey(const std::string& key) {
  const bool name = !key.empty() && std::all_of(key.begin(), key.end(), [](char c) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '_';
  });
  if (name) return key;
  std::string out = "[\"";
  for (unsigned char c : key) {
    if (c == '"' || c == '\\') {
      out += '\\';
      out += static_cast<char>(c);
    } else if (c == '\n' || c == '\t') {
      out += c == '\n' ? "\\n" : "\\t";
    } else if (c < 0x20 || c == 0x7f) {
      char escape[8];
      std::snprintf(escape, sizeof escape, "\\u%04x", c);
      out += escape;
    } else {
      out += static_cast<char>(c);
    }
  }
  return out + "\"]";
}

}  // namespace kolvrand
