// SPDX-License-Identifier: MIT
// The process-wide object whose defaults hold the battery-aging flag.
#pragma once

#include <memory>

#include "pipeline/DaemonAgent.h"

namespace kolvrand {

class ConditionCheckingAgent : public DaemonAgent<ConditionCheckingAgent> {
 public:
  // An agent with its own defaults and its "batteryAgingUpdate" log.
  static std::shared_ptr<ConditionCheckingAgent> init() { return make("batteryAgingUpdate"); }

  // Nothing gates the aging workload yet: always true.
  bool performExecutionConditionChecking();
};

}  // namespace kolvrand
