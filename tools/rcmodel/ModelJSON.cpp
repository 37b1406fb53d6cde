#include "tools/rcmodel/ModelJSON.h"

#include <charconv>
#include <cmath>
#include <limits>
#include <nlohmann/json.hpp>

#include "model/OTAParamRC.h"

namespace kolvrand::rcmodel {

namespace {

using JSON = nlohmann::ordered_json;

template <typename T>
std::string shortest(T value) {
  char buffer[64];
  auto result = std::to_chars(buffer, buffer + sizeof buffer, value);
  return std::string(buffer, result.ptr);
}

void renderNumber(std::string& out, const Number& n) {
  switch (n.kind()) {
    case Number::Kind::Signed:
      out += std::to_string(n.int64Value());
      return;
    case Number::Kind::Unsigned:
      out += std::to_string(n.uint64Value());
      return;
    case Number::Kind::Float:
      out += floatJSON(n.floatValue());
      return;
    case Number::Kind::Double: {
      const double d = n.doubleValue();
      if (std::isnan(d) || std::isinf(d) || (d == 0 && std::signbit(d)))
        out += floatJSON(static_cast<float>(d));
      else
        out += shortest(d);
      return;
    }
  }
}

void renderString(std::string& out, std::string_view s) {
  out += JSON(s).dump(-1, ' ', false, JSON::error_handler_t::replace);
}

void render(const Value& value, std::string& out) {
  static constexpr ValueTextStyle kJSON{",", ":", "\"", "\"", renderNumber, renderString};
  renderValue(out, value, kJSON);
}

// Builds a Value from the parser's events, keeping the path of every value
// for the error message and the exact text of every non-integer number.
class ValueBuilder : public nlohmann::json_sax<JSON> {
 public:
  std::optional<Value> root;
  JSONError error;

  bool null() override { return fail("null is no value here; leave the key out instead"); }
  bool boolean(bool value) override { return add(Value(value)); }
  bool number_integer(number_integer_t value) override {
    return add(Value(Number::fromSigned(value)));
  }
  bool number_unsigned(number_unsigned_t value) override {
    return add(Value(Number::fromUnsigned(value)));
  }
  bool number_float(number_float_t value, const string_t& text) override {
    if (!std::isfinite(value)) return fail("the number " + text + " is out of range");
    // The float nearest to the decimal text, rounded once; the parser's double
    // rounded to a float could differ in the last bit.
    float f = 0;
    auto [end, ec] = std::from_chars(text.data(), text.data() + text.size(), f);
    if (ec == std::errc() && end == text.data() + text.size())
      return add(Value(Number::fromFloat(f)));
    return add(Value(Number::fromDouble(value)));
  }
  bool string(string_t& value) override {
    if (value == "NaN")
      return add(Value(Number::fromFloat(std::numeric_limits<float>::quiet_NaN())));
    if (value == "Infinity")
      return add(Value(Number::fromFloat(std::numeric_limits<float>::infinity())));
    if (value == "-Infinity")
      return add(Value(Number::fromFloat(-std::numeric_limits<float>::infinity())));
    return add(Value(std::move(value)));
  }
  bool binary(binary_t&) override { return fail("binary values are not JSON"); }

  bool start_object(std::size_t) override { return open(Value(Dictionary())); }
  bool key(string_t& key) override {
    Frame& f = frames_.back();
    if (f.value.asDictionary()->find(key)) {
      f.key = key;
      return fail("the key appears twice");
    }
    f.key = std::move(key);
    return true;
  }
  bool end_object() override { return close(); }
  bool start_array(std::size_t) override { return open(Value(Array())); }
  bool end_array() override { return close(); }

  bool parse_error(std::size_t position, const std::string&,
                   const nlohmann::detail::exception& e) override {
    // The library's text, without its "[json.exception.parse_error.101] ".
    std::string what = e.what();
    if (what.starts_with("[json.exception.")) {
      if (auto at = what.find("] "); at != std::string::npos) what = what.substr(at + 2);
    }
    error = {"$", "not valid JSON: " + what + " (byte " + std::to_string(position) + ")"};
    return false;
  }

