// SPDX-License-Identifier: MIT
#include "tools/rcmodel/ModelJSON.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <cstdlib>
#include <functional>
#include <limits>
#include <nlohmann/json.hpp>

#include "base/Utf8.h"
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
  // The keys and enum names of a model need no escapes; anything else goes
  // through the library's escaping (control characters as \u00XX, bytes that
  // are no UTF-8 replaced).
  if (std::all_of(s.begin(), s.end(),
                  [](char c) { return c >= 0x20 && c < 0x7f && c != '"' && c != '\\'; })) {
    out += '"';
    out += s;
    out += '"';
    return;
  }
  out += JSON(s).dump(-1, ' ', false, JSON::error_handler_t::replace);
}

void render(const Value& value, std::string& out) {
  static constexpr ValueTextStyle kJSON{",", ":", "\"", "\"", renderNumber, renderString};
  renderValue(out, value, kJSON);
}

// What a JSON number's text says exactly, which its double may not: whether
// it is an integer (1e9, 4294967295.0 and 123456789e0 are) and, when that
// fits 64 bits, its magnitude; whether it is zero.
struct NumberText {
  bool negative = false;
  bool zero = false;
  bool integer = false;
  bool fits = false;  // an integer of magnitude at most UINT64_MAX
  uint64_t magnitude = 0;
};

NumberText readNumberText(std::string_view text) {
  NumberText t;
  size_t i = 0;
  const auto digit = [&] { return i < text.size() && text[i] >= '0' && text[i] <= '9'; };
  if (i < text.size() && text[i] == '-') t.negative = true, ++i;
  std::string_view whole, fraction;
  size_t start = i;
  while (digit()) ++i;
  whole = text.substr(start, i - start);
  if (i < text.size() && text[i] == '.') {
    start = ++i;
    while (digit()) ++i;
    fraction = text.substr(start, i - start);
  }
  // The exponent saturates far beyond any digit count a text can have.
  int64_t exponent = 0;
  if (i < text.size() && (text[i] == 'e' || text[i] == 'E')) {
    ++i;
    const bool down = i < text.size() && text[i] == '-';
    if (i < text.size() && (text[i] == '-' || text[i] == '+')) ++i;
    for (; digit(); ++i)
      exponent = std::min<int64_t>(exponent * 10 + (text[i] - '0'), 1'000'000'000'000);
    if (down) exponent = -exponent;
  }
  // The significant digits, whole and fraction run together, without the
  // zeros before the first and after the last that is not 0.
  std::string digits = std::string(whole) + std::string(fraction);
  exponent -= static_cast<int64_t>(fraction.size());
  const size_t first = digits.find_first_not_of('0');
  if (first == std::string::npos) {
    t.zero = t.integer = t.fits = true;
    return t;
  }
  const size_t last = digits.find_last_not_of('0');
  exponent += static_cast<int64_t>(digits.size() - 1 - last);
  digits = digits.substr(first, last + 1 - first);
  t.integer = exponent >= 0;
  if (!t.integer || static_cast<int64_t>(digits.size()) + exponent > 20) return t;
  uint64_t v = 0;
  for (char c : digits)
    if (__builtin_mul_overflow(v, 10, &v) || __builtin_add_overflow(v, uint64_t(c - '0'), &v))
      return t;
  for (int64_t e = 0; e < exponent; ++e)
    if (__builtin_mul_overflow(v, 10, &v)) return t;
  t.fits = true;
  t.magnitude = v;
  return t;
}

constexpr size_t kMaxKeys = 256;

// Builds a Value from the parser's events, keeping the path of every value
// for the error message. Every integer, however it is written, becomes an
// integer Value of its exact value; any other number the 32-bit float nearest
// to its text. What the values will take once encoded is counted as they come
// (at least four bytes for a float of a list, one for any other value), so
// that a text that cannot fit a model file is refused before its Value grows.
class ValueBuilder : public nlohmann::json_sax<JSON> {
 public:
  std::optional<Value> root;
  JSONError error;
  // Where the text is one line of several (JSON Lines): its number, for the
  // parser's locations, which count from the slice it was given.
  size_t line = 1;
  // The text being parsed, to place a syntax error in.
  std::string_view slice;
  // Set to a value's path to find the number there as written; nothing is
  // kept then, and the parse ends once it is found.
  std::optional<std::string> wantedPath;
  std::string writtenText;
  // When set, each element of an array at the top is handed over as soon as
  // it is complete instead of being kept; false stops the parse (with
  // `error` set by the taker).
  std::function<bool(Value&&, const std::string& path)> takeElement;
  // The least bytes the value being built will take encoded, and the most it
  // may (the caller lowers it by what it has already written); past it,
  // `tooLarge` is the reason.
  size_t cost = 0;
  size_t maxCost = SIZE_MAX;
  std::string tooLarge;
  // The values of the model being built, and the most a model within the
  // budget can hold, which bounds what keys of empty lists could pile up.
  size_t items = 0;
  size_t maxItems = SIZE_MAX;
  std::string tooMany;

