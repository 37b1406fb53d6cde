// The two sides that may overlap in the daemon, the battery-model task and the
// aging activity's handler, run side by side many times; and many writers of
// one settings suite, threads and processes, run at once. Run under
// ThreadSanitizer by ./scripts/test --tsan.
#include <sys/wait.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <algorithm>
#include <fstream>
#include <thread>

#include "daemon/BatteryAgingActivity.h"
#include "daemon/BatteryModelTask.h"
#include "pipeline/BatteryModelDataHandler.h"
#include "pipeline/DaemonIdentifier.h"
#include "platform/Defaults.h"
#include "tests/support/DaemonProcess.h"
#include "tests/support/TestDevice.h"

namespace kolvrand {
namespace {

namespace fs = std::filesystem;

nlohmann::json finalState(const std::string& bootUUID) {
  return {{"savedBootUUID", bootUUID}, {"savedChemID", 8552}, {"updateConditionMet", false}};
}

TEST(Concurrency, ActivityHandlerBesideTheBatteryModelTask) {
  constexpr int kRounds = 12, kRunsPerRound = 4;
  test::TestDevice device;
  std::ifstream in(fs::path(KOLVRAND_SOURCE_DIR) /
                       "examples/device/Library/KVR/BatteryModels/T618e/2168.rcmodel",
                   std::ios::binary);
  device.installModel("T618e/2168.rcmodel", {std::istreambuf_iterator<char>(in), {}});
  const os_log_t mainLog = os_log_create(DaemonIdentifier, "main");
  auto handler = BatteryModelDataHandler::init();
  auto agent = ConditionCheckingAgent::init();
  auto defaults = NSUserDefaults::initWithSuiteName(DaemonIdentifier);
  ASSERT_TRUE(handler && agent && defaults);

  for (int round = 0; round < kRounds; ++round) {
    // A new boot session each round, so every task uploads and writes.
    ASSERT_TRUE(defaults->setObject("", "savedBootUUID"));
    std::thread task([&] { runBatteryModelTask(mainLog, handler.get()); });
    for (int i = 0; i < kRunsPerRound; ++i) {
      XPCActivity run{"com.tesvar.kolvrand.batteryAgingUpdate", XPC_ACTIVITY_STATE_RUN};
      batteryAgingActivityHandler(&run, mainLog, agent.get());
    }
    task.join();
  }

  const auto lines = device.logLines();
  const auto count = [&](const std::string& line) {
    return static_cast<int>(std::count(lines.begin(), lines.end(), line));
  };
  EXPECT_EQ(count("default [main] Battery data upload succeeded"), kRounds);
  EXPECT_EQ(count("debug [main] battery aging compensation has finished successfully"),
            kRounds * kRunsPerRound);
  EXPECT_TRUE(std::none_of(lines.begin(), lines.end(), [](const std::string& l) {
    return l.starts_with("error");
  })) << testing::PrintToString(lines);
  EXPECT_EQ(device.state(), finalState("11111111-2222-3333-4444-555555555555"));
}

// The real daemon, asked for the activity again and again while its task
// uploads: both finish, the settings hold both sides' keys, and it stops
// cleanly (a sanitizer report would break the lines or the exit status).
TEST(Concurrency, DaemonRunsActivitiesDuringTheUpload) {
  char pattern[] = "/tmp/kolvrand-concurrent.XXXXXX";
  const fs::path dir = mkdtemp(pattern);
  fs::copy(fs::path(KOLVRAND_SOURCE_DIR) / "examples/device", dir, fs::copy_options::recursive);
  {
    test::DaemonProcess daemon(dir);
    ASSERT_TRUE(daemon.waitForLine({"checking in"}));
    for (int i = 0; i < 50; ++i) {
      daemon.signal(SIGUSR1);
      std::this_thread::sleep_for(std::chrono::milliseconds(2));
    }
    ASSERT_TRUE(daemon.waitForLine({"Battery data upload succeeded"})) << daemon.rawStderr();
    ASSERT_TRUE(daemon.waitForLine({"compensation has finished"})) << daemon.rawStderr();
    daemon.signal(SIGTERM);
    EXPECT_EQ(daemon.waitForExit(), 0) << daemon.rawStderr();
    bool wellFormed = false;
    daemon.lines(&wellFormed);
    EXPECT_TRUE(wellFormed) << daemon.rawStderr();
  }
  std::ifstream in(dir / "state/com.tesvar.kolvrand.json");
  EXPECT_EQ(nlohmann::json::parse(in, nullptr, false),
            finalState("6f1c2b7e-3d4a-4e5f-9a1b-2c3d4e5f6a7b"));
  fs::remove_all(dir);
}

// Each writer counts its own key up, reading it back after every write; no
// write of any writer may be lost, and no read may see an older value.
TEST(Concurrency, WritersOfOneSuiteLoseNothing) {
  constexpr int kProcesses = 2, kThreads = 4, kWrites = 40;
  char pattern[] = "/var/tmp/kolvrand-writers.XXXXXX";
  const fs::path dir = mkdtemp(pattern);
  const std::string suite = "com.tesvar.kolvrand";
  auto writer = [&](const std::string& key) {
    auto d = NSUserDefaults::initWithSuiteName(suite, dir);
    for (int n = 1; n <= kWrites; ++n)
      if (!d || !d->setObject(std::to_string(n), key) || d->stringForKey(key) != std::to_string(n))
        return false;
    return true;
  };
  // The processes first, while this one has a single thread to fork.
  std::vector<pid_t> children;
  for (int p = 0; p < kProcesses; ++p) {
    pid_t pid = fork();
    if (pid == 0) _exit(writer("process" + std::to_string(p)) ? 0 : 1);
    ASSERT_GT(pid, 0);
    children.push_back(pid);
  }
  std::vector<std::thread> threads;
  std::vector<char> ok(kThreads, 0);
  for (int t = 0; t < kThreads; ++t)
    threads.emplace_back([&, t] { ok[t] = writer("thread" + std::to_string(t)); });
  for (auto& t : threads) t.join();
  for (pid_t pid : children) {
    int status = 0;
    ASSERT_EQ(waitpid(pid, &status, 0), pid);
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0);
  }
  EXPECT_EQ(std::count(ok.begin(), ok.end(), 1), kThreads);
  auto d = NSUserDefaults::initWithSuiteName(suite, dir);
  for (const char* who : {"process", "thread"})
    for (int i = 0; i < (who[0] == 'p' ? kProcesses : kThreads); ++i)
      EXPECT_EQ(d->stringForKey(who + std::to_string(i)), std::to_string(kWrites));
  fs::remove_all(dir);
}

}  // namespace
}  // namespace kolvrand
