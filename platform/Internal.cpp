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

namespace {

// close(2) that keeps errno of the failure being reported.
void closeQuietly(int fd) {
  int saved = errno;
  ::close(fd);
  errno = saved;
}

bool writeAll(int fd, const char* p, size_t n) {
  while (n > 0) {
    ssize_t w = ::write(fd, p, n);
    if (w < 0) {
      if (errno == EINTR) continue;
      return false;
    }
    p += w;
    n -= static_cast<size_t>(w);
  }
  return true;
}

}  // namespace

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

std::optional<std::string> readFile(const std::filesystem::path& path, int* err) {
  return readSmallFile(path.string(), kMaxSmallFileSize, nullptr, err);
}

bool writeFileAtomically(const std::filesystem::path& path, std::string_view bytes,
                         std::string* error) {
  auto fail = [&](const char* what, const std::string& tmp) {
    if (error)
      *error = std::string(what) + " " + (tmp.empty() ? path.string() : tmp) + ": " +
               std::strerror(errno);
    if (!tmp.empty()) ::unlink(tmp.c_str());
    return false;
  };
  std::filesystem::path dir = path.parent_path();
  if (dir.empty()) dir = ".";
  std::string tmp = path.string() + ".XXXXXX";
  int fd = ::mkostemp(tmp.data(), O_CLOEXEC);
  if (fd < 0) return fail("cannot create a temporary file for", "");
  if (!writeAll(fd, bytes.data(), bytes.size())) {
    closeQuietly(fd);
    return fail("cannot write", tmp);
  }
  if (::fsync(fd) != 0) {
    closeQuietly(fd);
    return fail("cannot sync", tmp);
  }
  if (::close(fd) != 0) return fail("cannot close", tmp);
  if (::rename(tmp.c_str(), path.c_str()) != 0) return fail("cannot rename", tmp);
  // The rename itself is durable only once the directory is synced.
  int dfd = ::open(dir.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (dfd < 0) return fail("cannot open directory of", "");
  if (::fsync(dfd) != 0) {
    closeQuietly(dfd);
    return fail("cannot sync directory of", "");
  }
  ::close(dfd);
  return true;
}

}  // namespace kolvrand::platform
