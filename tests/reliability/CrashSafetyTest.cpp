// The settings survive a writer killed at any moment: a child process
// rewrites every key of a suite while the test kills it with SIGKILL at a
// random time; afterwards the file must parse and hold, for each key, either
// its old or its new value, and the next writer must not be blocked.
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <chrono>
#include <filesystem>
#include <fstream>
#include <nlohmann/json.hpp>
#include <random>
#include <thread>

#include "platform/Defaults.h"
#include "platform/Log.h"
#include "tests/support/DaemonProcess.h"

namespace kolvrand {
namespace {

namespace fs = std::filesystem;
using nlohmann::json;

const std::string kSuite = "com.tesvar.kolvrand";

// The settings after trial `n`'s writer (before it: those of n - 1).
json valuesOf(int n) {
  return {{"savedBootUUID", "boot-" + std::to_string(n)},
          {"savedChemID", n},
          {"updateConditionMet", n % 2 == 1}};
}

// Three keys in turn, each write durable before the next.
bool writeAll(NSUserDefaults& d, const json& v) {
  return d.setObject(v["savedBootUUID"].get<std::string>(), "savedBootUUID") &&
         d.setInteger(v["savedChemID"].get<int64_t>(), "savedChemID") &&
         d.setBool(v["updateConditionMet"].get<bool>(), "updateConditionMet");
}

// Runs trial `n`'s writer in a child process, killed after `delay` (never
// for a negative one); returns how long it ran.
std::chrono::microseconds runWriter(const fs::path& dir, int n, std::chrono::microseconds delay) {
  const auto start = std::chrono::steady_clock::now();
  pid_t pid = fork();
  if (pid == 0) {
    auto d = NSUserDefaults::initWithSuiteName(kSuite, dir);
    _exit(d && writeAll(*d, valuesOf(n)) ? 0 : 1);
  }
  int status = 0;
  if (delay.count() >= 0) {
    std::this_thread::sleep_for(delay);
    kill(pid, SIGKILL);
  }
  EXPECT_EQ(waitpid(pid, &status, 0), pid);
  EXPECT_TRUE(delay.count() >= 0 || (WIFEXITED(status) && WEXITSTATUS(status) == 0));
  return std::chrono::duration_cast<std::chrono::microseconds>(std::chrono::steady_clock::now() -
                                                               start);
}

TEST(CrashSafety, SettingsHoldOldOrNewValuesAfterAWriterIsKilled) {
  constexpr int kTrials = 300;
  char pattern[] = "/var/tmp/kolvrand-crash.XXXXXX";
  const fs::path dir = mkdtemp(pattern);
  setLogSink(nullptr);
  auto defaults = NSUserDefaults::initWithSuiteName(kSuite, dir);
  ASSERT_TRUE(defaults);
  // A key no writer touches, which must never be lost.
  ASSERT_TRUE(defaults->setObject("kept", "other"));

  // How long one whole writer takes (the longest of three), so the kills
  // spread over its whole run.
  std::chrono::microseconds span{0};
  for (int i = 0; i < 3; ++i) {
    ASSERT_TRUE(writeAll(*defaults, valuesOf(-1)));
    span = std::max(span, runWriter(dir, 0, std::chrono::microseconds(-1)));
  }
  const unsigned seed = std::random_device{}();
  std::mt19937 rng(seed);
  std::uniform_int_distribution<long> delay(0, span.count() * 5 / 4);
  // A writer killed between creating its temporary file and renaming it
  // leaves that file behind; the next write removes it.
  const auto temporaries = [&] {
    int n = 0;
    for (const auto& entry : fs::directory_iterator(dir)) {
      const std::string name = entry.path().filename().string();
      n += name.starts_with(kSuite + ".json.") && name != kSuite + ".json.lock";
    }
    return n;
  };
  int outcomes[4] = {};  // by how many keys hold the new value
  for (int trial = 1; trial <= kTrials; ++trial) {
    SCOPED_TRACE("trial " + std::to_string(trial) + ", seed " + std::to_string(seed));
    ASSERT_TRUE(writeAll(*defaults, valuesOf(trial - 1)));
    runWriter(dir, trial, std::chrono::microseconds(delay(rng)));

    std::ifstream in(dir / (kSuite + ".json"));
    const json content = json::parse(in, nullptr, false);
    ASSERT_TRUE(content.is_object());
    ASSERT_EQ(content.size(), 4u) << content.dump();
    EXPECT_EQ(content.value("other", json()), "kept");
    int fresh = 0;
    const json before = valuesOf(trial - 1), after = valuesOf(trial);
    for (auto& [key, old] : before.items()) {
      const json now = content.value(key, json());
      EXPECT_TRUE(now == old || now == after[key]) << key << " is " << now.dump();
      fresh += now == after[key];
    }
    outcomes[fresh]++;
    ASSERT_TRUE(defaults->setObject("kept", "other"));
    EXPECT_EQ(temporaries(), 0);
  }
  // The kills landed before, during and after the writes.
  EXPECT_GT(outcomes[0], 0);
  EXPECT_GT(outcomes[1] + outcomes[2], 0);
  EXPECT_GT(outcomes[3], 0);
  fs::remove_all(dir);
}

// The real daemon killed at random moments of its first start: the next
// start finds whole settings and either skips (the upload had been confirmed
// and recorded) or uploads again.
TEST(CrashSafety, DaemonKilledDuringItsWorkRecoversAtTheNextStart) {
  std::mt19937 rng(std::random_device{}());
  std::uniform_int_distribution<int> delay(0, 60);
  for (int trial = 0; trial < 40; ++trial) {
    SCOPED_TRACE("trial " + std::to_string(trial));
    char pattern[] = "/tmp/kolvrand-kill.XXXXXX";
    const fs::path dir = mkdtemp(pattern);
    fs::copy(fs::path(KOLVRAND_SOURCE_DIR) / "examples/device", dir, fs::copy_options::recursive);
    {
      test::DaemonProcess first(dir, "default");
      std::this_thread::sleep_for(std::chrono::milliseconds(delay(rng)));
      first.signal(SIGKILL);
      first.waitForExit();
    }
    test::DaemonProcess second(dir, "default");
    ASSERT_TRUE(second.waitForLine({"upload succeeded", "Skipping"})) << second.rawStderr();
    second.signal(SIGTERM);
    EXPECT_EQ(second.waitForExit(), 0);
    std::ifstream in(dir / "state" / (kSuite + ".json"));
    const json state = json::parse(in, nullptr, false);
    EXPECT_EQ(state.value("savedBootUUID", ""), "6f1c2b7e-3d4a-4e5f-9a1b-2c3d4e5f6a7b")
        << state.dump();
    fs::remove_all(dir);
  }
}

}  // namespace
}  // namespace kolvrand
