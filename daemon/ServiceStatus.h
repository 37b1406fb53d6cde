// SPDX-License-Identifier: MIT
// The one line the service manager shows for the daemon (systemctl status):
// how the battery-model task of this start ended.
#pragma once

#include <optional>
#include <string>

#include "daemon/BatteryModelTask.h"

namespace kolvrand {

// "uploaded and verified: chem ID 0x2168, SHA-1 HEX" (the hash the driver
// publishes, which the upload has just matched), "skipped: already uploaded
// in this boot", or "failed: " and the first error line the task logged, the
// innermost of its chain. One line: line breaks from outside show as blanks.
std::string batteryModelStatus(const BatteryModelTaskResult& result,
                               BatteryModelDataHandler* handler,
                               const std::optional<std::string>& firstError);

}  // namespace kolvrand
