// SPDX-License-Identifier: MIT
#include "platform/FileManager.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "platform/Backend.h"

namespace kolvrand {

NSFileManager& NSFileManager::defaultManager() {
  static NSFileManager manager;
  return manager;
}

std::optional<NSURL> NSFileManager::URLForDirectory(NSSearchPathDirectory directory,
                                                    NSSearchPathDomainMask domain, const NSURL*,
                                                    bool, std::string* error) const {
  if (directory != NSLibraryDirectory || domain != NSSystemDomainMask) {
    if (error) *error = "only the system Library directory is known";
    return std::nullopt;
  }
  std::filesystem::path dir = platform::backend().libraryDirectory();
  if (dir.empty()) {
    if (error) *error = "this system has no Library directory";
    return std::nullopt;
  }
  return dir;
}

bool NSFileManager::fileExistsAtPath(const std::string& path) const {
  struct stat st {};
  return !path.empty() && ::stat(path.c_str(), &st) == 0;
}

std::optional<FileContents> NSFileManager::contentsOfRegularFile(const std::string& path,
                                                                 size_t maxSize,
                                                                 std::string_view kind,
                                                                 std::string* error) const {
  int fd = -1;
  auto fail = [&](std::string reason) -> std::optional<FileContents> {
    if (fd >= 0) ::close(fd);
    if (error) *error = path + ": " + reason;
    return std::nullopt;
  };
  auto failErrno = [&](const char* what) {
    return fail(std::string(what) + ": " + std::strerror(errno));
  };
  // O_NONBLOCK: opening a FIFO must not wait for a writer; it is refused below.
  fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY);
  if (fd < 0) return failErrno("cannot open");
  struct stat st {};
  if (::fstat(fd, &st) != 0) return failErrno("cannot stat");
  if (!S_ISREG(st.st_mode)) return fail("not a regular file");
  if (static_cast<uint64_t>(st.st_size) > maxSize) {
    return fail(std::to_string(st.st_size) + " bytes is larger than the " +
                std::to_string(maxSize) + "-byte limit for a " + std::string(kind));
  }
  // One byte of room beyond the size seen, to notice a file that grew.
  const size_t size = static_cast<size_t>(st.st_size);
  FileContents file{std::make_unique_for_overwrite<uint8_t[]>(size + 1), 0};
  while (file.size < size + 1) {
    const size_t asked = size + 1 - file.size;
    ssize_t n = ::read(fd, file.data.get() + file.size, asked);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return failErrno("cannot read");
    if (n == 0) break;
    file.size += static_cast<size_t>(n);
    // A read of a regular file that stops short at the size seen has reached
    // its end: the file is read in one call.
    if (static_cast<size_t>(n) < asked && file.size == size) break;
  }
  if (file.size > size) return fail("changed while being read");
  ::close(fd);
  return file;
}

std::string_view fileKindName(unsigned mode) {
  switch (mode & S_IFMT) {
    case S_IFDIR:
      return "a directory";
    case S_IFIFO:
      return "a FIFO";
    case S_IFCHR:
      return "a character device";
    case S_IFBLK:
      return "a block device";
    case S_IFSOCK:
      return "a socket";
    case S_IFLNK:
      return "a symbolic link";
    default:
      return "a regular file";
  }
}

std::optional<std::string> readSmallFile(const std::string& path, size_t maxSize, std::string* why,
                                         int* err) {
  int fd = -1;
  auto fail = [&](int code, std::string reason) -> std::optional<std::string> {
    if (fd >= 0) ::close(fd);
    if (why) *why = std::move(reason);
    if (err) *err = code;
    return std::nullopt;
  };
  fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY);
  if (fd < 0) return fail(errno, std::string("cannot open: ") + std::strerror(errno));
  struct stat st {};
  if (::fstat(fd, &st) != 0)
    return fail(errno, std::string("cannot stat: ") + std::strerror(errno));
  if (!S_ISREG(st.st_mode))
    return fail(EINVAL, "not a regular file (" + std::string(fileKindName(st.st_mode)) + ")");
  const std::string limit = "larger than the " + std::to_string(maxSize) + "-byte limit";
  if (static_cast<uint64_t>(st.st_size) > maxSize) return fail(EFBIG, limit);
  std::string out;
  char buffer[8192];
  for (;;) {
    ssize_t n = ::read(fd, buffer, sizeof buffer);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return fail(errno, std::string("cannot read: ") + std::strerror(errno));
    if (n == 0) break;
    if (static_cast<size_t>(n) > maxSize - out.size()) return fail(EFBIG, limit);
    out.append(buffer, static_cast<size_t>(n));
  }
  ::close(fd);
  return out;
}

}  // namespace kolvrand