  bool null() override { return fail("null is no value here; leave the key out instead"); }
  bool boolean(bool value) override { return add(Value(value)); }
  bool number_integer(number_integer_t value) override {
    return add(Value(Number::fromSigned(value)));
  }
  bool number_unsigned(number_unsigned_t value) override {
    return add(Value(Number::fromUnsigned(value)));
  }
  bool number_float(number_float_t value, const string_t& text) override {
    if (wantedPath && currentPath() == *wantedPath) {
      writtenText = text;
      return false;
    }
    const NumberText t = readNumberText(text);
    // Negative zero stays a float, so that a float field keeps its sign; an
    // integer field takes it as 0.
    if (t.zero) return add(t.negative ? Number::fromFloat(-0.0f) : Number::fromUnsigned(0));
    if (t.fits && !t.negative) return add(Value(Number::fromUnsigned(t.magnitude)));
    if (t.fits && t.magnitude <= uint64_t{1} << 63)
      return add(Value(Number::fromSigned(static_cast<int64_t>(0 - t.magnitude))));
    if (!std::isfinite(value)) return fail("the number " + text + " is out of range");
    // The float nearest to the decimal text, rounded once; the parser's double
    // rounded to a float could differ in the last bit.
    float f = 0;
    auto [end, ec] = std::from_chars(text.data(), text.data() + text.size(), f);
    if (ec == std::errc() && end == text.data() + text.size() && f != 0)
      return add(Value(Number::fromFloat(f)));
    // Beyond a float's range, or so small that it rounds to zero: a number
    // that is not zero never reads as zero, which an integer field would take.
    const double d = value != 0 ? value
                                : std::copysign(std::numeric_limits<double>::denorm_min(),
                                                t.negative ? -1.0 : 1.0);
    return add(Value(Number::fromDouble(d)));
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
    if (wantedPath) {
      f.key = std::move(key);
      return true;
    }
    // A model has 45 keys at most; the bound keeps the test for a repeated
    // key from taking time that grows with the square of their number.
    if (++f.index > kMaxKeys) {
      f.key = std::move(key);
      return fail("more than " + std::to_string(kMaxKeys) + " keys in one object");
    }
    if (f.value.asDictionary()->find(key)) {
      f.key = std::move(key);
      return fail("the key appears twice");
    }
    f.key = std::move(key);
    return true;
  }
  bool end_object() override { return close(); }
  bool start_array(std::size_t) override { return open(Value(Array())); }
  bool end_array() override { return close(); }

  // The library's words change between its versions: only where it stopped
  // is taken from it (the count of the bytes it read, the stray byte the
  // last), said as a line and column of the whole text.
  bool parse_error(std::size_t read, const std::string& token,
                   const nlohmann::detail::exception&) override {
    const std::string_view before = slice.substr(0, read ? std::min(read - 1, slice.size()) : 0);
    const size_t lastLineFeed = before.rfind('\n');
    const size_t column =
        lastLineFeed == std::string_view::npos ? before.size() + 1 : before.size() - lastLineFeed;
    std::string what =
        "at line " + std::to_string(line + static_cast<size_t>(std::ranges::count(before, '\n'))) +
        ", column " + std::to_string(column) + ": syntax error at \"" + visibleText(token) + "\"";
    // A second value after a whole first one (objects one after the other,
    // printed over several lines each) is the likeliest cause.
    if (complete_)
      what +=
          "; several models are read as an array of objects or as one object a line "
          "(JSON Lines, as rcmodel decode prints them)";
    error = {"$", "not valid JSON: " + what};
    return false;
  }

 private:
  struct Frame {
    Value value;
    std::string path;
    std::string key;  // objects: the key of the value to come
    size_t index;     // arrays: the index of the value to come; objects: keys seen
  };

  std::string currentPath() const {
    if (frames_.empty()) return "$";
    const Frame& f = frames_.back();
    if (f.value.isArray()) return f.path + "[" + std::to_string(f.index) + "]";
    return below(f.path, dictionaryPathKey(f.key));
  }

