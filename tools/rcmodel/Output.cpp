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

#include "platform/FileManager.h"
#include "tools/rcmodel/Tool.h"

namespace kolvrand::rcmodel {

namespace {

namespace fs = std::filesystem;

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

// Writes into what is already at `path`, without creating or truncating.
int writeInPlace(const std::string& path, std::string_view bytes) {
  const int fd = ::open(path.c_str(), O_WRONLY | O_NOCTTY | O_CLOEXEC);
  if (fd < 0) return errno;
  int err = writeAll(fd, bytes);
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
    if (int err = writeAll(fd, bytes)) {
      error(command, path + ": cannot write: " + std::strerror(err));
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
  if (!err) err = replaceFile(target, bytes, 0666, &step);
  if (err) {
    error(command, path + ": " + step + ": " + std::strerror(err) + "; it was left as it was");
    return false;
  }
  return true;
}

}  // namespace kolvrand::rcmodel
