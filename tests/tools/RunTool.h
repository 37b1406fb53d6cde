// Runs the real rcmodel binary: arguments, standard input and environment in,
// exit status, standard output and standard error out.
#pragma once

#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

extern char** environ;

namespace kolvrand::test {

inline std::filesystem::path rcmodelBinary() {
  return std::filesystem::path(KOLVRAND_BINARY_DIR) / "tools" / "rcmodel" / "rcmodel";
}

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

  const std::filesystem::path& dir() const { return dir_; }
  // A command that runs rcmodel in its place (its first word an absolute
  // path), such as setpriv to drop root's privileges.
  std::vector<std::string> launcher;
  std::filesystem::path operator/(const std::string& name) const { return dir_ / name; }

  // rcmodel ARGS in this directory, with `input` on stdin. KOLVRAND_DEVICE
  // is set to `device` when given and removed otherwise.
  ToolRun rcmodel(const std::vector<std::string>& args, const std::string& input = "",
                  const std::string& device = "") const {
    writeWhole(dir_ / ".stdin", input);
    std::vector<std::string> env;
    for (char** e = environ; *e; ++e) {
      std::string_view v(*e);
      if (!v.starts_with("KOLVRAND_") && !v.starts_with("STATE_DIRECTORY=")) env.emplace_back(v);
    }
    if (!device.empty()) env.push_back("KOLVRAND_DEVICE=" + device);
    std::vector<char*> envp;
    for (auto& s : env) envp.push_back(s.data());
    envp.push_back(nullptr);

    std::string binary = rcmodelBinary().string();
    std::vector<std::string> argStrings = launcher;
    argStrings.push_back(binary);
    argStrings.insert(argStrings.end(), args.begin(), args.end());
    std::vector<char*> argv;
    for (auto& s : argStrings) argv.push_back(s.data());
    argv.push_back(nullptr);

    const std::string in = (dir_ / ".stdin").string(), out = (dir_ / ".stdout").string(),
                      err = (dir_ / ".stderr").string();
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, 0, in.c_str(), O_RDONLY, 0);
    posix_spawn_file_actions_addopen(&actions, 1, out.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
    posix_spawn_file_actions_addopen(&actions, 2, err.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
    posix_spawn_file_actions_addchdir_np(&actions, dir_.c_str());
    ToolRun run;
    pid_t pid = -1;
    if (posix_spawn(&pid, argv[0], &actions, nullptr, argv.data(), envp.data()) == 0) {
      int status = 0;
      waitpid(pid, &status, 0);
      run.status = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
    }
    posix_spawn_file_actions_destroy(&actions);
    run.out = readWhole(out);
    run.err = readWhole(err);
    return run;
  }

 private:
  std::filesystem::path dir_;
};

}  // namespace kolvrand::test
