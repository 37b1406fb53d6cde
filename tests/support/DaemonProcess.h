// SPDX-License-Identifier: MIT
// The real kolvrand binary run on a simulated device, its stderr in a file.
#pragma once

#include <signal.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <filesystem>
#include <functional>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "tests/support/DaemonEnvironment.h"
#include "tests/support/Files.h"

namespace kolvrand::test {

inline std::filesystem::path daemonBinary() {
  return std::filesystem::path(KOLVRAND_BINARY_DIR) / "daemon" / "kolvrand";
}

class DaemonProcess {
 public:
  // `launcher`, when given, is a command that runs the daemon in its place
  // (its first word an absolute path), such as setpriv to drop privileges;
  // `env` holds further "NAME=VALUE" variables.
  DaemonProcess(const std::filesystem::path& device, const std::string& logLevel = "debug",
                std::vector<std::string> launcher = {}, const std::vector<std::string>& env = {})
      : stderrPath_(device / "daemon.stderr") {
    // A previous run's stderr must not be read as this one's: posix_spawn may
    // return before the child has opened the file (it does under qemu-user).
    std::filesystem::remove(stderrPath_);
    launcher.push_back(daemonBinary().string());
    pid_ = spawnProgram(launcher, DaemonEnvironment(device, logLevel, env), {{}, {}, stderrPath_});
    running_ = pid_ > 0;
  }
  ~DaemonProcess() {
    if (running_) {
      kill(pid_, SIGKILL);
      waitpid(pid_, nullptr, 0);
    }
  }
  DaemonProcess(const DaemonProcess&) = delete;
  DaemonProcess& operator=(const DaemonProcess&) = delete;

  pid_t pid() const { return pid_; }
  void signal(int sig) const {
    if (running_) kill(pid_, sig);
  }

  // Its exit status, or -1 when it did not exit within the timeout.
  int waitForExit(std::chrono::seconds timeout = std::chrono::seconds(10)) {
    int status = 0;
    if (!poll(timeout, [&] { return running_ && waitpid(pid_, &status, WNOHANG) == pid_; }))
      return -1;
    running_ = false;
    return exitCode(status);
  }

  std::string rawStderr() const { return readFile(stderrPath_); }

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
    return poll(timeout, [&] {
      const std::string err = rawStderr();
      return std::ranges::any_of(texts, [&](auto text) { return err.find(text) != err.npos; });
    });
  }

 private:
  // Whether `done` became true within `timeout`, asked every 10 ms.
  static bool poll(std::chrono::seconds timeout, const std::function<bool()>& done) {
    const auto deadline = std::chrono::steady_clock::now() + timeout;
    for (; std::chrono::steady_clock::now() < deadline;
         std::this_thread::sleep_for(std::chrono::milliseconds(10)))
      if (done()) return true;
    return false;
  }

  std::filesystem::path stderrPath_;
  pid_t pid_ = -1;
  bool running_ = false;
};

}  // namespace kolvrand::test
