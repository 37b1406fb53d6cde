// SPDX-License-Identifier: MIT
// The boot session the daemon's gate judges by: the kernel's boot-session
// UUID, and whether the settings say the model was uploaded in it. Shared by
// the daemon's battery-model task and by rcmodel, which reports the gate's
// view without running it.
#pragma once

#include <optional>
#include <string>

#include "platform/Defaults.h"

namespace kolvrand {

// The kernel's boot-session UUID, or nullopt when it cannot be read or is not
// UTF-8.
std::optional<std::string> currentBootSessionUUID();

// Whether `bootUUID` is the boot session of the last confirmed upload, the
// one "savedBootUUID" holds: the battery-model task then has nothing to do.
bool isSavedBootSession(const NSUserDefaults& defaults, const std::string& bootUUID);

}  // namespace kolvrand
