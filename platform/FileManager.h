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

}  // namespace kolvrand
