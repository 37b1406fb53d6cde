// SPDX-License-Identifier: MIT
// The boot-session gate: uploads the battery model at most once per boot
// session, judged by the kernel's boot-session UUID, which is remembered in
// "savedBootUUID" only after a successful upload.
#pragma once

#include <optional>
#include <string>

#include "pipeline/BatteryModelDataHandler.h"
#include "platform/Log.h"

namespace kolvrand {

// The kernel's boot-session UUID, or nullopt when it cannot be read or is not
// UTF-8.
std::optional<std::string> currentBootSessionUUID();

// Whether `bootUUID` is the boot session of the last confirmed upload, the
// one "savedBootUUID" holds: the battery-model task then has nothing to do.
bool isSavedBootSession(const NSUserDefaults& defaults, const std::string& bootUUID);

// Runs once per process start on the battery-model queue. `handler` may be
// nil: the chem ID is then 0 and the upload reports false.
void runBatteryModelTask(const os_log_t& mainLog, BatteryModelDataHandler* handler);

}  // namespace kolvrand
