// SPDX-License-Identifier: MIT
#include "daemon/BatteryModelTask.h"

#include <memory>

#include "pipeline/BootSession.h"
#include "pipeline/DaemonIdentifier.h"

namespace kolvrand {

BatteryModelTaskResult runBatteryModelTask(const os_log_t& mainLog,
                                           BatteryModelDataHandler* handler) {
  // Its own defaults object, not the handler's.
  std::shared_ptr<NSUserDefaults> defaults = NSUserDefaults::initWithSuiteName(DaemonIdentifier);
  if (!defaults) {
    os_log_error(mainLog, "Could not allocate defaults\n");
    return {BatteryModelTaskResult::Failed};
  }

  std::optional<std::string> bootUUID = currentBootSessionUUID();
  if (!bootUUID) {
    os_log_error(mainLog, "Unable to get current boot UUID\n");
    return {BatteryModelTaskResult::Failed};
  }

  if (isSavedBootSession(*defaults, *bootUUID)) {
    os_log(mainLog, "Main Unchanged boot UUID. Skipping battery model task\n");
    return {BatteryModelTaskResult::Skipped};
  }

  uint32_t chemID = handler ? handler->getBatteryChemID() : 0;
  os_log_debug(mainLog, "Battery data upload run for chemId 0x%lx\n",
               static_cast<uint64_t>(chemID));

  if (handler && handler->moveBatteryModelDataFromDiskToKext(chemID)) {
    os_log(mainLog, "Battery data upload succeeded\n");
    defaults->setObject(*bootUUID, "savedBootUUID");
    return {BatteryModelTaskResult::Uploaded, chemID};
  }
  os_log_error(mainLog, "Battery data upload failed\n");
  return {BatteryModelTaskResult::Failed, chemID};
}

}  // namespace kolvrand
