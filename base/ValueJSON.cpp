// SPDX-License-Identifier: MIT
#include "base/ValueJSON.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <cstdint>
#include <limits>

#include "base/Hex.h"
#include "base/Utf8.h"

namespace kolvrand {

namespace {

// The quadratic test for a repeated key stays cheap; a model has 45 keys.
constexpr size_t kMaxKeys = 256;
// Values this deep are still destroyed on the stack without harm.
constexpr size_t kMaxDepth = 64;

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

Number integer(uint64_t magnitude) {
  return magnitude > static_cast<uint64_t>(INT64_MAX)
             ? Number::fromUnsigned(magnitude)
             : Number::fromSigned(static_cast<int64_t>(magnitude));
}

}  // namespace

bool ValueReader::null() {
  return fail("null is no value here; leave the key out instead");
}

bool ValueReader::number_integer(number_integer_t value) {
  return add(Value(Number::fromSigned(value)));
}

bool ValueReader::number_unsigned(number_unsigned_t value) {
  return add(Value(integer(value)));
}

bool ValueReader::number_float(number_float_t value, const string_t& text) {
  if (wantedPath && currentPath() == *wantedPath) {
    writtenText = text;
    return false;
  }
  const NumberText t = readNumberText(text);
  // Negative zero stays a float, so that a float field keeps its sign; an
  // integer field takes it as 0.
  if (t.zero) return add(t.negative ? Number::fromFloat(-0.0f) : Number::fromSigned(0));
  if (t.fits && !t.negative) return add(Value(integer(t.magnitude)));
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

bool ValueReader::string(string_t& value) {
  constexpr float kInf = std::numeric_limits<float>::infinity();
  if (value == "NaN") return add(Value(Number::fromFloat(std::numeric_limits<float>::quiet_NaN())));
  if (value == "Infinity") return add(Value(Number::fromFloat(kInf)));
  if (value == "-Infinity") return add(Value(Number::fromFloat(-kInf)));
  return add(Value(std::move(value)));
}

bool ValueReader::key(string_t& key) {
  Frame& f = frames_.back();
  const bool repeated = !wantedPath && f.value.asDictionary()->find(key);
  const bool tooMany = !wantedPath && ++f.index > kMaxKeys;
  f.key = std::move(key);
  if (tooMany) return fail("more than " + std::to_string(kMaxKeys) + " keys in one object");
  if (repeated) return fail("the key appears twice");
  return true;
}

// The library's words change between its versions: only where it stopped is
// taken from it (the count of the bytes it read, the stray byte the last),
// said as a line and column of the whole text.
bool ValueReader::parse_error(std::size_t read, const std::string& token,
                              const nlohmann::detail::exception&) {
  const std::string_view before = slice.substr(0, read ? std::min(read - 1, slice.size()) : 0);
  const size_t lastLineFeed = before.rfind('\n');
  const size_t column =
      lastLineFeed == std::string_view::npos ? before.size() + 1 : before.size() - lastLineFeed;
  std::string what =
      "at line " + std::to_string(line + static_cast<size_t>(std::ranges::count(before, '\n'))) +
      ", column " + std::to_string(column) + ": syntax error at \"" + visibleText(token) + "\"";
  if (complete_) what += afterWholeValue;
  error = {"$", "not valid JSON: " + what, {}};
  return false;
}

bool ValueReader::fail(std::string reason) {
  error = {currentPath(), std::move(reason), {}};
  return false;
}

std::string ValueReader::currentPath() const {
  if (frames_.empty()) return "$";
  const Frame& f = frames_.back();
  if (f.value.isArray()) return f.path + "[" + std::to_string(f.index) + "]";
  return joinPath(f.path, dictionaryPathKey(f.key));
}

bool ValueReader::add(Value value) {
  if (!admit(value, false)) return false;
  if (frames_.empty()) {
    complete_ = true;
    if (!wantedPath) root = std::move(value);
    return true;
  }
  Frame& f = frames_.back();
  if (Array* array = f.value.asArray()) {
    if (frames_.size() == 1 && takeElement) {
      const std::string path = currentPath();
      ++f.index;
      return takeElement(std::move(value), path);
    }
    if (!wantedPath) array->push_back(std::move(value));
    ++f.index;
  } else if (!wantedPath) {
    f.value.asDictionary()->set(f.key, std::move(value));
  }
  return true;
}

bool ValueReader::open(Value container) {
  if (frames_.size() == kMaxDepth)
    return fail("nested deeper than " + std::to_string(kMaxDepth) + " levels");
  if (!admit(container, true)) return false;
  frames_.push_back({std::move(container), currentPath(), {}, 0});
  return true;
}

bool ValueReader::close() {
  Value done = std::move(frames_.back().value);
  frames_.pop_back();
  // {"$data": "HEX"} alone is a byte string.
  const Dictionary* d = done.asDictionary();
  if (const Value* hex = d && d->size() == 1 ? d->find("$data") : nullptr) {
    if (!hex->isString()) return fail("$data is not a string");
    auto bytes = fromHex(*hex->asString());
    if (!bytes) return fail("$data is not even-length hexadecimal");
    done = Value(Data(bytes->begin(), bytes->end()));
  }
  return add(std::move(done));
}

std::optional<Value> parseJSON(std::string_view text, ValueError* error) {
  ValueReader reader;
  reader.slice = text;
  if (!JSON::sax_parse(text, &reader) || !reader.root) {
    if (error) *error = reader.error;
    return std::nullopt;
  }
  return std::move(reader.root);
}

std::optional<Value> valueFromJSON(const JSON& json, ValueError* error) {
  return parseJSON(json.dump(-1, ' ', false, JSON::error_handler_t::replace), error);
}

JSON::parser_callback_t jsonDepthLimit(bool* tooDeep) {
  return [tooDeep](int depth, JSON::parse_event_t event, JSON&) {
    const bool opens =
        event == JSON::parse_event_t::object_start || event == JSON::parse_event_t::array_start;
    // The values' own bound, and room for the structure of a document around them.
    if (opens && depth > static_cast<int>(2 * kMaxDepth)) *tooDeep = true;
    return !*tooDeep;
  };
}

}  // namespace kolvrand
