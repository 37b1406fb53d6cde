// SPDX-License-Identifier: MIT
// The dictionary form of the model messages as JSON, both ways. Output: keys
// in the message's field order, floats as the shortest decimal that reads back
// to the same 32-bit float, NaN and the infinities as the strings "NaN",
// "Infinity" and "-Infinity". Input: the same, read by base/'s one JSON
// conversion (ValueJSON.h) and the model's own dictionary import, so no field
// is listed here. A ValueError's path starts at "$" (or "line N: $").
#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/Value.h"

namespace kolvrand {
class OTAParamRC;
}

namespace kolvrand::rcmodel {

// One line of compact JSON, without a line feed.
std::string renderJSON(const Value& value);
// A float as renderJSON writes it: "-0.0" for negative zero (a bare "-0" reads
// back as the integer 0), quoted names for NaN and the infinities.
std::string floatJSON(float value);

// What the models of a text may take once encoded: `limit` bytes, of which
// *used are taken already (the caller counts what it has encoded); no limit
// without `used`.
struct ModelBudget {
  size_t limit = 0;
  const size_t* used = nullptr;
};

// Takes one model; false after setting the error's reason stops the reading.
using TakeModel = std::function<bool(std::shared_ptr<OTAParamRC>, ValueError*)>;

// The models of a JSON text: an object is one model, an array of objects
// several, and so are JSON Lines, one object a line (what rcmodel decode
// prints). At least one model; nothing may follow the JSON, not even after a
// NUL byte. With `single`, only one object is taken. Each model is handed to
// `take` as soon as its JSON is read and imported, so that memory holds the
// values of one model at a time; with a budget, a model whose encoding cannot
// fit what is left of it is refused while it is read.
bool forEachModelInJSON(std::string_view text, bool single, const ModelBudget& budget,
                        ValueError* error, const TakeModel& take);

// The same, all models kept.
std::optional<std::vector<std::shared_ptr<OTAParamRC>>> modelsFromJSON(std::string_view text,
                                                                       bool single,
                                                                       ValueError* error);

}  // namespace kolvrand::rcmodel