  bool fail(std::string reason) {
    error = {currentPath(), std::move(reason)};
    return false;
  }

  bool add(Value value) {
    if (++items > maxItems) return fail(tooMany);
    if (frames_.empty()) {
      complete_ = true;
      if (!wantedPath) root = std::move(value);
      return true;
    }
    Frame& f = frames_.back();
    if (Array* array = f.value.asArray()) {
      // A model at the top takes its length and its chemID, four bytes.
      cost += value.isNumber() || (frames_.size() == 1 && value.isDictionary()) ? 4 : 1;
      if (cost > maxCost) return fail(tooLarge);
      if (frames_.size() == 1 && takeElement) {
        const std::string path = currentPath();
        ++f.index;
        return takeElement(std::move(value), path);
      }
      if (!wantedPath) array->push_back(std::move(value));
      ++f.index;
    } else {
      cost += value.isArray() ? 0 : 1;
      if (cost > maxCost) return fail(tooLarge);
      if (!wantedPath) f.value.asDictionary()->set(f.key, std::move(value));
    }
    return true;
  }

  // A model nests three deep; the bound keeps a hostile file from building a
  // Value too deep to destroy on the stack.
  bool open(Value container) {
    constexpr size_t kMaxDepth = 64;
    if (frames_.size() == kMaxDepth)
      return fail("nested deeper than " + std::to_string(kMaxDepth) + " levels");
    if (frames_.empty() && container.isDictionary() && (cost += 4) > maxCost) return fail(tooLarge);
    frames_.push_back({std::move(container), currentPath(), {}, 0});
    return true;
  }

  bool close() {
    Value done = std::move(frames_.back().value);
    frames_.pop_back();
    return add(std::move(done));
  }

  std::vector<Frame> frames_;
  bool complete_ = false;  // a whole value has been read
};

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

std::string below(const std::string& root, const std::string& path) {
  if (path.empty()) return root;
  return root + (path.front() == '[' ? "" : ".") + path;
}

namespace {

// The number at `path` of `text` as written, when there is one that is not
// an integer literal; nothing of the text is kept meanwhile.
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

bool isBlank(std::string_view line) {
  return line.find_first_not_of(" \t\r") == std::string_view::npos;
}

// The non-blank lines of a text, one at a time.
class Lines {
 public:
  explicit Lines(std::string_view text) : text_(text) {}
  // The next non-blank line and its number; false at the end.
  bool next(std::string_view* line, size_t* number) {
    while (start_ < text_.size()) {
      size_t end = text_.find('\n', start_);
      if (end == std::string_view::npos) end = text_.size();
      *line = text_.substr(start_, end - start_);
      *number = ++number_;
      start_ = end + 1;
      if (!isBlank(*line)) return true;
    }
    return false;
  }

 private:
  std::string_view text_;
  size_t start_ = 0;
  size_t number_ = 0;
};

// Whether a text is JSON Lines: a first non-blank line that is a JSON value
// by itself, and a second one after it.
bool isJSONLines(std::string_view text) {
  Lines lines(text);
  std::string_view first, second;
  size_t number = 0;
  return lines.next(&first, &number) && lines.next(&second, &number) && JSON::accept(first);
}

}  // namespace

std::optional<Value> parseJSON(std::string_view text, JSONError* error) {
  ValueBuilder builder;
  builder.slice = text;
  if (!JSON::sax_parse(text, &builder) || !builder.root) {
    if (error) *error = builder.error;
    return std::nullopt;
  }
  return std::move(builder.root);
}

