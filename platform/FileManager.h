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
  // The whole regular file at `path` in one read. nullopt with *error set
  // ("PATH: REASON") when it cannot be opened, stated or read, is not a
  // regular file (a FIFO is refused without waiting for a writer), is larger
  // than `maxSize` (the message names the limit as that of a `kind`), or
  // grew while being read.
  std::optional<FileContents> contentsOfRegularFile(const std::string& path, size_t maxSize,
                                                    std::string_view kind,
                                                    std::string* error) const;
};

// What stands at a path that is not a regular file, for messages: "a
// directory", "a FIFO", "a character device", "a block device", "a socket".
std::string_view fileKindName(unsigned mode);

// A small file whole (settings, a device description, JSON written by hand),
// so that no file can block its reader or claim its memory: opened without
// waiting (a FIFO is refused, never waited on), a regular file only (a link to
// /dev/zero is a character device), and at most `maxSize` bytes, counted as
// read since /proc and sysfs files claim a size of 0. nullopt on failure, with
// *why the reason without the path ("not a regular file (a FIFO)", "larger
// than the 1048576-byte limit", "cannot open: Permission denied") and *err an
// errno value (EINVAL for what is not a regular file, EFBIG for too large).
std::optional<std::string> readSmallFile(const std::string& path, size_t maxSize,
                                         std::string* why = nullptr, int* err = nullptr);

}  // namespace kolvrand
