// SPDX-License-Identifier: MIT
// Runs the real rcmodel binary: arguments, standard input and environment in,
// exit status, standard output and standard error out.
#pragma once

#include <filesystem>
#include <string>
#include <vector>

#include "tests/support/DaemonEnvironment.h"
#include "tests/support/Files.h"

namespace kolvrand::test {

struct ToolRun {
  int status = -1;  // the exit status, or 128 + the signal
  std::string out;
  std::string err;
};

// A temporary directory that the runs work in.
struct Scratch : TempDir {
  // rcmodel ARGS in this directory, with `input` on stdin, on the simulated
  // device `device` (by default this directory, which holds none, so that no
  // run reaches the host's state). `launcher`, when given, is a command that
  // runs rcmodel in its place (its first word an absolute path), such as
  // setpriv to drop root's privileges.
  ToolRun rcmodel(const std::vector<std::string>& args, const std::string& input = "",
                  const std::string& device = "", std::vector<std::string> launcher = {}) const {
    const std::filesystem::path files[] = {*this / ".stdin", *this / ".stdout", *this / ".stderr"};
    writeFile(files[0], input);
    launcher.push_back(std::string(KOLVRAND_BINARY_DIR) + "/tools/rcmodel/rcmodel");
    launcher.insert(launcher.end(), args.begin(), args.end());
    const DaemonEnvironment env(device.empty() ? path() : std::filesystem::path(device), {});
    const pid_t pid = spawnProgram(launcher, env, files, path());
    int status = 0;
    const int code = pid > 0 && waitpid(pid, &status, 0) == pid ? exitCode(status) : -1;
    return {code, readFile(files[1]), readFile(files[2])};
  }
};

}  // namespace kolvrand::test
