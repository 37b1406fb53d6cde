// SPDX-License-Identifier: MIT
// Which levels are enabled, per category, from KOLVRAND_LOG_LEVEL or setLogLevelSpec.
#include "platform/Log.h"

#include <array>
#include <cstdlib>
#include <mutex>
#include <string>
#include <vector>

namespace kolvrand {

namespace {

struct LevelState {
  std::mutex mutex;
  LogLevels config;
  bool configured = false;  // set by setLogLevelSpec or the first os_log_create
};

// Never destroyed: logging stays usable while other statics are torn down.
LevelState& levelState() {
  static auto* s = new LevelState;
  return *s;
}

// KOLVRAND_LOG_LEVEL as the daemon starts: a setting not understood as a
// whole gives the defaults and one line naming what was not understood.
LogLevels levelsFromEnvironment(std::vector<std::string>* notUnderstood) {
  const char* env = std::getenv("KOLVRAND_LOG_LEVEL");
  if (!env) return {};
  LogLevels config = parseLogLevels(env, notUnderstood);
  return notUnderstood->empty() ? config : LogLevels{};
}

}  // namespace

void setLogLevelSpec(std::string_view levels) {
  LevelState& s = levelState();
  std::vector<std::string> ignored;
  LogLevels config = parseLogLevels(levels, &ignored);
  std::lock_guard lock(s.mutex);
  s.config = std::move(config);
  s.configured = true;
}

bool OSLog::enabled(LogLevel level) const {
  LevelState& s = levelState();
  std::lock_guard lock(s.mutex);
  return s.config.enabled(category_, level);
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
    const std::string categories = logCategoryList();
    emitLog(OSLog(log->subsystem(), "platform"), LogLevel::Error,
            "KOLVRAND_LOG_LEVEL: %s not understood (levels: error, default, debug; categories: "
            "%s); using the defaults\n",
            std::array{makeLogArg(items), makeLogArg(categories)});
  }
  return log;
}

}  // namespace kolvrand