bool forEachModelInJSON(std::string_view text, bool single, const ModelBudget& budget,
                        JSONError* error, const TakeModel& take) {
  auto fail = [&](std::string path, std::string reason) {
    if (error) *error = {std::move(path), std::move(reason)};
    return false;
  };
  // The parser would end the text at a NUL byte and never look further.
  if (size_t nul = text.find('\0'); nul != std::string_view::npos)
    return fail("$", "not valid JSON: a NUL byte at " + lineColumn(text, nul));

  const std::string tooLarge = "with this model the file would be larger than the " +
                               std::to_string(budget.limit) +
                               "-byte limit of a model file, which the daemon refuses";
  size_t models = 0;
  // One model's value: imported, handed over, and dropped. `where` is its
  // path in the whole text; `text` what to look a number up in.
  const auto import = [&](const Value& value, const std::string& where, std::string_view within,
                          const std::string& path) {
    DictionaryError why;
    auto model = OTAParamRC::fromDictionary(value, &why);
    if (!model) {
      // A number the reason names is shown as it was written.
      std::string reason = why.reason;
      if (!why.number.empty()) {
        if (auto at = reason.find(why.number); at != std::string::npos) {
          if (auto written = writtenNumber(within, below(path, why.path)))
            reason.replace(at, why.number.size(), *written);
        }
      }
      return fail(below(where, why.path), reason);
    }
    ++models;
    JSONError taken;
    if (!take(std::move(model), &taken)) return fail(where, taken.reason);
    return true;
  };
  const auto prepare = [&](ValueBuilder& builder) {
    if (!budget.used) return;
    builder.tooLarge = tooLarge;
    builder.maxCost = *budget.used < budget.limit ? budget.limit - *budget.used : 0;
    // Floats take four bytes at least, and a model has some thousand keys
    // and single values besides.
    builder.tooMany = "holds more values than a model within the " + std::to_string(budget.limit) +
                      "-byte limit of a model file can";
    builder.maxItems = budget.limit / 4 + 4096;
  };

  if (isJSONLines(text)) {
    // Each line is a model, and none takes less than four bytes (its length,
    // and its chemID, always written): a text of too many lines is refused
    // before a line is read.
    if (budget.used) {
      const size_t count = static_cast<size_t>(std::count_if(text.begin(), text.end(),
                                                             [](char c) { return c == '\n'; })) +
                           1;
      size_t lineModels = 0;
      if (count > budget.limit / 4) {
        Lines all(text);
        std::string_view line;
        size_t number = 0;
        while (all.next(&line, &number)) ++lineModels;
      }
      if (lineModels > (budget.limit - std::min(budget.limit, *budget.used)) / 4)
        return fail("$", "holds " + std::to_string(lineModels) +
                             " models, one a line, of at least 4 bytes each once encoded: more "
                             "than the " +
                             std::to_string(budget.limit) +
                             "-byte limit of a model file, which the daemon refuses");
    }
    Lines lines(text);
    std::string_view line;
    size_t number = 0;
    bool first = true;
    while (lines.next(&line, &number)) {
      const std::string where = "line " + std::to_string(number) + ": $";
      if (single && !first)
        return fail("$", "expected one object (one OTAParamRC message), got line " +
                             std::to_string(number) + " after it");
      first = false;
      ValueBuilder builder;
      builder.line = number;
      builder.slice = line;
      prepare(builder);
      if (!JSON::sax_parse(line, &builder) || !builder.root) {
        // A syntax error names its line in the text.
        if (error) *error = builder.error;
        if (error && !error->reason.starts_with("not valid JSON"))
          error->path = "line " + std::to_string(number) + ": " + error->path;
        return false;
      }
      if (!builder.root->isDictionary())
        return fail(where, "expected an object (one model) on each line");
      if (!import(*builder.root, where, line, "$")) return false;
    }
    return true;
  }

  ValueBuilder builder;
  prepare(builder);
  // An array's objects are imported one by one as the parser completes them.
  if (!single) {
    builder.takeElement = [&](Value&& element, const std::string& path) {
      if (!import(element, path, text, path)) {
        builder.error = error ? *error : JSONError{};
        return false;
      }
      builder.cost = builder.items = 0;
      prepare(builder);
      return true;
    };
  }
  builder.slice = text;
  if (!JSON::sax_parse(text, &builder) || !builder.root) {
    if (error) *error = builder.error;
    return false;
  }
  if (builder.root->isDictionary()) return import(*builder.root, "$", text, "$");
  if (!builder.root->isArray() || single)
    return fail("$", single ? "expected one object (one OTAParamRC message)"
                            : "expected an object (one model), an array of objects or one "
                              "object per line");
  if (models == 0)
    return fail("$", "holds no model; a model file holds at least one OTAParamRC message");
  return true;
}

std::optional<std::vector<std::shared_ptr<OTAParamRC>>> modelsFromJSON(std::string_view text,
                                                                       bool single,
                                                                       JSONError* error) {
  std::vector<std::shared_ptr<OTAParamRC>> models;
  if (!forEachModelInJSON(text, single, {}, error, [&](std::shared_ptr<OTAParamRC> m, JSONError*) {
        models.push_back(std::move(m));
        return true;
      }))
    return std::nullopt;
  return models;
}

}  // namespace kolvrand::rcmodel
