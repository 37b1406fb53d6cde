// SPDX-License-Identifier: MIT
// Leveled logging in the manner of os_log: one named log per subsystem and
// category, printf-style formats in which %@ prints an object's description
// (a nil object as "(null)"). A message is formatted only when its level is
// enabled for its log.
#pragma once

#include <cstdint>
#include <memory>
#include <span>
#include <string>
#include <string_view>

#include "base/Format.h"
#include "base/LogLevels.h"

namespace kolvrand {

// Where formatted messages go. The default sink is chosen once per process:
// journald when stderr is the journal, else one line per message on stderr.
class LogSink {
 public:
  virtual ~LogSink() = default;
  // `message` is the formatted text, a trailing line feed included if the
  // format had one; sinks decide how to end the line.
  virtual void write(LogLevel level, std::string_view subsystem, std::string_view category,
                     std::string_view message) = 0;
};

// Replaces the process's sink (tests capture messages this way); nullptr
// restores the default.
void setLogSink(std::shared_ptr<LogSink> sink);

// Sets which levels are enabled, in the syntax of KOLVRAND_LOG_LEVEL: a level
// for all categories ("debug"), or a comma list of CATEGORY=LEVEL and LEVEL
// items, later items winning ("default,main=debug"). Levels: error, default,
// debug; each enables itself and the levels above it. Unknown items are
// ignored. An empty list restores the default (error and default enabled).
// The environment variable is read once, at the first log created, unless
// this was called before.
void setLogLevelSpec(std::string_view levels);

class OSLog {
 public:
  OSLog(std::string subsystem, std::string category)
      : subsystem_(std::move(subsystem)), category_(std::move(category)) {}
  const std::string& subsystem() const { return subsystem_; }
  const std::string& category() const { return category_; }
  bool enabled(LogLevel level) const;

 private:
  std::string subsystem_;
  std::string category_;
};

using os_log_t = std::shared_ptr<const OSLog>;

os_log_t os_log_create(const char* subsystem, const char* category);

// Formats and hands the message to the sink; callers have checked the level.
void emitLog(const OSLog& log, LogLevel level, std::string_view format,
             std::span<const LogArg> args);

template <typename... Args>
void os_log_with_level(const os_log_t& log, LogLevel level, const char* format,
                       const Args&... args) {
  if (!log || !log->enabled(level)) return;
  const LogArg packed[sizeof...(Args) + 1] = {makeLogArg(args)..., LogArg{int64_t{0}}};
  emitLog(*log, level, format, std::span<const LogArg>(packed, sizeof...(Args)));
}

template <typename... Args>
void os_log_error(const os_log_t& log, const char* format, const Args&... args) {
  os_log_with_level(log, LogLevel::Error, format, args...);
}

// os_log proper: the default level.
template <typename... Args>
void os_log(const os_log_t& log, const char* format, const Args&... args) {
  os_log_with_level(log, LogLevel::Default, format, args...);
}

template <typename... Args>
void os_log_debug(const os_log_t& log, const char* format, const Args&... args) {
  os_log_with_level(log, LogLevel::Debug, format, args...);
}

}  // namespace kolvrand
