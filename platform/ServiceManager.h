// SPDX-License-Identifier: MIT
// What the service manager is told about the service, by its notify protocol:
// a datagram of NAME=VALUE lines ("READY=1", "STATUS=TEXT") to the unix socket
// that NOTIFY_SOCKET names. Outside a Type=notify service the variable is
// unset and nothing is sent.
#pragma once

#include <string>

namespace kolvrand::platform {

// Sends `state`; false when there is no socket to send to or the send failed.
bool notifyServiceManager(const std::string& state);

}  // namespace kolvrand::platform