 private:
  struct Frame {
    Value value;
    std::string path;
    std::string key;  // objects: the key of the value to come
    size_t index;     // arrays: the index of the value to come
  };

  std::string currentPath() const {
    if (frames_.empty()) return "$";
    const Frame& f = frames_.back();
    if (f.value.isArray()) return f.path + "[" + std::to_string(f.index) + "]";
    return f.path + "." + f.key;
  }

  bool fail(std::string reason) {
    error = {currentPath(), std::move(reason)};
    return false;
  }

  bool add(Value value) {
    if (frames_.empty()) {
      root = std::move(value);
      return true;
    }
    Frame& f = frames_.back();
    if (Array* array = f.value.asArray()) {
      array->push_back(std::move(value));
      ++f.index;
    } else {
      f.value.asDictionary()->set(f.key, std::move(value));
    }
    return true;
  }

  // A model nests three deep; the bound keeps a hostile file from building a
  // Value too deep to destroy on the stack.
  bool open(Value container) {
    constexpr size_t kMaxDepth = 64;
    if (frames_.size() == kMaxDepth)
      return fail("nested deeper than " + std::to_string(kMaxDepth) + " levels");
    frames_.push_back({std::move(container), currentPath(), {}, 0});
    return true;
  }

  bool close() {
    Value done = std::move(frames_.back().value);
    frames_.pop_back();
    return add(std::move(done));
  }

  std::vector<Frame> frames_;
};

// "$" or "$[2]" followed by a path within a message ("R0.resistance25C[3]").
std::string below(std::string root, const std::string& path) {
  if (path.empty()) return root;
  return root + (path.front() == '[' ? "" : ".") + path;
}

}  // namespace

std::string floatJSON(float value) {
  if (std::isnan(value)) return "\"NaN\"";
  if (std::isinf(value)) return value > 0 ? "\"Infinity\"" : "\"-Infinity\"";
  if (value == 0 && std::signbit(value)) return "-0.0";
  return shortest(value);
}

std::string renderJSON(const Value& value) {
  std::string out;
  render(value, out);
  return out;
}

std::optional<Value> parseJSON(std::string_view text, JSONError* error) {
  ValueBuilder builder;
  const bool ok = JSON::sax_parse(text, &builder);
  if (!ok || !builder.root) {
    if (error) *error = builder.error;
    return std::nullopt;
  }
  return std::move(builder.root);
}

std::optional<std::vector<std::shared_ptr<OTAParamRC>>> modelsFromJSON(std::string_view text,
                                                                       bool single,
                                                                       JSONError* error) {
  auto fail = [&](std::string path, std::string reason) {
    if (error) *error = {std::move(path), std::move(reason)};
    return std::nullopt;
  };
  std::optional<Value> value = parseJSON(text, error);
  if (!value) return std::nullopt;

  std::vector<std::pair<std::string, const Value*>> objects;
  if (value->isDictionary()) {
    objects.emplace_back("$", &*value);
  } else if (value->isArray() && !single) {
    const Array& array = *value->asArray();
    for (size_t i = 0; i < array.size(); ++i)
      objects.emplace_back("$[" + std::to_string(i) + "]", &array[i]);
  } else {
    return fail("$", single ? "expected one object (one OTAParamRC message)"
                            : "expected an object (one model) or an array of objects");
  }

  std::vector<std::shared_ptr<OTAParamRC>> models;
  for (const auto& [path, object] : objects) {
    DictionaryError why;
    auto model = OTAParamRC::fromDictionary(*object, &why);
    if (!model) return fail(below(path, why.path), why.reason);
    models.push_back(std::move(model));
  }
  return models;
}

}  // namespace kolvrand::rcmodel
