// Helpers shared by the fuzz targets: a check that aborts (so libFuzzer keeps
// the input), and a log sink that formats every message and drops it.
#pragma once

#include <cstdlib>
#include <memory>
#include <string_view>

#include "platform/Log.h"

namespace kolvrand::fuzz {

inline void check(bool condition) {
  if (!condition) std::abort();
}

// Messages are still formatted (their arguments come from the input, so the
// formatting is under test too), then dropped instead of flooding stderr.
class DiscardingSink : public LogSink {
 public:
  void write(LogLevel, std::string_view, std::string_view, std::string_view message) override {
    check(message.size() < (size_t{1} << 30));
  }
};

inline void quietLogs() {
  setLogSink(std::make_shared<DiscardingSink>());
  setLogLevelSpec("debug");
}

}  // namespace kolvrand::fuzz
