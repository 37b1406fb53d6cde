// SPDX-License-Identifier: MIT
// Scheduled activities in the manner of XPC activities registered with
// XPC_ACTIVITY_CHECK_IN: the criteria live in the launch configuration (the
// systemd timer pokes the daemon with SIGUSR1). Registration calls the handler
// once in the check-in state; every delivered run calls it in the run state.
// Handlers run on the activity service's own thread, never on a caller's queue.
#pragma once

#include <functional>
#include <string>

namespace kolvrand {

using xpc_activity_state_t = long;
inline constexpr xpc_activity_state_t XPC_ACTIVITY_STATE_CHECK_IN = 0;
inline constexpr xpc_activity_state_t XPC_ACTIVITY_STATE_WAIT = 1;
inline constexpr xpc_activity_state_t XPC_ACTIVITY_STATE_RUN = 2;
inline constexpr xpc_activity_state_t XPC_ACTIVITY_STATE_DEFER = 3;
inline constexpr xpc_activity_state_t XPC_ACTIVITY_STATE_CONTINUE = 4;
inline constexpr xpc_activity_state_t XPC_ACTIVITY_STATE_DONE = 5;

struct XPCActivity {
  std::string identifier;
  xpc_activity_state_t state;
};
using xpc_activity_t = const XPCActivity*;
using xpc_activity_handler_t = std::function<void(xpc_activity_t)>;

struct xpc_criteria_t {
  bool checkIn;
};
// Take the criteria from the launch configuration.
inline constexpr xpc_criteria_t XPC_ACTIVITY_CHECK_IN{true};

void xpc_activity_register(const char* identifier, xpc_criteria_t criteria,
                           xpc_activity_handler_t handler);
xpc_activity_state_t xpc_activity_get_state(xpc_activity_t activity);

// Calls every registered handler in the run state, on the activity service's
// thread (dispatch_main does this at SIGUSR1).
void xpc_activity_deliver_run();
// Waits until every call delivered so far has returned (tests).
void xpc_activity_drain();
// Stops the activity service after the call in progress (dispatch_main, tests).
void xpc_activity_stop();

}  // namespace kolvrand
