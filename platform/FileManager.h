// The file manager's system Library directory and file existence test.
#pragma once

#include <filesystem>
#include <optional>
#include <string>

namespace kolvrand {

enum NSSearchPathDirectory : unsigned long { NSLibraryDirectory = 5 };
enum NSSearchPathDomainMask : unsigned long { NSSystemDomainMask = 8 };

// Paths stand in for file URLs.
using NSURL = std::filesystem::path;

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

}  // namespace kolvrand
