// SPDX-License-Identifier: MIT
#include "daemon/BatteryModelTask.h"

#include <memory>

#include "base/Utf8.h"
#include "pipeline/DaemonIdentifier.h"
#include "platform/Sysctl.h"

namespace kolvrand {

std::optional<std::string> currentBootSessionUUID() {
  size_t size = 0;
  if (sysctlbyname("kern.bootsessionuuid", nullptr, &size, nullptr, 0) != 0) return std::nullopt;
  std::unique_ptr<char[]> buffer = allocateKernelStringBuffer(size);
  if (!buffer || sysctlbyname("kern.bootsessionuuid", buffer.get(), &size, nullptr, 0) != 0)
    return std::nullopt;
  return stringWithUTF8String(buffer.get());
}

bool isSavedBootSession(const NSUserDefaults& defaults, const std::string& bootUUID) {
  return defaults.stringForKey("savedBootUUID") == bootUUID;
}

void runBatteryModelTask(const os_log_t& mainLog, BatteryModelDataHandler* handler) {
  // Its own defaults object, not the handler's.
  std::shared_ptr<NSUserDefaults> defaults = NSUserDefaults::initWithSuiteName(DaemonIdentifier);
  if (!defaults) {
    os_log_error(mainLog, "Could not allocate defaults\n");
    return;
  }

  std::optional<std::string> bootUUID = currentBootSessionUUID();
  if (!bootUUID) {
    os_log_error(mainLog, "Unable to get current boot UUID\n");
    return;
  }

  if (isSavedBootSession(*defaults, *bootUUID)) {
    os_log(mainLog, "Main Unchanged boot UUID. Skipping battery model task\n");
    return;
  }

  uint32_t chemID = handler ? handler->getBatteryChemID() : 0;
  os_log_debug(mainLog, "Battery data upload run for chemId 0x%lx\n",
               static_cast<uint64_t>(chemID));

  if (handler && handler->moveBatteryModelDataFromDiskToKext(chemID)) {
    os_log(mainLog, "Battery data upload succeeded\n");
    defaults->setObject(*bootUUID, "savedBootUUID");
  } else {
    os_log_error(mainLog, "Battery data upload failed\n");
  }
}

}  // namespace kolvrand
