// SPDX-License-Identifier: MIT
// Taking a message's dictionary form back into the message: the reverse of
// dictionaryOfFields, driven by the same table of keys and kinds, so that the
// tools that read models written by hand never keep a field list of their own.
#include <algorithm>
#include <charconv>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <string>
#include <string_view>
#include <vector>

#include "model/FieldEngine.h"
#include "model/PBCodable.h"

namespace kolvrand::detail {

namespace {

bool fail(ValueError* error, std::string path, std::string reason) {
  if (error) *error = {std::move(path), std::move(reason), {}};
  return false;
}

std::string element(std::string_view key, size_t index) {
  return std::string(key) + "[" + std::to_string(index) + "]";
}

std::string describe(const Value& value) {
  switch (value.type()) {
    case Value::Type::Boolean:
      return *value.asBoolean() ? "true" : "false";
    case Value::Type::Number:
      return "the number " + value.asNumber()->description();
    case Value::Type::String:
      return "the string \"" + *value.asString() + "\"";
    case Value::Type::Data:
      return "a byte string";
    case Value::Type::Array:
      return "an array";
    case Value::Type::Dictionary:
      return "an object";
  }
  return "a value";
}

// Doubles at or beyond the midpoint between FLT_MAX and 2^128 round to an
// infinity; converting them is not even defined behaviour.
constexpr double kFloatOverflow = 0x1.ffffffp127;

// `reason` naming the number `n` as its description reads.
bool numberReason(const Number& n, std::string text, std::string* reason, std::string* number) {
  *reason = std::move(text);
  *number = n.description();
  return false;
}

bool floatFromValue(const Value& value, float* out, std::string* reason, std::string* number) {
  const Number* n = value.asNumber();
  if (!n) {
    *reason = "expected a float, got " + describe(value);
    return false;
  }
  switch (n->kind()) {
    case Number::Kind::Float:
      *out = n->floatValue();
      return true;
    // An integer is rounded to a float once, from its exact value (through a
    // double, one above 2^53 would be rounded twice).
    case Number::Kind::Signed:
      *out = static_cast<float>(n->int64Value());
      return true;
    case Number::Kind::Unsigned:
      *out = static_cast<float>(n->uint64Value());
      return true;
    case Number::Kind::Double:
      break;
  }
  const double d = n->doubleValue();
  if (std::isfinite(d) && std::fabs(d) >= kFloatOverflow)
    return numberReason(*n, n->description() + " is out of range for a 32-bit float", reason,
                        number);
  *out = static_cast<float>(d);
  return true;
}

// The value of `value` within [min, max], exactly. Integers are what the
// number says they are: a Signed or Unsigned number. A Float or Double is
// what is left of a number that is no integer, or that lies beyond 64 bits,
// or of negative zero (the JSON layer turns every other integer, whatever its
// spelling, into one of the two integer kinds); so its rounded value never
// makes a fraction look like an integer, or one in range look out of it.
bool integerFromValue(const Value& value, int64_t min, int64_t max, const char* what, int64_t* out,
                      std::string* reason, std::string* number) {
  const Number* n = value.asNumber();
  bool inRange = false;
  if (n && n->kind() == Number::Kind::Signed) {
    inRange = n->int64Value() >= min && n->int64Value() <= max;
    *out = n->int64Value();
  } else if (n && n->kind() == Number::Kind::Unsigned) {
    inRange = n->uint64Value() <= static_cast<uint64_t>(max);
    if (inRange) *out = static_cast<int64_t>(n->uint64Value());
  } else if (n && n->doubleValue() == 0) {
    inRange = true;
    *out = 0;
  } else if (n && std::isfinite(n->doubleValue()) && std::fabs(n->doubleValue()) >= 0x1p63) {
    inRange = false;
  } else {
    *reason = std::string("expected ") + what + ", got " + describe(value);
    if (n) *number = n->description();
    return false;
  }
  if (!inRange)
    return numberReason(*n,
                        n->description() + " is out of range for " + what + " (" +
                            std::to_string(min) + " to " + std::to_string(max) + ")",
                        reason, number);
  return true;
}

// An enum from one of its dictionary strings (a value's name or "(unknown: N)"
// for a value without one) or from its number. Only the string the dictionary
// would show for a value is taken, so what is read prints back the same.
bool enumFromValue(const FieldDescriptor& d, const Value& value, int32_t* out, std::string* reason,
                   std::string* numberShown) {
  const std::string* s = value.asString();
  if (s) {
    int32_t candidate = d.enumValue(std::string_view(*s));
    constexpr std::string_view kUnknown = "(unknown: ";
    if (d.enumName(candidate) != *s && s->starts_with(kUnknown) && s->ends_with(")")) {
      const char* first = s->data() + kUnknown.size();
      const char* last = s->data() + s->size() - 1;
      auto [end, ec] = std::from_chars(first, last, candidate);
      if (ec != std::errc() || end != last) candidate = 0;
    }
    if (d.enumName(candidate) == *s) {
      *out = candidate;
      return true;
    }
  }
  if (s || !value.isNumber()) {
    *reason = "expected a value name such as \"" + d.enumName(0) +
              "\", \"(unknown: N)\" for a value without one, or a 32-bit integer; got " +
              describe(value);
    return false;
  }
  int64_t number = 0;
  if (!integerFromValue(value, INT32_MIN, INT32_MAX, "a 32-bit integer", &number, reason,
                        numberShown))
    return false;
  *out = static_cast<int32_t>(number);
  return true;
}

const FieldDescriptor* findKey(const MessageTable& table, std::string_view key) {
  for (const FieldDescriptor *d = table.fields, *end = d + table.count; d != end; ++d)
    if (key == d->key) return d;
  return nullptr;
}

// A key that differs only in case, for the error message.
const FieldDescriptor* nearKey(const MessageTable& table, std::string_view key) {
  auto lower = [](char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c; };
  for (const FieldDescriptor *d = table.fields, *end = d + table.count; d != end; ++d) {
    std::string_view k = d->key;
    if (k.size() != key.size()) continue;
    size_t i = 0;
    while (i < k.size() && lower(k[i]) == lower(key[i])) ++i;
    if (i == k.size()) return d;
  }
  return nullptr;
}

bool setField(const FieldDescriptor& d, MutableFields fields, const Value& value,
              ValueError* error) {
  std::string reason, number;
  const auto fail = [&](std::string path, std::string why) {
    if (error) *error = {std::move(path), std::move(why), std::move(number)};
    return false;
  };
  switch (d.kind) {
    case FieldKind::SubMessage: {
      std::shared_ptr<PBCodable> message = d.makeMessage();
      if (!value.isDictionary())
        return fail(d.key, std::string("expected an object (") + message->className() + "), got " +
                               describe(value));
      ValueError inner;
      if (!message->setFieldsFromDictionary(value, &inner)) {
        number = std::move(inner.number);
        return fail(joinPath(d.key, inner.path), std::move(inner.reason));
      }
      fields.subs[d.slot] = std::move(message);
      return true;
    }
    case FieldKind::RepeatedFloat: {
      const Array* array = value.asArray();
      if (!array) return fail(d.key, "expected an array of floats, got " + describe(value));
      std::vector<float> floats(array->size());
      for (size_t i = 0; i < array->size(); ++i)
        if (!floatFromValue((*array)[i], &floats[i], &reason, &number))
          return fail(element(d.key, i), std::move(reason));
      PBRepeatedFloatSet(fields.lists[d.slot], floats.data(), floats.size());
      return true;
    }
    case FieldKind::Uint32: {
      int64_t integer = 0;
      if (!integerFromValue(value, 0, UINT32_MAX, "an unsigned 32-bit integer", &integer, &reason,
                            &number))
        return fail(d.key, std::move(reason));
      fields.ints[d.slot] = static_cast<uint32_t>(integer);
      return true;
    }
    case FieldKind::OptionalFloat:
      if (!floatFromValue(value, &fields.floats[d.slot], &reason, &number))
        return fail(d.key, std::move(reason));
      *fields.has |= d.hasMask();
      return true;
    case FieldKind::OptionalEnum: {
      int32_t enumValue = 0;
      if (!enumFromValue(d, value, &enumValue, &reason, &number))
        return fail(d.key, std::move(reason));
      fields.ints[d.slot] = static_cast<uint32_t>(enumValue);
      *fields.has |= d.hasMask();
      return true;
    }
  }
  return fail(d.key, "unsupported field kind");
}

}  // namespace

bool setFieldsFromDictionary(const MessageTable& table, MutableFields fields,
                             const Value& dictionary, ValueError* error) {
  const Dictionary* entries = dictionary.asDictionary();
  if (!entries) return fail(error, "", "expected an object, got " + describe(dictionary));
  for (const auto& [key, value] : *entries) {
    const FieldDescriptor* d = findKey(table, key);
    if (!d) {
      const FieldDescriptor* near = nearKey(table, key);
      return fail(error, dictionaryPathKey(key),
                  near ? std::string("unknown key; did you mean \"") + near->key + "\"?"
                       : std::string("unknown key"));
    }
    if (!setField(*d, fields, value, error)) return false;
  }
  return true;
}

}  // namespace kolvrand::detail
