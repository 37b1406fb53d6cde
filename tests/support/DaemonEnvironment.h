// SPDX-License-Identifier: MIT
// The project's programs started on a simulated device: their environment
// (this process's own, without anything of the daemon's that it may carry,
// nor the service manager's socket of a test run as a service)
// and their start.
#pragma once

#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>

#include <filesystem>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

extern char** environ;

namespace kolvrand::test {

// Owns the strings; envp() is what posix_spawn takes. `extra` ("NAME=VALUE")
// replaces this process's variable of the same name.
class DaemonEnvironment {
 public:
  DaemonEnvironment(const std::filesystem::path& device, std::optional<std::string> logLevel,
                    const std::vector<std::string>& extra = {}) {
    const auto replaced = [&](std::string_view v) {
      for (const std::string& e : extra)
        if (v.starts_with(e.substr(0, e.find('=') + 1))) return true;
      return false;
    };
    for (char** e = environ; *e; ++e) {
      std::string_view v(*e);
      if (!v.starts_with("KOLVRAND_") && !v.starts_with("JOURNAL_STREAM=") &&
          !v.starts_with("STATE_DIRECTORY=") && !v.starts_with("NOTIFY_SOCKET=") && !replaced(v))
        strings_.emplace_back(v);
    }
    strings_.insert(strings_.end(), extra.begin(), extra.end());
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

// Starts `argv` (its first word an absolute path) with `env`, its standard
// input, output and error opened on `files` (an empty one is inherited), in
// `dir` when given; its pid, or -1.
inline pid_t spawnProgram(std::vector<std::string> argv, const DaemonEnvironment& env,
                          const std::filesystem::path (&files)[3],
                          const std::filesystem::path& dir = {}) {
  std::vector<char*> pointers;
  for (auto& s : argv) pointers.push_back(s.data());
  pointers.push_back(nullptr);
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  for (int fd = 0; fd < 3; ++fd)
    if (!files[fd].empty())
      posix_spawn_file_actions_addopen(&actions, fd, files[fd].c_str(),
                                       fd == 0 ? O_RDONLY : O_WRONLY | O_CREAT | O_TRUNC, 0644);
  if (!dir.empty()) posix_spawn_file_actions_addchdir_np(&actions, dir.c_str());
  pid_t pid = -1;
  if (posix_spawn(&pid, pointers[0], &actions, nullptr, pointers.data(), env.envp()) != 0) pid = -1;
  posix_spawn_file_actions_destroy(&actions);
  return pid;
}

// A waitpid status as a shell reports it: the exit status, or 128 + the signal.
inline int exitCode(int status) {
  return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

}  // namespace kolvrand::test
