// SPDX-License-Identifier: MIT
#include "daemon/BatteryAgingActivity.h"

namespace kolvrand {

void batteryAgingActivityHandler(xpc_activity_t activity, const os_log_t& mainLog,
                                 ConditionCheckingAgent* agent) {
  NSUserDefaults* defaults = agent ? agent->defaults().get() : nullptr;
  xpc_activity_state_t state = xpc_activity_get_state(activity);
  if (state == XPC_ACTIVITY_STATE_RUN) {
    os_log_debug(mainLog, "battery aging periodic trigger\n");
    if (defaults) defaults->setBool(true, "updateConditionMet");
  } else if (state == XPC_ACTIVITY_STATE_CHECK_IN) {
    os_log_debug(mainLog, "battery aging update checking in! \n");
  }
  // A flag left set by a process that ended mid-run is consumed here too, the
  // check-in call of the next start included.
  if (defaults && defaults->boolForKey("updateConditionMet")) {
    os_log_debug(mainLog, "trigger condition met, start to run some workload...\n");
    os_log_debug(mainLog, "battery aging compensation has finished successfully\n");
    defaults->setBool(false, "updateConditionMet");
  }
}

}  // namespace kolvrand
