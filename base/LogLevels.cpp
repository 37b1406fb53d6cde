// SPDX-License-Identifier: MIT
#include "base/LogLevels.h"

#include <optional>

namespace kolvrand {

namespace {

std::string_view trim(std::string_view s) {
  while (!s.empty() && (s.front() == ' ' || s.front() == '\t')) s.remove_prefix(1);
  while (!s.empty() && (s.back() == ' ' || s.back() == '\t')) s.remove_suffix(1);
  return s;
}

std::optional<LogLevel> parseLevel(std::string_view s) {
  std::string lower;
  for (char c : s) lower += static_cast<char>(c >= 'A' && c <= 'Z' ? c - 'A' + 'a' : c);
  if (lower == "error") return LogLevel::Error;
  if (lower == "default") return LogLevel::Default;
  if (lower == "debug") return LogLevel::Debug;
  return std::nullopt;
}

// The categories the daemon and its platform layer log under; a setting for
// any other would silently do nothing.
constexpr std::string_view kCategories[] = {
    "main",     "batteryModelDataHandling", "batteryAgingUpdate", "dispatch", "defaults", "device",
    "platform",
};

bool isCategory(std::string_view name) {
  for (std::string_view c : kCategories)
    if (c == name) return true;
  return false;
}

}  // namespace

// Items apply in order: a bare level sets every category (earlier
// per-category items included), CATEGORY=LEVEL sets one. Items that are
// neither are appended to *notUnderstood.
LogLevels parseLogLevels(std::string_view list, std::vector<std::string>* notUnderstood) {
  LogLevels config;
  while (!list.empty()) {
    size_t comma = list.find(',');
    std::string_view item = trim(list.substr(0, comma));
    list = comma == std::string_view::npos ? std::string_view() : list.substr(comma + 1);
    if (item.empty()) continue;
    size_t eq = item.find('=');
    std::optional<LogLevel> level;
    if (eq == std::string_view::npos) {
      if ((level = parseLevel(item))) {
        config.fallback = *level;
        config.categories.clear();
      }
    } else {
      std::string_view category = trim(item.substr(0, eq));
      level = parseLevel(trim(item.substr(eq + 1)));
      if (!isCategory(category)) level.reset();
      if (level) config.categories[std::string(category)] = *level;
    }
    if (!level) notUnderstood->emplace_back(item);
  }
  return config;
}

bool LogLevels::enabled(std::string_view category, LogLevel level) const {
  auto it = categories.find(category);
  const LogLevel max = it != categories.end() ? it->second : fallback;
  return static_cast<uint8_t>(level) <= static_cast<uint8_t>(max);
}

std::string logCategoryList() {
  std::string list;
  for (std::string_view c : kCategories) list.append(list.empty() ? "" : ", ").append(c);
  return list;
}

}  // namespace kolvrand
