// The process-wide object whose defaults hold the battery-aging flag.
#pragma once

#include <memory>

#include "platform/Defaults.h"
#include "platform/Log.h"

namespace kolvrand {

class ConditionCheckingAgent {
 public:
  // The one shared agent, created on first use under a once-only guard.
  static std::shared_ptr<ConditionCheckingAgent> sharedInstance();
  // An agent with its own defaults (suite DaemonIdentifier; nil when the suite
  // cannot be opened) and its "batteryAgingUpdate" log.
  static std::shared_ptr<ConditionCheckingAgent> init();

  // Nothing gates the aging workload yet: always true.
  bool performExecutionConditionChecking();

  const std::shared_ptr<NSUserDefaults>& defaults() const { return defaults_; }
  void setDefaults(std::shared_ptr<NSUserDefaults> d) { defaults_ = std::move(d); }
  const os_log_t& log() const { return log_; }
  void setLog(os_log_t l) { log_ = std::move(l); }

 private:
  std::shared_ptr<NSUserDefaults> defaults_;
  os_log_t log_;
};

}  // namespace kolvrand
