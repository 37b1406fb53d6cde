// SPDX-License-Identifier: MIT
// Helpers shared by the fuzz targets: a check that aborts (so libFuzzer keeps
// the input), and a log sink that formats every message and drops it.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstdlib>

#include "platform/Log.h"

namespace kolvrand::fuzz {

inline void check(bool condition) {
  if (!condition) std::abort();
}

// Every message down to debug is still formatted (its arguments come from the
// input, so the formatting is under test too), then dropped instead of
// flooding stderr.
inline void quietLogs() {
  struct DiscardingSink : LogSink {
    void write(LogLevel, std::string_view, std::string_view, std::string_view) override {}
  };
  setLogSink(std::make_shared<DiscardingSink>());
  setLogLevelSpec("debug");
}

}  // namespace kolvrand::fuzz
