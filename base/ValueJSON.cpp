// SPDX-License-Identifier: MIT
#include "base/ValueJSON.h"

#include <cstdint>

#include "base/Hex.h"

namespace kolvrand {

namespace {

bool fail(std::string* error, std::string what) {
  if (error) *error = std::move(what);
  return false;
}

// Deeper values are refused: conversion recurses once per level, and a
// device file must not be able to exhaust the stack of the thread reading it.
constexpr int kMaxDepth = 64;

bool convert(const JSON& j, Value& out, const std::string& where, std::string* error,
             int depth = 0) {
  if ((j.is_array() || j.is_object()) && depth == kMaxDepth)
    return fail(error, where + ": nested more than " + std::to_string(kMaxDepth) + " deep");
  switch (j.type()) {
    case JSON::value_t::boolean:
      out = Value(j.get<bool>());
      return true;
    case JSON::value_t::number_integer:
      out = Value(Number::fromSigned(j.get<int64_t>()));
      return true;
    case JSON::value_t::number_unsigned: {
      uint64_t u = j.get<uint64_t>();
      out =
          Value(u > static_cast<uint64_t>(INT64_MAX) ? Number::fromUnsigned(u)
                                                     : Number::fromSigned(static_cast<int64_t>(u)));
      return true;
    }
    case JSON::value_t::number_float:
      out = Value(Number::fromDouble(j.get<double>()));
      return true;
    case JSON::value_t::string:
      out = Value(j.get<std::string>());
      return true;
    case JSON::value_t::array: {
      Array a;
      a.reserve(j.size());
      for (size_t i = 0; i < j.size(); ++i) {
        Value v;
        if (!convert(j[i], v, where + "[" + std::to_string(i) + "]", error, depth + 1))
          return false;
        a.push_back(std::move(v));
      }
      out = Value(std::move(a));
      return true;
    }
    case JSON::value_t::object: {
      if (j.size() == 1 && j.contains("$data")) {
        const JSON& hex = j["$data"];
        if (!hex.is_string()) return fail(error, where + ": $data is not a string");
        auto bytes = fromHex(hex.get_ref<const std::string&>());
        if (!bytes) return fail(error, where + ": $data is not even-length hexadecimal");
        out = Value(Data(bytes->begin(), bytes->end()));
        return true;
      }
      Dictionary d;
      for (auto it = j.begin(); it != j.end(); ++it) {
        Value v;
        if (!convert(it.value(), v, where + "." + it.key(), error, depth + 1)) return false;
        d.set(it.key(), std::move(v));
      }
      out = Value(std::move(d));
      return true;
    }
    case JSON::value_t::null:
      return fail(error, where + ": null has no value");
    default:
      return fail(error, where + ": unsupported JSON value");
  }
}

}  // namespace

std::optional<Value> valueFromJSON(const JSON& json, std::string* error) {
  Value v;
  if (!convert(json, v, "$", error)) return std::nullopt;
  return v;
}

std::optional<Value> parseValueJSON(std::string_view text, std::string* error) {
  JSON j = JSON::parse(text, nullptr, false);
  if (j.is_discarded()) {
    if (error) *error = "not valid JSON";
    return std::nullopt;
  }
  return valueFromJSON(j, error);
}

}  // namespace kolvrand
