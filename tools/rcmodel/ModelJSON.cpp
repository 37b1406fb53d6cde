// SPDX-License-Identifier: MIT
#include "tools/rcmodel/ModelJSON.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <cstdlib>
#include <functional>
#include <limits>

#include "base/ValueJSON.h"
#include "model/OTAParamRC.h"

namespace kolvrand::rcmodel {

namespace {

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

// The conversion of base/, refusing a text that cannot fit a model file
// before its Value grows: what the values will take once encoded is counted
// as they come (at least four bytes for a float of a list, one for any other
// value).
class ModelReader : public ValueReader {
 public:
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

  ModelReader() {
    // A second value after a whole first one (objects one after the other,
    // printed over several lines each) is the likeliest cause.
    afterWholeValue =
        "; several models are read as an array of objects or as one object a line "
        "(JSON Lines, as rcmodel decode prints them)";
  }

 protected:
  bool admit(const Value& value, bool opening) override {
    if (opening) {
      // A model at the top takes its length and its chemID, four bytes.
      if (depth() == 0 && value.isDictionary() && (cost += 4) > maxCost) return fail(tooLarge);
      return true;
    }
    if (++items > maxItems) return fail(tooMany);
    if (depth() == 0) return true;
    if (inArray())
      cost += value.isNumber() || (depth() == 1 && value.isDictionary()) ? 4 : 1;
    else
      cost += value.isArray() ? 0 : 1;
    return cost <= maxCost || fail(tooLarge);
  }
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

namespace {

// The number at `path` of `text` as written, when there is one that is not
// an integer literal; nothing of the text is kept meanwhile.
std::optional<std::string> writtenNumber(std::string_view text, const std::string& path) {
  ModelReader builder;
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

bool forEachModelInJSON(std::string_view text, bool single, const ModelBudget& budget,
                        ValueError* error, const TakeModel& take) {
  auto fail = [&](std::string path, std::string reason) {
    if (error) *error = {std::move(path), std::move(reason), {}};
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
    ValueError why;
    auto model = OTAParamRC::fromDictionary(value, &why);
    if (!model) {
      // A number the reason names is shown as it was written.
      std::string reason = why.reason;
      if (!why.number.empty()) {
        if (auto at = reason.find(why.number); at != std::string::npos) {
          if (auto written = writtenNumber(within, joinPath(path, why.path)))
            reason.replace(at, why.number.size(), *written);
        }
      }
      return fail(joinPath(where, why.path), reason);
    }
    ++models;
    ValueError taken;
    if (!take(std::move(model), &taken)) return fail(where, taken.reason);
    return true;
  };
  const auto prepare = [&](ModelReader& builder) {
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
      ModelReader builder;
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

  ModelReader builder;
  prepare(builder);
  // An array's objects are imported one by one as the parser completes them.
  if (!single) {
    builder.takeElement = [&](Value&& element, const std::string& path) {
      if (!import(element, path, text, path)) {
        builder.error = error ? *error : ValueError{};
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
                                                                       ValueError* error) {
  std::vector<std::shared_ptr<OTAParamRC>> models;
  if (!forEachModelInJSON(text, single, {}, error, [&](std::shared_ptr<OTAParamRC> m, ValueError*) {
        models.push_back(std::move(m));
        return true;
      }))
    return std::nullopt;
  return models;
}

}  // namespace kolvrand::rcmodel
