// SPDX-License-Identifier: MIT
#include "platform/Internal.h"

#include <fcntl.h>
#include <stdlib.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <map>
#include <mutex>

#include "platform/FileManager.h"

namespace kolvrand::platform {

const os_log_t& platformLog(std::string_view category) {
  // Never destroyed: platform code logs from static destructors and at exit.
  static auto* mutex = new std::mutex;
  static auto* logs = new std::map<std::string, os_log_t, std::less<>>;
  std::lock_guard lock(*mutex);
  auto it = logs->find(category);
  if (it == logs->end()) {
    std::string name(category);
    it = logs->emplace(name, os_log_create(kPlatformSubsystem, name.c_str())).first;
  }
  return it->second;
}

std::optional<std::string> readFile(const std::filesystem::path& path, FileError* error) {
  auto file = readRegularFile(path.string(), kMaxSmallFileSize, error);
  if (!file) return std::nullopt;
  return file->text();
}

}  // namespace kolvrand::platform
