// SPDX-License-Identifier: MIT
// JSON text as a Value, the one way every file of the system (a device
// description, a model written by hand) is read into values. Strings,
// booleans, arrays and objects map onto themselves (objects keep their
// order); an object that is only {"$data": "HEX"} is a byte string.
//
// The number rule: a number that is an integer, however written (12, 1.2e1,
// 12.0), is an integer of exactly its value when it fits 64 bits (signed up
// to INT64_MAX, unsigned above); any other number is the 32-bit float nearest
// to its decimal text when it is within a float's range (else a double, which
// a float field rounds or refuses, and never zero for a number that is not);
// negative zero is a float; the strings "NaN", "Infinity" and "-Infinity" are
// floats. Null, a repeated key, more than 256 keys in one object, nesting
// deeper than 64 and numbers beyond any range are errors.
#pragma once

#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include <nlohmann/json.hpp>

#include "base/Value.h"

namespace kolvrand {

using JSON = nlohmann::ordered_json;

// The conversion, as events of the library's parser: JSON::sax_parse(text,
// &reader). Readers that must refuse a text early (by what its values would
// take once encoded) override admit().
class ValueReader : public nlohmann::json_sax<JSON> {
 public:
  std::optional<Value> root;
  ValueError error;  // path "$" and below
  // Where the text is one line of several (JSON Lines): its number, for the
  // parser's locations, which count from the slice it was given.
  size_t line = 1;
  // The text being parsed, to place a syntax error in.
  std::string_view slice;
  // Added to a syntax error after a whole first value.
  std::string afterWholeValue;
  // Set to a value's path to find the number there as written; nothing is
  // kept then, and the parse ends once it is found.
  std::optional<std::string> wantedPath;
  std::string writtenText;
  // When set, each element of an array at the top is handed over as soon as
  // it is complete instead of being kept; false stops the parse (with
  // `error` set by the taker).
  std::function<bool(Value&&, const std::string& path)> takeElement;

  bool null() override;
  bool boolean(bool value) override { return add(Value(value)); }
  bool number_integer(number_integer_t value) override;
  bool number_unsigned(number_unsigned_t value) override;
  bool number_float(number_float_t value, const string_t& text) override;
  bool string(string_t& value) override;
  bool binary(binary_t&) override { return fail("binary values are not JSON"); }
  bool start_object(std::size_t) override { return open(Value(Dictionary())); }
  bool key(string_t& key) override;
  bool end_object() override { return close(); }
  bool start_array(std::size_t) override { return open(Value(Array())); }
  bool end_array() override { return close(); }
  bool parse_error(std::size_t read, const std::string& token,
                   const nlohmann::detail::exception&) override;

 protected:
  // Called for each value before it is kept, and for each array or object
  // as it opens (`opening`, then empty); false after fail() ends the parse.
  virtual bool admit(const Value&, bool /*opening*/) { return true; }
  bool fail(std::string reason);
  // How many arrays and objects enclose the value coming, and whether the
  // innermost is an array.
  size_t depth() const { return frames_.size(); }
  bool inArray() const { return !frames_.empty() && frames_.back().value.isArray(); }

 private:
  struct Frame {
    Value value;
    std::string path;
    std::string key;  // objects: the key of the value to come
    size_t index;     // arrays: the index of the value to come; objects: keys seen
  };
  std::string currentPath() const;
  bool add(Value value);
  bool open(Value container);
  bool close();

  std::vector<Frame> frames_;
  bool complete_ = false;  // a whole value has been read
};

// The whole text as one value; nullopt with *error set.
std::optional<Value> parseJSON(std::string_view text, ValueError* error = nullptr);

// A value of a document already parsed, by the same rule: from its text as
// the library writes it, which reads back to the same numbers. The document
// must be no deeper than the conversion allows (see jsonDepthLimit).
std::optional<Value> valueFromJSON(const JSON& json, ValueError* error = nullptr);

// A parser callback for JSON::parse that notes, in *tooDeep, a document
// nested so deep that its values could not be converted, and stops building
// it, so that valueFromJSON is never handed one.
JSON::parser_callback_t jsonDepthLimit(bool* tooDeep);

}  // namespace kolvrand
