// SPDX-License-Identifier: MIT
// The file manager's system Library directory and file existence test.
#pragma once

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>

namespace kolvrand {

enum NSSearchPathDirectory : unsigned long { NSLibraryDirectory = 5 };
enum NSSearchPathDomainMask : unsigned long { NSSystemDomainMask = 8 };

// Paths stand in for file URLs.
using NSURL = std::filesystem::path;

// A file's bytes, in a buffer that is not zeroed before they are read.
struct FileContents {
  std::unique_ptr<uint8_t[]> data;
  size_t size = 0;
  std::span<const uint8_t> bytes() const { return {data.get(), size}; }
  std::string text() const { return {reinterpret_cast<const char*>(data.get()), size}; }
};

// Why a file could not be read: an errno value (EINVAL for what is not a
// regular file, EFBIG for one too large) and the reason in words, without the
// path ("not a regular file (a FIFO)", "cannot open: Permission denied").
struct FileError {
  int code = 0;
  std::string reason;
};

class NSFileManager {
 public:
  static NSFileManager& defaultManager();
  // The system domain's Library directory of the backend in use; nullopt
  // (with *error set when given) when there is none. Never creates it.
  std::optional<NSURL> URLForDirectory(NSSearchPathDirectory directory,
                                       NSSearchPathDomainMask domain,
                                       const NSURL* appropriateForURL, bool create,
                                       std::string* error) const;
  bool fileExistsAtPath(const std::string& path) const;
};

// What stands at a path that is not a regular file, for messages: "a
// directory", "a FIFO", "a character device", "a block device", "a socket".
std::string_view fileKindName(unsigned mode);

// Writes all of `bytes` to `fd`, going on after a short write or an
// interrupted one; 0, or an errno value.
int writeAll(int fd, std::string_view bytes);

// Replaces the file at `path` whole with `bytes`, so that a reader sees the
// old content or the new, and the new survives a crash once this returns 0:
// a temporary file beside it (.NAME.XXXXXX), fsync, rename over it, fsync of
// the directory. The new file keeps the mode (and, for root, the owner) of
// the one it replaces; a file made anew gets `newMode` less the umask. 0, or
// an errno value with *step naming the step that failed.
int replaceFile(const std::filesystem::path& path, std::string_view bytes, unsigned newMode,
                std::string* step);

// The whole regular file at `path`, so that no file can block its reader or
// claim its memory: opened without waiting (a FIFO is refused, never waited
// on), a regular file only (a link to /dev/zero is a character device), and
// at most `maxSize` bytes, counted as read since /proc and sysfs files claim a
// size of 0. A file whose size is known is read in one call. nullopt with
// *error on failure.
std::optional<FileContents> readRegularFile(const std::string& path, size_t maxSize,
                                            FileError* error = nullptr);

}  // namespace kolvrand
