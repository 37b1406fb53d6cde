// SPDX-License-Identifier: MIT
// Writing a command's output file. A regular file is replaced whole, through a
// temporary file renamed over it, so a failed write leaves the old content;
// a symlink is written through, the file it ends at replaced beside itself;
// anything else (a FIFO, a terminal, /dev/null) is written in place, since
// renaming over it would take it from its readers. A path that names one of
// this process's descriptors (/dev/stdout, /dev/fd/N, or a link to one) is
// written into that descriptor, at its offset, as if the tool had printed.
#include <fcntl.h>
#include <limits.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <charconv>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <optional>

#include "tools/rcmodel/Tool.h"

namespace kolvrand::rcmodel {

namespace {

namespace fs = std::filesystem;

bool writeAll(int fd, std::string_view bytes) {
  while (!bytes.empty()) {
    ssize_t n = ::write(fd, bytes.data(), bytes.size());
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return false;
    bytes.remove_prefix(static_cast<size_t>(n));
  }
  return true;
}

// The descriptor that /dev/fd/N, /proc/self/fd/N or /proc/thread-self/fd/N
// names, or -1. Opening such a path would open the file anew at offset 0 and,
// for a regular file, replacing it would take the name from under the shell.
int namedDescriptor(const fs::path& path) {
  std::error_code ec;
  const fs::path dir = fs::absolute(path, ec).parent_path().lexically_normal();
  if (dir != "/dev/fd" && dir != "/proc/self/fd" && dir != "/proc/thread-self/fd") return -1;
  const std::string name = path.filename().string();
  int fd = -1;
  auto [end, failed] = std::from_chars(name.data(), name.data() + name.size(), fd);
  return failed == std::errc() && end == name.data() + name.size() ? fd : -1;
}

// The path a chain of symlinks starting at `path` ends at, which need not
// exist (a dangling link is written through as a shell's ">" does), or the
// descriptor in *fd that a path on the way names; 0, or an errno value in
// *err.
fs::path finalTarget(fs::path path, int* err, int* fd) {
  for (int hops = 0; hops < 40; ++hops) {
    if ((*fd = namedDescriptor(path)) >= 0) return path;
    struct stat st {};
    if (::lstat(path.c_str(), &st) != 0 || !S_ISLNK(st.st_mode)) return path;
    char link[PATH_MAX];
    ssize_t n = ::readlink(path.c_str(), link, sizeof link);
    if (n < 0 || static_cast<size_t>(n) == sizeof link) {
      *err = n < 0 ? errno : ENAMETOOLONG;
      return path;
    }
    const fs::path next(std::string(link, static_cast<size_t>(n)));
    path = next.is_absolute() ? next : path.parent_path() / next;
  }
  *err = ELOOP;
  return path;
}

// Replaces `target` with a file holding `bytes`, keeping the mode (and, for
// root, the owner) of the file it replaces; 0, or an errno value with *step
// naming the step that failed.
int replaceFile(const fs::path& target, std::string_view bytes, std::string* step) {
  fs::path dir = target.parent_path();
  if (dir.empty()) dir = ".";
  std::string name = ".";
  name += target.filename().string();
  name += ".XXXXXX";
  std::string temporary = (dir / name).string();
  const int fd = ::mkstemp(temporary.data());
  if (fd < 0) {
    *step = "cannot create a file in " + dir.string() + " to replace it with";
    return errno;
  }

  int err = 0;
  struct stat old {};
  *step = "cannot give the new file the old one's mode";
  if (::stat(target.c_str(), &old) == 0) {
    if (::fchmod(fd, old.st_mode & 07777) != 0) err = errno;
    if (!err && ::geteuid() == 0 && ::fchown(fd, old.st_uid, old.st_gid) != 0) err = errno;
  } else {
    // mkstemp makes the file private; a new output file gets the usual mode.
    const mode_t mask = ::umask(0);
    ::umask(mask);
    if (::fchmod(fd, 0666 & ~mask) != 0) err = errno;
  }
  if (!err && !writeAll(fd, bytes)) err = errno, *step = "cannot write the new file";
  if (!err && ::fsync(fd) != 0) err = errno, *step = "cannot sync the new file";
  if (::close(fd) != 0 && !err) err = errno, *step = "cannot close the new file";
  if (!err && ::rename(temporary.c_str(), target.c_str()) != 0)
    err = errno, *step = "cannot rename the new file over it";
  if (err) ::unlink(temporary.c_str());
  return err;
}

// Writes into what is already at `path`, without creating or truncating.
int writeInPlace(const std::string& path, std::string_view bytes) {
  const int fd = ::open(path.c_str(), O_WRONLY | O_NOCTTY | O_CLOEXEC);
  if (fd < 0) return errno;
  int err = writeAll(fd, bytes) ? 0 : errno;
  if (::close(fd) != 0 && !err) err = errno;
  return err;
}

}  // namespace

bool isStandardOutput(const std::string& path) {
  int err = 0, fd = -1;
  finalTarget(path, &err, &fd);
  return path == "-" || fd == STDOUT_FILENO;
}

bool writeOutput(const std::string& command, const std::string& path, std::string_view bytes) {
  if (path == "-") {
    if (std::fwrite(bytes.data(), 1, bytes.size(), stdout) != bytes.size() || std::fflush(stdout)) {
      error(command, "cannot write standard output");
      return false;
    }
    return true;
  }
  int err = 0, fd = -1;
  const fs::path target = finalTarget(path, &err, &fd);
  if (fd >= 0) {
    if (!writeAll(fd, bytes)) {
      error(command, path + ": cannot write: " + std::strerror(errno));
      return false;
    }
    return true;
  }
  struct stat st {};
  const bool exists = ::stat(path.c_str(), &st) == 0;
  if (!exists && errno != ENOENT) {
    error(command, path + ": cannot write: " + std::strerror(errno));
    return false;
  }
  if (exists && S_ISDIR(st.st_mode)) {
    error(command, path + ": is a directory; give a file to write");
    return false;
  }
  if (exists && !S_ISREG(st.st_mode)) {
    if (int err = writeInPlace(path, bytes)) {
      error(command, path + ": cannot write: " + std::strerror(err));
      return false;
    }
    return true;
  }
  std::string step = "cannot write";
  if (!err) err = replaceFile(target, bytes, &step);
  if (err) {
    error(command, path + ": " + step + ": " + std::strerror(err) + "; it was left as it was");
    return false;
  }
  return true;
}

}  // namespace kolvrand::rcmodel
