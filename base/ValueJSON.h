// SPDX-License-Identifier: MIT
// Values in the JSON of device files: numbers, strings, booleans, arrays and
// objects map onto themselves (objects keep their order); byte strings are
// written as {"$data": "HEX"}. JSON null has no Value and is an error.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include <nlohmann/json.hpp>

#include "base/Value.h"

namespace kolvrand {

using JSON = nlohmann::ordered_json;

// Integers become signed numbers (unsigned above INT64_MAX), other numbers
// doubles. nullopt with *error set for null or an invalid {"$data": ...}.
std::optional<Value> valueFromJSON(const JSON& json, std::string* error = nullptr);
// The same from text; a syntax error is an error too.
std::optional<Value> parseValueJSON(std::string_view text, std::string* error = nullptr);

}  // namespace kolvrand
