// SPDX-License-Identifier: MIT
#include "platform/Backend.h"

#include <cstdlib>
#include <mutex>
#include <vector>

#include "platform/Internal.h"

namespace kolvrand::platform {

namespace {

struct Slot {
  std::mutex mutex;
  std::shared_ptr<Backend> current;
  // backend() hands out references; a replaced backend stays alive so that a
  // thread still holding one never sees it destroyed.
  std::vector<std::shared_ptr<Backend>> retired;
};

Slot& slot() {
  static auto* s = new Slot;
  return *s;
}

std::shared_ptr<Backend> chooseBackend() {
  const char* device = std::getenv("KOLVRAND_DEVICE");
  if (!device || !*device) return makeHostBackend();
  // Callers have refused a device that is no directory; should one get here
  // anyway, it meets a device with nothing on it, never the host.
  if (auto error = deviceSelectionError()) os_log_error(platformLog("platform"), "%s\n", *error);
  return makeSimulatedDevice(device);
}

}  // namespace

std::optional<std::string> deviceSelectionError() {
  const char* device = std::getenv("KOLVRAND_DEVICE");
  if (!device || !*device) return std::nullopt;
  std::error_code ec;
  if (std::filesystem::is_directory(device, ec)) return std::nullopt;
  return std::string("KOLVRAND_DEVICE ") + device + " is not a directory" +
         (ec && ec != std::errc::no_such_file_or_directory ? ": " + ec.message() : "");
}

Backend& backend() {
  Slot& s = slot();
  std::lock_guard lock(s.mutex);
  if (!s.current) s.current = chooseBackend();
  return *s.current;
}

void setBackend(std::shared_ptr<Backend> b) {
  Slot& s = slot();
  std::lock_guard lock(s.mutex);
  if (s.current) s.retired.push_back(std::move(s.current));
  s.current = std::move(b);
}

}  // namespace kolvrand::platform
