// SPDX-License-Identifier: MIT
#include "daemon/ConditionCheckingAgent.h"

namespace kolvrand {

bool ConditionCheckingAgent::performExecutionConditionChecking() {
  os_log_debug(log_, "%s Checking execution requirements\n",
               "-[ConditionCheckingAgent performExecutionConditionChecking]");
  return true;
}

}  // namespace kolvrand
