// SPDX-License-Identifier: MIT
// Memory: the real daemon's peak resident set through one battery-model task
// on a copy of the example device, and the heap allocations of one task.
#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <fstream>
#include <string>
#include <thread>
#include <vector>

#include "bench/AllocationCounter.h"
#include "bench/Fixture.h"
#include "daemon/BatteryModelTask.h"
#include "pipeline/BatteryModelDataHandler.h"
#include "pipeline/DaemonIdentifier.h"
#include "platform/Backend.h"
#include "tests/support/DaemonEnvironment.h"

namespace kolvrand::bench {

namespace {

namespace fs = std::filesystem;
using Clock = std::chrono::steady_clock;

constexpr std::string_view kSucceeded = "Battery data upload succeeded";
constexpr std::string_view kFailed = "Battery data upload failed";

// A field of /proc/PID/status in KiB, or -1.
long statusKiB(pid_t pid, const std::string& field) {
  std::ifstream in("/proc/" + std::to_string(pid) + "/status");
  for (std::string line; std::getline(in, line);) {
    if (line.starts_with(field + ":")) return std::stol(line.substr(field.size() + 1));
  }
  return -1;
}

struct DaemonRun {
  bool succeeded = false;
  double secondsToUpload = 0;  // from spawn to the success line
  long vmHWM = -1;             // KiB, once the task is over
  std::string output;
};

// Starts the daemon on `device` with its stderr on a pipe, waits for the
// task's last line, lets the task finish, reads the peak, then ends it with
// SIGTERM as the service manager would.
DaemonRun runDaemon(const fs::path& device) {
  DaemonRun run;
  int pipeFds[2];
  if (pipe2(pipeFds, O_CLOEXEC) != 0) fail("pipe2 failed");

  const test::DaemonEnvironment env(device, std::nullopt);
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_adddup2(&actions, pipeFds[1], STDERR_FILENO);
  std::string binary = KOLVRAND_DAEMON;
  char* argv[] = {binary.data(), nullptr};
  pid_t pid = -1;
  const auto start = Clock::now();
  const int spawned = posix_spawn(&pid, binary.c_str(), &actions, nullptr, argv, env.envp());
  posix_spawn_file_actions_destroy(&actions);
  ::close(pipeFds[1]);
  if (spawned != 0) fail("cannot start " + binary);

  const auto deadline = start + std::chrono::seconds(20);
  bool ended = false;
  while (!ended && Clock::now() < deadline) {
    pollfd p{pipeFds[0], POLLIN, 0};
    if (::poll(&p, 1, 100) <= 0) continue;
    char buffer[4096];
    const ssize_t n = ::read(pipeFds[0], buffer, sizeof buffer);
    if (n <= 0) break;
    run.output.append(buffer, static_cast<size_t>(n));
    if (run.output.find(kSucceeded) != std::string::npos) {
      run.secondsToUpload = std::chrono::duration<double>(Clock::now() - start).count();
      run.succeeded = ended = true;
    } else if (run.output.find(kFailed) != std::string::npos) {
      ended = true;
    }
  }
  // The task still stores the boot session after its last line.
  std::this_thread::sleep_for(std::chrono::milliseconds(100));
  run.vmHWM = statusKiB(pid, "VmHWM");
  ::kill(pid, SIGTERM);
  int status = 0;
  ::waitpid(pid, &status, 0);
  ::close(pipeFds[0]);
  return run;
}

void BM_Daemon_PeakRSS(benchmark::State& state) {
  DeviceCopy device;
  std::vector<long> hwm;
  for (auto _ : state) {
    device.resetState();
    DaemonRun run = runDaemon(device.dir());
    if (!run.succeeded) {
      state.SkipWithError(("the daemon did not upload: " + run.output).c_str());
      break;
    }
    state.SetIterationTime(run.secondsToUpload);
    hwm.push_back(run.vmHWM);
  }
  if (hwm.empty()) return;
  state.counters["VmHWM_KiB"] = static_cast<double>(*std::max_element(hwm.begin(), hwm.end()));
}

// One battery-model task in this process on a copy of the example device (the
// simulated driver writing its record and the defaults written, as in the
// daemon), its stderr lines sent to /dev/null.
void BM_Task_Allocations(benchmark::State& state) {
  DeviceCopy device;
  platform::setBackend(platform::makeSimulatedDevice(device.dir()));
  auto handler = BatteryModelDataHandler::init();
  const os_log_t mainLog = os_log_create(DaemonIdentifier, "main");

  const int savedStderr = ::dup(STDERR_FILENO);
  const int devNull = ::open("/dev/null", O_WRONLY | O_CLOEXEC);
  ::dup2(devNull, STDERR_FILENO);

  AllocationCount used;
  for (auto _ : state) {
    state.PauseTiming();
    device.resetState();
    state.ResumeTiming();
    CountAllocations counted;
    runBatteryModelTask(mainLog, handler.get());
    used = used + counted.count();
  }

  ::dup2(savedStderr, STDERR_FILENO);
  ::close(savedStderr);
  ::close(devNull);
  if (!fs::exists(device.dir() / "driver" / "battery_params.bin"))
    state.SkipWithError("the task did not upload");
  platform::setBackend(nullptr);

  const double n = static_cast<double>(state.iterations());
  if (allocationCountEnabled()) {
    state.counters["allocs"] = static_cast<double>(used.calls) / n;
    state.counters["alloc_bytes"] = static_cast<double>(used.bytes) / n;
  }
}

}  // namespace

// The peak is reported as the highest of the repetitions too.
BENCHMARK(BM_Daemon_PeakRSS)
    ->UseManualTime()
    ->Iterations(1)
    ->Unit(benchmark::kMillisecond)
    ->ComputeStatistics("max", [](const std::vector<double>& v) {
      return *std::max_element(v.begin(), v.end());
    });
BENCHMARK(BM_Task_Allocations)->UseRealTime()->Unit(benchmark::kMicrosecond);

}  // namespace kolvrand::bench
