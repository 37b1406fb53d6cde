// The dictionary form of the model messages as JSON, both ways. Output: keys
// in the message's field order, floats as the shortest decimal that reads back
// to the same 32-bit float, NaN and the infinities as the strings "NaN",
// "Infinity" and "-Infinity". Input: the same, through the model's own
// dictionary import, so no field is listed here.
#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Value.h"

namespace kolvrand {
class OTAParamRC;
}

namespace kolvrand::rcmodel {

// One line of compact JSON, without a line feed.
std::string renderJSON(const Value& value);
// A float as renderJSON writes it: "-0.0" for negative zero (a bare "-0" reads
// back as the integer 0), quoted names for NaN and the infinities.
std::string floatJSON(float value);

// Where in the JSON text a value went wrong: "$" for the whole text (or
// "line N: $" for a line of JSON Lines), then ".key" and "[index]" down to the
// value; a syntax error names its line and column in `reason`.
struct JSONError {
  std::string path;
  std::string reason;
  std::string message() const { return path + ": " + reason; }
};

// JSON text as a Value: a number with a fraction or an exponent becomes the
// 32-bit float nearest to its decimal text when it is within a float's range
// (else a double, which a float field rounds or refuses), the strings "NaN",
// "Infinity" and "-Infinity" become floats, integers stay integers. Null,
// duplicate keys and numbers beyond any range are errors.
std::optional<Value> parseJSON(std::string_view text, JSONError* error);

// The models of a JSON text: an object is one model, an array of objects
// several, and so are JSON Lines, one object a line (what rcmodel decode
// prints). At least one model; nothing may follow the JSON, not even after a
// NUL byte. With `single`, only one object is taken.
std::optional<std::vector<std::shared_ptr<OTAParamRC>>> modelsFromJSON(std::string_view text,
                                                                       bool single,
                                                                       JSONError* error);

}  // namespace kolvrand::rcmodel
