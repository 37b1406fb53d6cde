// SPDX-License-Identifier: MIT
#include "platform/ServiceManager.h"

#include <systemd/sd-daemon.h>

namespace kolvrand::platform {

bool notifyServiceManager(const std::string& state) {
  // The variable stays set: the daemon sends more than once.
  return sd_notify(0, state.c_str()) > 0;
}

}  // namespace kolvrand::platform
