// SPDX-License-Identifier: MIT
#include "platform/FileManager.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
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

int writeAll(int fd, std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t n = ::write(fd, bytes.data(), bytes.size());
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return errno;
    bytes.remove_prefix(static_cast<size_t>(n));
  }
  return 0;
}

int replaceFile(const std::filesystem::path& path, std::string_view bytes, unsigned newMode,
                std::string* step) {
  std::filesystem::path dir = path.parent_path();
  if (dir.empty()) dir = ".";
  std::string temporary = (dir / ("." + path.filename().string() + ".XXXXXX")).string();
  const int fd = ::mkostemp(temporary.data(), O_CLOEXEC);
  if (fd < 0) {
    *step = "cannot create a file in " + dir.string() + " to replace it with";
    return errno;
  }
  int err = 0;
  struct stat old {};
  *step = "cannot give the new file the old one's mode";
  if (::stat(path.c_str(), &old) == 0) {
    if (::fchmod(fd, old.st_mode & 07777) != 0) err = errno;
    if (!err && ::geteuid() == 0 && ::fchown(fd, old.st_uid, old.st_gid) != 0) err = errno;
  } else {
    // mkostemp makes the file private; a new one gets the mode asked for.
    const mode_t mask = ::umask(0);
    ::umask(mask);
    if (::fchmod(fd, newMode & ~mask) != 0) err = errno;
  }
  if (!err && (err = writeAll(fd, bytes))) *step = "cannot write the new file";
  if (!err && ::fsync(fd) != 0) err = errno, *step = "cannot sync the new file";
  if (::close(fd) != 0 && !err) err = errno, *step = "cannot close the new file";
  if (!err && ::rename(temporary.c_str(), path.c_str()) != 0)
    err = errno, *step = "cannot rename the new file over it";
  if (err) {
    ::unlink(temporary.c_str());
    return err;
  }
  // The rename itself is durable only once the directory is synced.
  const int dfd = ::open(dir.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (dfd < 0 || ::fsync(dfd) != 0) err = errno, *step = "cannot sync its directory";
  if (dfd >= 0) ::close(dfd);
  return err;
}

std::optional<FileContents> readRegularFile(const std::string& path, size_t maxSize,
                                            FileError* error) {
  int fd = -1;
  auto fail = [&](int code, std::string reason) -> std::optional<FileContents> {
    if (fd >= 0) ::close(fd);
    if (error) *error = {code, std::move(reason)};
    return std::nullopt;
  };
  auto failErrno = [&](const char* what) {
    return fail(errno, what + std::string(std::strerror(errno)));
  };
  // O_NONBLOCK: opening a FIFO must not wait for a writer; it is refused below.
  fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY);
  if (fd < 0) return failErrno("cannot open: ");
  struct stat st {};
  if (::fstat(fd, &st) != 0) return failErrno("cannot stat: ");
  if (!S_ISREG(st.st_mode))
    return fail(EINVAL, "not a regular file (" + std::string(fileKindName(st.st_mode)) + ")");
  const std::string limit = "larger than the " + std::to_string(maxSize) + "-byte limit";
  const auto size = static_cast<uint64_t>(st.st_size);
  if (size > maxSize) return fail(EFBIG, std::to_string(size) + " bytes is " + limit);
  // One byte of room beyond the size seen, so that the read of the whole file
  // stops short and ends it; a file that claims no size (under /proc or /sys)
  // gets a page to start with.
  size_t room = size ? static_cast<size_t>(size) + 1 : std::min<size_t>(4096, maxSize + 1);
  FileContents file{std::make_unique_for_overwrite<uint8_t[]>(room), 0};
  for (;;) {
    // Full, but not yet beyond maxSize (checked after each read): grow.
    if (file.size == room) {
      const size_t grown = std::min(room * 2, maxSize + 1);
      auto data = std::make_unique_for_overwrite<uint8_t[]>(grown);
      std::memcpy(data.get(), file.data.get(), file.size);
      file.data = std::move(data);
      room = grown;
    }
    const size_t asked = room - file.size;
    const ssize_t n = ::read(fd, file.data.get() + file.size, asked);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return failErrno("cannot read: ");
    if (n == 0) break;
    file.size += static_cast<size_t>(n);
    if (file.size > maxSize) return fail(EFBIG, limit);
    // A read that stops short at the size seen has reached the end.
    if (size && static_cast<size_t>(n) < asked && file.size == size) break;
  }
  ::close(fd);
  return file;
}

}  // namespace kolvrand
