// SPDX-License-Identifier: MIT
// Writers of one settings suite in other processes and threads: one killed at
// any moment leaves whole settings, and writers at once lose nothing.
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>
#include <random>
#include <thread>

#include "platform/Defaults.h"
#include "tests/support/Files.h"

namespace kolvrand {
namespace {

namespace fs = std::filesystem;
using std::chrono::microseconds;

const std::string kSuite = "com.tesvar.kolvrand";

// Each writer in a scratch directory of its own, on disk rather than in memory
// so that a write takes the time a real one does.
const char* const kDisk = "/var/tmp";

// Waits for the child `pid`; true when it exited with status 0.
bool exitedCleanly(pid_t pid) {
  int status = 0;
  return waitpid(pid, &status, 0) == pid && WIFEXITED(status) && WEXITSTATUS(status) == 0;
}

// A child process counts "value" up from `from` three times, each write durable
// before the next, and is killed with SIGKILL after `delay` (never for a
// negative one); returns how long it ran.
microseconds runWriter(const fs::path& dir, int64_t from, microseconds delay) {
  const auto start = std::chrono::steady_clock::now();
  const pid_t pid = fork();
  if (pid == 0) {
    auto d = NSUserDefaults::initWithSuiteName(kSuite, dir);
    for (int64_t n = from + 1; d && n <= from + 3; ++n)
      if (!d->setObject(std::to_string(n), "value")) _exit(1);
    _exit(d ? 0 : 1);
  }
  if (delay.count() >= 0) {
    std::this_thread::sleep_for(delay);
    kill(pid, SIGKILL);
  }
  EXPECT_TRUE(exitedCleanly(pid) || delay.count() >= 0);
  return std::chrono::duration_cast<microseconds>(std::chrono::steady_clock::now() - start);
}

// Afterwards the settings hold a value the writer wrote or the one before it,
// and the key no writer touches; the next writer is not blocked and removes
// the temporary file a writer killed before its rename leaves.
TEST(CrashSafety, SettingsStayWholeWhenAWriterIsKilled) {
  const test::TempDir scratch(kDisk);
  auto defaults = NSUserDefaults::initWithSuiteName(kSuite, scratch.path());
  ASSERT_TRUE(defaults && defaults->setObject("kept", "other"));
  // How long a whole writer takes (the longest of three), so that the kills
  // spread over its whole run.
  microseconds span{0};
  for (int i = 0; i < 3; ++i) span = std::max(span, runWriter(scratch.path(), 0, microseconds(-1)));
  const unsigned seed = std::random_device{}();
  std::mt19937 rng(seed);
  std::uniform_int_distribution<long> delay(0, span.count() * 5 / 4);
  int outcomes[3] = {};  // none, some or all of the writes made
  for (int64_t trial = 1; trial <= 300; ++trial) {
    SCOPED_TRACE("trial " + std::to_string(trial) + ", seed " + std::to_string(seed));
    // The next writer is not blocked, and leaves the settings and their lock,
    // no temporary file.
    ASSERT_TRUE(defaults->setObject(std::to_string(trial * 100), "value"));
    EXPECT_EQ(std::distance(fs::directory_iterator(scratch.path()), {}), 2);
    runWriter(scratch.path(), trial * 100, microseconds(delay(rng)));
    const int64_t value = std::stoll(defaults->stringForKey("value").value_or("-1"));
    ASSERT_TRUE(value >= trial * 100 && value <= trial * 100 + 3) << value;
    EXPECT_EQ(defaults->stringForKey("other"), "kept");
    outcomes[(value > trial * 100) + (value == trial * 100 + 3)]++;
  }
  EXPECT_EQ(std::count(outcomes, outcomes + 3, 0), 0) << "kills before, amid and after the writes";
}

// Each writer counts its own key up, reading it back after every write; no
// write of any writer may be lost, and no read may see an older value.
TEST(Concurrency, WritersOfOneSuiteLoseNothing) {
  constexpr int kProcesses = 2, kThreads = 4, kWrites = 40;  // as the keys below
  const test::TempDir scratch(kDisk);
  const auto writer = [&](const std::string& key) {
    auto d = NSUserDefaults::initWithSuiteName(kSuite, scratch.path());
    for (int n = 1; n <= kWrites; ++n)
      if (!d || !d->setObject(std::to_string(n), key) || d->stringForKey(key) != std::to_string(n))
        return false;
    return true;
  };
  // The processes first, while this one has a single thread to fork.
  std::vector<pid_t> children;
  for (int p = 0; p < kProcesses; ++p) {
    children.push_back(fork());
    if (children.back() == 0) _exit(writer("process" + std::to_string(p)) ? 0 : 1);
  }
  std::vector<std::thread> threads;
  std::vector<char> ok(kThreads, 0);
  for (int t = 0; t < kThreads; ++t)
    threads.emplace_back([&, t] { ok[t] = writer("thread" + std::to_string(t)); });
  for (auto& t : threads) t.join();
  EXPECT_EQ(ok, std::vector<char>(kThreads, 1));
  for (pid_t pid : children) EXPECT_TRUE(exitedCleanly(pid));
  auto d = NSUserDefaults::initWithSuiteName(kSuite, scratch.path());
  for (const char* key : {"process0", "process1", "thread0", "thread1", "thread2", "thread3"})
    EXPECT_EQ(d->stringForKey(key), std::to_string(kWrites)) << key;
}

}  // namespace
}  // namespace kolvrand
