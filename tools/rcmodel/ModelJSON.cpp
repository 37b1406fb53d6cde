#include "tools/rcmodel/ModelJSON.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <cstdlib>
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
  // Where the text is one line of several (JSON Lines): its number, for the
  // parser's locations, which count from the slice it was given.
  size_t line = 1;
  // Set to a value's path to have the number there kept as written.
  std::optional<std::string> wantedPath;
  std::string writtenText;

  bool null() override { return fail("null is no value here; leave the key out instead"); }
  bool boolean(bool value) override { return add(Value(value)); }
  bool number_integer(number_integer_t value) override {
    return add(Value(Number::fromSigned(value)));
  }
  bool number_unsigned(number_unsigned_t value) override {
    return add(Value(Number::fromUnsigned(value)));
  }
  bool number_float(number_float_t value, const string_t& text) override {
    if (wantedPath && currentPath() == *wantedPath) writtenText = text;
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

  bool parse_error(std::size_t, const std::string&, const nlohmann::detail::exception& e) override {
    // The library's text, without its "[json.exception.parse_error.101] ".
    std::string what = e.what();
    if (what.starts_with("[json.exception.")) {
      if (auto at = what.find("] "); at != std::string::npos) what = what.substr(at + 2);
    }
    // "parse error at line 1, column 4: ..." counts from the line given.
    constexpr std::string_view kAtLine = "at line ";
    if (auto at = what.find(kAtLine); at != std::string::npos && line > 1) {
      const size_t digits = at + kAtLine.size();
      const size_t end = what.find(',', digits);
      if (end != std::string::npos) {
        const size_t inSlice = std::strtoul(what.c_str() + digits, nullptr, 10);
        what.replace(digits, end - digits, std::to_string(line - 1 + inSlice));
      }
    }
    error = {"$", "not valid JSON: " + what};
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

namespace {

std::optional<Value> parseJSONLine(std::string_view text, size_t line, JSONError* error) {
  ValueBuilder builder;
  builder.line = line;
  const bool ok = JSON::sax_parse(text, &builder);
  if (!ok || !builder.root) {
    if (error) *error = builder.error;
    return std::nullopt;
  }
  return std::move(builder.root);
}

// The number at `path` of `text` as written, when there is one that is not
// an integer.
std::optional<std::string> writtenNumber(std::string_view text, const std::string& path) {
  ValueBuilder builder;
  builder.wantedPath = path;
  JSON::sax_parse(text, &builder);
  if (builder.writtenText.empty()) return std::nullopt;
  return builder.writtenText;
}

std::string lineColumn(std::string_view text, size_t offset) {
  const size_t lineStart = text.rfind('\n', offset == 0 ? 0 : offset - 1);
  const size_t line =
      1 + static_cast<size_t>(std::count(text.begin(), text.begin() + offset, '\n'));
  const size_t column = lineStart == std::string_view::npos ? offset + 1 : offset - lineStart;
  return "line " + std::to_string(line) + ", column " + std::to_string(column);
}

struct Line {
  size_t number;
  std::string_view text;
};

// The non-blank lines of `text` when it is JSON Lines: a first line that is a
// JSON value by itself, and more after it. Empty for any other text.
std::vector<Line> jsonLines(std::string_view text) {
  std::vector<Line> lines;
  size_t number = 1;
  for (size_t start = 0; start < text.size(); ++number) {
    size_t end = text.find('\n', start);
    if (end == std::string_view::npos) end = text.size();
    std::string_view line = text.substr(start, end - start);
    if (line.find_first_not_of(" \t\r") != std::string_view::npos) lines.push_back({number, line});
    start = end + 1;
  }
  if (lines.size() < 2 || !JSON::accept(lines.front().text)) return {};
  return lines;
}

}  // namespace

std::optional<Value> parseJSON(std::string_view text, JSONError* error) {
  return parseJSONLine(text, 1, error);
}

std::optional<std::vector<std::shared_ptr<OTAParamRC>>> modelsFromJSON(std::string_view text,
                                                                       bool single,
                                                                       JSONError* error) {
  auto fail = [&](std::string path, std::string reason) {
    if (error) *error = {std::move(path), std::move(reason)};
    return std::nullopt;
  };
  // The parser would end the text at a NUL byte and never look further.
  if (size_t nul = text.find('\0'); nul != std::string_view::npos)
    return fail("$", "not valid JSON: a NUL byte at " + lineColumn(text, nul));

  // The texts of the models with where each one is: the path in the whole
  // text, or the line and its path.
  struct Text {
    std::string where;
    std::string_view text;
    std::optional<Value> value;
  };
  std::vector<Text> texts;
  if (std::vector<Line> lines = jsonLines(text); !lines.empty()) {
    if (single)
      return fail("$", "expected one object (one OTAParamRC message), got line " +
                           std::to_string(lines[1].number) + " after it");
    for (const Line& line : lines) {
      auto value = parseJSONLine(line.text, line.number, error);
      if (!value) return std::nullopt;
      texts.push_back({"line " + std::to_string(line.number) + ": $", line.text, std::move(value)});
    }
  } else {
    auto value = parseJSON(text, error);
    if (!value) return std::nullopt;
    texts.push_back({"$", text, std::move(value)});
  }

  // (where, text, object): the objects to import.
  struct Object {
    std::string where;
    std::string_view text;
    std::string path;  // of the object within its text
    const Value* value;
  };
  std::vector<Object> objects;
  for (const Text& t : texts) {
    if (t.value->isDictionary()) {
      objects.push_back({t.where, t.text, "$", &*t.value});
    } else if (t.value->isArray() && !single && texts.size() == 1) {
      const Array& array = *t.value->asArray();
      for (size_t i = 0; i < array.size(); ++i) {
        const std::string path = "$[" + std::to_string(i) + "]";
        objects.push_back({path, t.text, path, &array[i]});
      }
    } else {
      return fail(t.where, single ? "expected one object (one OTAParamRC message)"
                           : texts.size() > 1
                               ? "expected an object (one model) on each line"
                               : "expected an object (one model), an array of objects or one "
                                 "object per line");
    }
  }
  if (objects.empty())
    return fail("$", "holds no model; a model file holds at least one OTAParamRC message");

  std::vector<std::shared_ptr<OTAParamRC>> models;
  for (const Object& o : objects) {
    DictionaryError why;
    auto model = OTAParamRC::fromDictionary(*o.value, &why);
    if (!model) {
      // A number beyond a field's range is shown as it was written.
      std::string reason = why.reason;
      if (auto at = reason.find(" is out of range for "); at != std::string::npos) {
        if (auto written = writtenNumber(o.text, below(o.path, why.path)))
          reason.replace(0, at, *written);
      }
      return fail(below(o.where, why.path), reason);
    }
    models.push_back(std::move(model));
  }
  return models;
}

}  // namespace kolvrand::rcmodel
