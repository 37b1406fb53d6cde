// Runs the real rcmodel binary: arguments, standard input and environment in,
// exit status, standard output and standard error out.
#pragma once

#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>

#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

#include "tests/support/DaemonEnvironment.h"

namespace kolvrand::test {

inline std::string readWhole(const std::filesystem::path& path) {
  std::ifstream in(path, std::ios::binary);
  return std::string(std::istreambuf_iterator<char>(in), {});
}

inline void writeWhole(const std::filesystem::path& path, const std::string& bytes) {
  std::ofstream(path, std::ios::binary | std::ios::trunc) << bytes;
}

struct ToolRun {
  int status = -1;  // the exit status, or 128 + the signal
  std::string out;
  std::string err;
};

// A temporary directory that the runs work in and that is removed afterwards.
class Scratch {
 public:
  Scratch() {
    char pattern[] = "/tmp/rcmodel-test.XXXXXX";
    dir_ = mkdtemp(pattern);
  }
  ~Scratch() {
    std::error_code ec;
    std::filesystem::remove_all(dir_, ec);
  }
  Scratch(const Scratch&) = delete;
  Scratch& operator=(const Scratch&) = delete;

  std::filesystem::path operator/(const std::string& name) const { return dir_ / name; }

  // rcmodel ARGS in this directory, with `input` on stdin, on the simulated
  // device `device` (by default this directory, which holds none, so that no
  // run reaches the host's state). `launcher`, when given, is a command that
  // runs rcmodel in its place (its first word an absolute path), such as
  // setpriv to drop root's privileges.
  ToolRun rcmodel(const std::vector<std::string>& args, const std::string& input = "",
                  const std::string& device = "", std::vector<std::string> launcher = {}) const {
    const std::string files[] = {dir_ / ".stdin", dir_ / ".stdout", dir_ / ".stderr"};
    writeWhole(files[0], input);
    const DaemonEnvironment env(device.empty() ? dir_ : std::filesystem::path(device), {});
    launcher.push_back(std::string(KOLVRAND_BINARY_DIR) + "/tools/rcmodel/rcmodel");
    launcher.insert(launcher.end(), args.begin(), args.end());
    std::vector<char*> argv;
    for (auto& s : launcher) argv.push_back(s.data());
    argv.push_back(nullptr);

    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    for (int fd = 0; fd < 3; ++fd)
      posix_spawn_file_actions_addopen(&actions, fd, files[fd].c_str(),
                                       fd == 0 ? O_RDONLY : O_WRONLY | O_CREAT | O_TRUNC, 0644);
    posix_spawn_file_actions_addchdir_np(&actions, dir_.c_str());
    pid_t pid = -1;
    int status = 0, code = -1;
    if (posix_spawn(&pid, argv[0], &actions, nullptr, argv.data(), env.envp()) == 0 &&
        waitpid(pid, &status, 0) == pid)
      code = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
    posix_spawn_file_actions_destroy(&actions);
    return {code, readWhole(files[1]), readWhole(files[2])};
  }

 private:
  std::filesystem::path dir_;
};

}  // namespace kolvrand::test
