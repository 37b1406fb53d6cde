// The boot-session gate: uploads the battery model at most once per boot
// session, judged by the kernel's boot-session UUID, which is remembered in
// "savedBootUUID" only after a successful upload.
#pragma once

#include "pipeline/BatteryModelDataHandler.h"
#include "platform/Log.h"

namespace kolvrand {

// Runs once per process start on the battery-model queue. `handler` may be
// nil: the chem ID is then 0 and the upload reports false.
void runBatteryModelTask(const os_log_t& mainLog, BatteryModelDataHandler* handler);

}  // namespace kolvrand
