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

constexpr const char* kSuite = "com.tesvar.kolvrand";

// Settings before (`old`) and after (`!old`) trial `trial`'s writer.
json expectedValues(int trial, bool old) {
  const int n = old ? trial : trial + 1;
  return {{"savedBootUUID", "boot-" + std::to_string(n)},
          {"savedChemID", n},
          {"updateConditionMet", n % 2 == 1}};
}

void writeAll(NSUserDefaults& d, const json& values) {
  ASSERT_TRUE(d.setObject(values["savedBootUUID"].get<std::string>(), "savedBootUUID"));
  ASSERT_TRUE(d.setInteger(values["savedChemID"].get<int64_t>(), "savedChemID"));
  ASSERT_TRUE(d.setBool(values["updateConditionMet"].get<bool>(), "updateConditionMet"));
}

// The writer: three keys in turn, each write durable before the next.
pid_t startWriter(const fs::path& dir, int trial) {
  pid_t pid = fork();
  if (pid == 0) {
    auto d = NSUserDefaults::initWithSuiteName(kSuite, dir);
    const json values = expectedValues(trial, false);
    bool ok = d && d->setObject(values["savedBootUUID"].get<std::string>(), "savedBootUUID") &&
              d->setInteger(values["savedChemID"].get<int64_t>(), "savedChemID") &&
              d->setBool(values["updateConditionMet"].get<bool>(), "updateConditionMet");
    _exit(ok ? 0 : 1);
  }
  return pid;
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

  // How long one writer takes from fork to exit (the longest of three), so
  // the kills spread over its whole run.
  std::chrono::microseconds span{0};
  pid_t pid = 0;
  int status = 0;
  for (int i = 0; i < 3; ++i) {
    writeAll(*defaults, expectedValues(0, true));
    const auto start = std::chrono::steady_clock::now();
    pid = startWriter(dir, 0);
    ASSERT_EQ(waitpid(pid, &status, 0), pid);
    ASSERT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0);
    span = std::max(span, std::chrono::duration_cast<std::chrono::microseconds>(
                              std::chrono::steady_clock::now() - start));
  }

  const unsigned seed = std::random_device{}();
  std::mt19937 rng(seed);
  std::uniform_int_distribution<long> delay(0, span.count() * 5 / 4);
  int allOld = 0, mixed = 0, allNew = 0, strayTemporaries = 0;
  for (int trial = 1; trial <= kTrials; ++trial) {
    SCOPED_TRACE("trial " + std::to_string(trial) + ", seed " + std::to_string(seed));
    writeAll(*defaults, expectedValues(trial, true));
    pid = startWriter(dir, trial);
    ASSERT_GT(pid, 0);
    std::this_thread::sleep_for(std::chrono::microseconds(delay(rng)));
    kill(pid, SIGKILL);
    ASSERT_EQ(waitpid(pid, &status, 0), pid);

    std::ifstream in(dir / (std::string(kSuite) + ".json"));
    const json content = json::parse(in, nullptr, false);
    ASSERT_TRUE(content.is_object()) << "trial " << trial;
    ASSERT_EQ(content.size(), 4u) << content.dump();
    EXPECT_EQ(content.value("other", json()), "kept");
    int fresh = 0;
    const json before = expectedValues(trial, true), after = expectedValues(trial, false);
    for (auto& [key, old] : before.items()) {
      const json now = content.value(key, json());
      const json& updated = after[key];
      EXPECT_TRUE(now == old || now == updated) << key << " is " << now.dump();
      fresh += now == updated;
    }
    (fresh == 0 ? allOld : fresh == 3 ? allNew : mixed)++;
    // A writer killed between creating its temporary file and renaming it
    // leaves that file behind; the next write removes it.
    auto temporaries = [&] {
      int n = 0;
      for (const auto& entry : fs::directory_iterator(dir)) {
        const std::string name = entry.path().filename().string();
        n += name.starts_with(std::string(kSuite) + ".json.") &&
             name != std::string(kSuite) + ".json.lock";
      }
      return n;
    };
    strayTemporaries += temporaries();
    ASSERT_TRUE(defaults->setObject("kept", "other"));
    EXPECT_EQ(temporaries(), 0);
  }
  std::printf(
      "%d trials (one writer %lld us): all old %d, mixed %d, all new %d; "
      "%d temporary files left by killed writers, each removed by the next write\n",
      kTrials, static_cast<long long>(span.count()), allOld, mixed, allNew, strayTemporaries);
  // The kills landed before, during and after the writes.
  EXPECT_GT(allOld, 0);
  EXPECT_GT(mixed, 0);
  EXPECT_GT(allNew, 0);
  fs::remove_all(dir);
}

// The real daemon killed at random moments of its first start: the next
// start finds whole settings and either skips (the upload had been confirmed
// and recorded) or uploads again.
TEST(CrashSafety, DaemonKilledDuringItsWorkRecoversAtTheNextStart) {
  constexpr int kTrials = 40;
  std::mt19937 rng(std::random_device{}());
  std::uniform_int_distribution<int> delay(0, 60);
  int skipped = 0, uploaded = 0;
  for (int trial = 0; trial < kTrials; ++trial) {
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
    const std::string out = second.rawStderr();
    (out.find("Skipping") != std::string::npos ? skipped : uploaded)++;
    std::ifstream in(dir / "state" / (std::string(kSuite) + ".json"));
    const json state = json::parse(in, nullptr, false);
    EXPECT_EQ(state.value("savedBootUUID", ""), "6f1c2b7e-3d4a-4e5f-9a1b-2c3d4e5f6a7b")
        << state.dump();
    fs::remove_all(dir);
  }
  std::printf("%d daemons killed: the next start skipped %d times, uploaded %d times\n", kTrials,
              skipped, uploaded);
}

}  // namespace
}  // namespace kolvrand
