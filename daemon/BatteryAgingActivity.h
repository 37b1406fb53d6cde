// SPDX-License-Identifier: MIT
// The battery-aging activity: the system runs it by the criteria of the launch
// configuration; its handler records the run in "updateConditionMet" and
// consumes the flag in the same call.
#pragma once

#include "daemon/ConditionCheckingAgent.h"
#include "platform/Activity.h"
#include "platform/Log.h"

namespace kolvrand {

// Called by the activity service with the activity; `agent` may be nil, in
// which case the flag reads false and nothing is stored.
void batteryAgingActivityHandler(xpc_activity_t activity, const os_log_t& mainLog,
                                 ConditionCheckingAgent* agent);

}  // namespace kolvrand
