// Which levels are enabled, per category, from KOLVRAND_LOG_LEVEL or setLogLevelSpec.
#include "platform/Log.h"

#include <cstdlib>
#include <map>
#include <mutex>

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

// Items apply in order: a bare level sets every category (earlier
// per-category items included), CATEGORY=LEVEL sets one.
LevelConfig parseLevels(std::string_view list) {
  LevelConfig config;
  while (!list.empty()) {
    size_t comma = list.find(',');
    std::string_view item = trim(list.substr(0, comma));
    list = comma == std::string_view::npos ? std::string_view() : list.substr(comma + 1);
    size_t eq = item.find('=');
    if (eq == std::string_view::npos) {
      if (auto level = parseLevel(item)) {
        config.fallback = *level;
        config.categories.clear();
      }
      continue;
    }
    std::string_view category = trim(item.substr(0, eq));
    auto level = parseLevel(trim(item.substr(eq + 1)));
    if (!category.empty() && level) config.categories[std::string(category)] = *level;
  }
  return config;
}

}  // namespace

void setLogLevelSpec(std::string_view levels) {
  LevelState& s = levelState();
  LevelConfig config = parseLevels(levels);
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
  {
    std::lock_guard lock(s.mutex);
    if (!s.configured) {
      s.configured = true;
      if (const char* env = std::getenv("KOLVRAND_LOG_LEVEL")) s.config = parseLevels(env);
    }
  }
  return std::make_shared<const OSLog>(subsystem ? subsystem : "", category ? category : "");
}

}  // namespace kolvrand
