// The real kolvrand binary run on a simulated device, its stderr in a file.
#pragma once

#include <fcntl.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <filesystem>
#include <fstream>
#include <regex>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "tests/support/DaemonEnvironment.h"

namespace kolvrand::test {

inline std::filesystem::path daemonBinary() {
  return std::filesystem::path(KOLVRAND_BINARY_DIR) / "daemon" / "kolvrand";
}

class DaemonProcess {
 public:
  // `launcher`, when given, is a command that runs the daemon in its place
  // (its first word an absolute path), such as setpriv to drop privileges.
  DaemonProcess(const std::filesystem::path& device, const std::string& logLevel = "debug",
                std::vector<std::string> launcher = {}, std::vector<std::string> args = {})
      : stderrPath_(device / "daemon.stderr"), stdoutPath_(device / "daemon.stdout") {
    const DaemonEnvironment env(device, logLevel);
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, 2, stderrPath_.c_str(), O_WRONLY | O_CREAT | O_TRUNC,
                                     0644);
    posix_spawn_file_actions_addopen(&actions, 1, stdoutPath_.c_str(), O_WRONLY | O_CREAT | O_TRUNC,
                                     0644);
    launcher.push_back(daemonBinary().string());
    launcher.insert(launcher.end(), args.begin(), args.end());
    // A previous run's stderr must not be read as this one's: posix_spawn may
    // return before the child has opened the file (it does under qemu-user).
    std::filesystem::remove(stderrPath_);
    std::filesystem::remove(stdoutPath_);
    std::vector<char*> argv;
    for (auto& s : launcher) argv.push_back(s.data());
    argv.push_back(nullptr);
    running_ = posix_spawn(&pid_, argv[0], &actions, nullptr, argv.data(), env.envp()) == 0;
    posix_spawn_file_actions_destroy(&actions);
  }
  ~DaemonProcess() {
    if (running_) {
      kill(pid_, SIGKILL);
      waitpid(pid_, nullptr, 0);
    }
  }
  DaemonProcess(const DaemonProcess&) = delete;
  DaemonProcess& operator=(const DaemonProcess&) = delete;

  bool running() const { return running_; }
  pid_t pid() const { return pid_; }
  void signal(int sig) const {
    if (running_) kill(pid_, sig);
  }

  // Its exit status, or -1 when it did not exit within the timeout.
  int waitForExit(std::chrono::seconds timeout = std::chrono::seconds(10)) {
    auto deadline = std::chrono::steady_clock::now() + timeout;
    while (std::chrono::steady_clock::now() < deadline) {
      int status = 0;
      if (running_ && waitpid(pid_, &status, WNOHANG) == pid_) {
        running_ = false;
        return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
      }
      std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    return -1;
  }

  std::string rawStderr() const { return readAll(stderrPath_); }
  std::string rawStdout() const { return readAll(stdoutPath_); }

  // Lines as "LEVEL [category] text"; false when a line lacks the exact
  // "kolvrand[PID]: " prefix.
  std::vector<std::string> lines(bool* wellFormed = nullptr) const {
    std::vector<std::string> out;
    std::istringstream in(rawStderr());
    const std::string prefix = "kolvrand[" + std::to_string(pid_) + "]: ";
    bool ok = true;
    for (std::string line; std::getline(in, line);) {
      if (line.starts_with(prefix))
        out.push_back(line.substr(prefix.size()));
      else
        ok = false, out.push_back(line);
    }
    if (wellFormed) *wellFormed = ok;
    return out;
  }

  // Waits until a line contains one of `texts`.
  bool waitForLine(std::initializer_list<std::string_view> texts,
                   std::chrono::seconds timeout = std::chrono::seconds(10)) const {
    auto deadline = std::chrono::steady_clock::now() + timeout;
    while (std::chrono::steady_clock::now() < deadline) {
      std::string err = rawStderr();
      for (std::string_view text : texts)
        if (err.find(text) != std::string::npos) return true;
      std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    return false;
  }

 private:
  static std::string readAll(const std::filesystem::path& path) {
    std::ifstream in(path);
    std::stringstream s;
    s << in.rdbuf();
    return s.str();
  }

  std::filesystem::path stderrPath_, stdoutPath_;
  pid_t pid_ = -1;
  bool running_ = false;
};

}  // namespace kolvrand::test
