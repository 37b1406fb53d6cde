#include "platform/FileManager.h"

#include <sys/stat.h>

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

}  // namespace kolvrand
