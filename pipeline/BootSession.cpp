// SPDX-License-Identifier: MIT
#include "pipeline/BootSession.h"

#include <memory>

#include "base/Utf8.h"
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

}  // namespace kolvrand
