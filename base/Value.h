// SPDX-License-Identifier: MIT
// The one value type of registry properties and of the messages' dictionary
// form: dictionary, array, number, string, data or boolean.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

#include "base/Hex.h"

namespace kolvrand {

class Value;

using Data = std::vector<uint8_t>;
using Array = std::vector<Value>;

// A number keeps the kind it was made from, so a 32-bit float stays a 32-bit
// float and an unsigned 32-bit value never turns negative.
class Number {
 public:
  enum class Kind : uint8_t { Signed, Unsigned, Float, Double };

  static Number fromSigned(int64_t v) { return Number(Kind::Signed, v); }
  static Number fromUnsigned(uint64_t v) { return Number(Kind::Unsigned, v); }
  static Number fromFloat(float v) { return Number(Kind::Float, v); }
  static Number fromDouble(double v) { return Number(Kind::Double, v); }

  Kind kind() const { return kind_; }
  bool isInteger() const { return kind_ == Kind::Signed || kind_ == Kind::Unsigned; }

  // Conversions in the manner of CFNumberGetValue: integers keep their low
  // bits, floating values truncate toward zero and saturate; NaN gives 0.
  int32_t int32Value() const { return static_cast<int32_t>(static_cast<uint32_t>(int64Value())); }
  int64_t int64Value() const;
  uint64_t uint64Value() const;
  double doubleValue() const;
  float floatValue() const { return static_cast<float>(doubleValue()); }

  // The number as a person reads it: integers in decimal, floats as the
  // shortest decimal that reads back to the same value.
  std::string description() const;

  // Same kind and same bits (so NaN equals NaN here; messages compare floats
  // themselves before they build a dictionary).
  bool operator==(const Number& other) const;

 private:
  template <typename T>
  Number(Kind k, T v) : kind_(k) {
    if constexpr (std::is_same_v<T, int64_t>) s_ = v;
    if constexpr (std::is_same_v<T, uint64_t>) u_ = v;
    if constexpr (std::is_same_v<T, float>) f_ = v;
    if constexpr (std::is_same_v<T, double>) d_ = v;
  }
  Kind kind_;
  union {
    int64_t s_;
    uint64_t u_;
    float f_;
    double d_;
  };
};

// A dictionary with string keys that keeps its insertion order, so what is
// printed reads in the order it was built. Setting an existing key replaces its
// value in place.
class Dictionary {
 public:
  using Entry = std::pair<std::string, Value>;

  Dictionary() = default;
  Dictionary(std::initializer_list<Entry> entries);

  const Value* find(std::string_view key) const;
  Value* find(std::string_view key);
  void set(std::string key, Value value);

  // Defined below Value, which the entries need complete.
  size_t size() const;
  bool empty() const;
  std::vector<Entry>::const_iterator begin() const;
  std::vector<Entry>::const_iterator end() const;

  // Equal when both hold the same keys with equal values, in any order.
  bool operator==(const Dictionary& other) const;

 private:
  std::vector<Entry> entries_;
};

class Value {
 public:
  enum class Type : uint8_t { Boolean, Number, String, Data, Array, Dictionary };

  Value() : v_(false) {}
  Value(bool b) : v_(b) {}
  Value(Number n) : v_(n) {}
  Value(std::string s) : v_(std::move(s)) {}
  Value(const char* s) : v_(std::string(s)) {}
  Value(Data d) : v_(std::move(d)) {}
  Value(Array a) : v_(std::move(a)) {}
  Value(Dictionary d) : v_(std::move(d)) {}

  Type type() const { return static_cast<Type>(v_.index()); }
  bool isBoolean() const { return type() == Type::Boolean; }
  bool isNumber() const { return type() == Type::Number; }
  bool isString() const { return type() == Type::String; }
  bool isData() const { return type() == Type::Data; }
  bool isArray() const { return type() == Type::Array; }
  bool isDictionary() const { return type() == Type::Dictionary; }

  // Each returns nullptr when the value is of another type.
  const bool* asBoolean() const { return std::get_if<bool>(&v_); }
  const Number* asNumber() const { return std::get_if<Number>(&v_); }
  const std::string* asString() const { return std::get_if<std::string>(&v_); }
  const Data* asData() const { return std::get_if<Data>(&v_); }
  const Array* asArray() const { return std::get_if<Array>(&v_); }
  const Dictionary* asDictionary() const { return std::get_if<Dictionary>(&v_); }
  Array* asArray() { return std::get_if<Array>(&v_); }
  Dictionary* asDictionary() { return std::get_if<Dictionary>(&v_); }

  // A readable rendering in JSON syntax (data as <hex>), used by %@ in logs
  // and by description.
  std::string description() const;

  bool operator==(const Value& other) const { return v_ == other.v_; }

 private:
  std::variant<bool, Number, std::string, Data, Array, Dictionary> v_;
};

inline size_t Dictionary::size() const {
  return entries_.size();
}
inline bool Dictionary::empty() const {
  return entries_.empty();
}
inline std::vector<Dictionary::Entry>::const_iterator Dictionary::begin() const {
  return entries_.begin();
}
inline std::vector<Dictionary::Entry>::const_iterator Dictionary::end() const {
  return entries_.end();
}

// How renderValue writes a value in JSON's shape: what stands between the
// elements of an array or object and between a key and its value, what
// encloses a byte string's hexadecimal digits, and how numbers and strings
// (keys too) are written.
struct ValueTextStyle {
  std::string_view elementSeparator;
  std::string_view keySeparator;
  std::string_view dataOpen;
  std::string_view dataClose;
  void (*number)(std::string& out, const Number& number);
  void (*string)(std::string& out, std::string_view string);
};
void renderValue(std::string& out, const Value& value, const ValueTextStyle& style);

// Why a value could not be taken (into a message, or from JSON text), and
// where: `path` is the keys from the value's root down, joined by '.', with
// list positions as "[i]" ("R0.resistance25C[3]"; empty for the root itself,
// "$" for the root of a JSON text, "line N: $" for a line of JSON Lines).
struct ValueError {
  std::string path;
  std::string reason;
  // The number the reason names, as its description reads ("4294967296"),
  // so that a caller holding the text it came from can show it as written.
  std::string number;
  std::string message() const { return path + ": " + reason; }
};

// A key as ValueError paths show it: as it is when it is a name, else in
// brackets as a JSON string (["a.b"], ["\u0000"]), so that no key reads as
// two and none cuts a message short.
std::string dictionaryPathKey(const std::string& key);
// `inner` below `outer`: "R0" and "resistance25C[3]" give "R0.resistance25C[3]",
// "$" and "[2]" give "$[2]".
std::string joinPath(std::string_view outer, std::string_view inner);

}  // namespace kolvrand
