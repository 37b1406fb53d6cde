// SPDX-License-Identifier: MIT
// The boot-session gate: uploads the battery model at most once per boot
// session, judged by the kernel's boot-session UUID, which is remembered in
// "savedBootUUID" only after a successful upload.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "pipeline/BatteryModelDataHandler.h"
#include "pipeline/BootSession.h"
#include "platform/Log.h"

namespace kolvrand {

// How the task ended, for the service manager's status line; chemID is the
// one the upload was tried with.
struct BatteryModelTaskResult {
  enum Outcome { Uploaded, Skipped, Failed } outcome;
  uint32_t chemID = 0;
};

// Runs once per process start on the battery-model queue. `handler` may be
// nil: the chem ID is then 0 and the upload reports false.
BatteryModelTaskResult runBatteryModelTask(const os_log_t& mainLog,
                                           BatteryModelDataHandler* handler);

}  // namespace kolvrand
