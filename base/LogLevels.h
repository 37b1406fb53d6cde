// SPDX-License-Identifier: MIT
// Log levels, and the setting that says which are enabled in which category.
#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <string>
#include <string_view>
#include <vector>

namespace kolvrand {

enum class LogLevel : uint8_t { Error = 0, Default = 1, Debug = 2 };

// The most verbose level enabled in each category named, and in every other.
struct LogLevels {
  LogLevel fallback = LogLevel::Default;
  std::map<std::string, LogLevel, std::less<>> categories;

  bool enabled(std::string_view category, LogLevel level) const;
};

// The categories the daemon and its platform layer log under, for messages.
std::string logCategoryList();

// A setting in the syntax of KOLVRAND_LOG_LEVEL (see setLogLevelSpec). Items
// that are neither a level nor CATEGORY=LEVEL of a known category are appended
// to *notUnderstood.
LogLevels parseLogLevels(std::string_view list, std::vector<std::string>* notUnderstood);

}  // namespace kolvrand
