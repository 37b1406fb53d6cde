// SPDX-License-Identifier: MIT
// Which levels are enabled, per category, from KOLVRAND_LOG_LEVEL or setLogLevelSpec.
#include "platform/Log.h"

#include <array>
#include <cstdlib>
#include <map>
#include <mutex>
#include <string>
#include <vector>

namespace kolvrand {

namespace {

struct LevelConfig {
  LogLevel fallback = LogLevel::Default;
  std::map<std::string, LogLevel, std::less<>> categories;
};

struct LevelState {
  std::mutex mutex;
  LevelConfig config;
  bool configured = false;  // set by setLogLevelSpec or the first os_log_create
};

// Never destroyed: logging stays usable while other statics are torn down.
LevelState& levelState() {
  static auto* s = new LevelState;
  return *s;
}

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

// Items apply in order: a bare level sets every category (earlier
// per-category items included), CATEGORY=LEVEL sets one. Items that are
// neither are appended to *notUnderstood.
LevelConfig parseLevels(std::string_view list, std::vector<std::string>* notUnderstood) {
  LevelConfig config;
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

// KOLVRAND_LOG_LEVEL as the daemon starts: a setting not understood as a
// whole gives the defaults and one line naming what was not understood.
LevelConfig levelsFromEnvironment(std::vector<std::string>* notUnderstood) {
  const char* env = std::getenv("KOLVRAND_LOG_LEVEL");
  if (!env) return {};
  LevelConfig config = parseLevels(env, notUnderstood);
  return notUnderstood->empty() ? config : LevelConfig{};
}

}  // namespace

void setLogLevelSpec(std::string_view levels) {
  LevelState& s = levelState();
  std::vector<std::string> ignored;
  LevelConfig config = parseLevels(levels, &ignored);
  std::lock_guard lock(s.mutex);
  s.config = std::move(config);
  s.configured = true;
}

bool OSLog::enabled(LogLevel level) const {
  LevelState& s = levelState();
  std::lock_guard lock(s.mutex);
  auto it = s.config.categories.find(category_);
  LogLevel max = it != s.config.categories.end() ? it->second : s.config.fallback;
  return static_cast<uint8_t>(level) <= static_cast<uint8_t>(max);
}

os_log_t os_log_create(const char* subsystem, const char* category) {
  LevelState& s = levelState();
  std::vector<std::string> notUnderstood;
  {
    std::lock_guard lock(s.mutex);
    if (!s.configured) {
      s.configured = true;
      s.config = levelsFromEnvironment(&notUnderstood);
    }
  }
  auto log = std::make_shared<const OSLog>(subsystem ? subsystem : "", category ? category : "");
  if (!notUnderstood.empty()) {
    std::string items;
    for (const std::string& item : notUnderstood)
      items += (items.empty() ? "\"" : ", \"") + item + "\"";
    // Straight to the sink: this runs inside the first log's creation.
    std::string categories;
    for (std::string_view c : kCategories)
      categories.append(categories.empty() ? "" : ", ").append(c);
    emitLog(OSLog(log->subsystem(), "platform"), LogLevel::Error,
            "KOLVRAND_LOG_LEVEL: %s not understood (levels: error, default, debug; categories: "
            "%s); using the defaults\n",
            std::array{makeLogArg(items), makeLogArg(categories)});
  }
  return log;
}

}  // namespace kolvrand
