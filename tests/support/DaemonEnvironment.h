// The environment the daemon is started with on a simulated device: this
// process's own, without anything of the daemon's that it may carry.
#pragma once

#include <filesystem>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

extern char** environ;

namespace kolvrand::test {

// Owns the strings; envp() is what posix_spawn takes.
class DaemonEnvironment {
 public:
  DaemonEnvironment(const std::filesystem::path& device, std::optional<std::string> logLevel) {
    for (char** e = environ; *e; ++e) {
      std::string_view v(*e);
      if (!v.starts_with("KOLVRAND_") && !v.starts_with("JOURNAL_STREAM=") &&
          !v.starts_with("STATE_DIRECTORY="))
        strings_.emplace_back(v);
    }
    strings_.push_back("KOLVRAND_DEVICE=" + device.string());
    if (logLevel) strings_.push_back("KOLVRAND_LOG_LEVEL=" + *logLevel);
    for (auto& s : strings_) pointers_.push_back(s.data());
    pointers_.push_back(nullptr);
  }
  DaemonEnvironment(const DaemonEnvironment&) = delete;
  DaemonEnvironment& operator=(const DaemonEnvironment&) = delete;

  char* const* envp() const { return pointers_.data(); }

 private:
  std::vector<std::string> strings_;
  std::vector<char*> pointers_;
};

}  // namespace kolvrand::test
