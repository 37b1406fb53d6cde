// The real daemon on temporary copies of examples/device whose settings already
// hold a boot session of earlier and a value of the aging activity's. Whatever
// it meets (hostile inputs, a kill at any moment, activities during the
// upload), it logs why, leaves the neutral result (no upload, the boot session
// not marked done, earlier settings intact) or uploads whole, keeps serving the
// aging activity and exits 0 on SIGTERM.
#include <sys/stat.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <fstream>
#include <functional>
#include <nlohmann/json.hpp>
#include <random>

#include "pipeline/PBStreamReader.h"
#include "tests/support/DaemonProcess.h"
#include "tests/support/Files.h"

namespace kolvrand::test {
namespace {

namespace fs = std::filesystem;
using nlohmann::json;
using Lines = std::vector<std::string>;

const char* const kModel = "Library/KVR/BatteryModels/T618e/2168.rcmodel";
const char* const kState = "state/com.tesvar.kolvrand.json";
const json kEarlierState = {
    {"savedBootUUID", "earlier-boot"}, {"savedChemID", 8552}, {"updateConditionMet", false}};
const std::string kBootUUID = "6f1c2b7e-3d4a-4e5f-9a1b-2c3d4e5f6a7b";  // of the example device

const std::string kExample = readFile(fs::path(KOLVRAND_SOURCE_DIR) / "examples/device" / kModel);

struct ExampleDevice {
  ExampleDevice() {
    fs::copy(fs::path(KOLVRAND_SOURCE_DIR) / "examples/device", dir, fs::copy_options::recursive);
    writeFile(path(kState), kEarlierState.dump(2));
  }
  fs::path path(const fs::path& relative) const { return dir / relative; }
  // Whole, and holding the earlier values, or the new boot session after an
  // upload.
  void expectSettings(bool uploaded) const {
    json expected = kEarlierState;
    if (uploaded) expected["savedBootUUID"] = kBootUUID;
    EXPECT_EQ(json::parse(readFile(path(kState)), nullptr, false), expected)
        << readFile(path(kState));
  }

  const TempDir temp;
  const fs::path dir = temp.path();
  std::vector<std::string> launcher;  // runs the daemon in its place, such as setpriv
};

enum class Outcome { Uploaded, Failed, NoBootSession };

// Runs the daemon until its battery-model task has ended, then asks for the
// aging activity again and again (meanwhile too, `during` the task) and stops
// it. Checks what every run must hold: a clean stop, well-formed lines, the
// task's last line once, no gigabyte spent, the activity still served, whole
// settings, a record in the driver only if it took one; returns the lines.
Lines runDaemon(const ExampleDevice& device, Outcome outcome, bool during = false) {
  DaemonProcess daemon(device.dir, "debug", device.launcher);
  const std::string last =
      outcome == Outcome::Uploaded        ? "default [main] Battery data upload succeeded"
      : outcome == Outcome::NoBootSession ? "error [main] Unable to get current boot UUID"
                                          : "error [main] Battery data upload failed";
  // Signals are served once the activity has checked in.
  EXPECT_TRUE(daemon.waitForLine({"checking in"})) << daemon.rawStderr();
  EXPECT_TRUE(during || daemon.waitForLine({last}, std::chrono::seconds(120)))
      << daemon.rawStderr();
  for (int i = 0; i < 50; ++i) {
    daemon.signal(SIGUSR1);
    std::this_thread::sleep_for(std::chrono::milliseconds(2));
  }
  EXPECT_TRUE(daemon.waitForLine({last}, std::chrono::seconds(120))) << daemon.rawStderr();
  EXPECT_TRUE(daemon.waitForLine({"compensation has finished successfully"})) << daemon.rawStderr();
  std::ifstream status("/proc/" + std::to_string(daemon.pid()) + "/status");
  long peakKiB = 0;
  for (std::string line; std::getline(status, line);)
    if (line.starts_with("VmHWM:")) peakKiB = std::stol(line.substr(6));
  EXPECT_LT(peakKiB, 1 << 20) << "KiB at peak";
  daemon.signal(SIGTERM);
  EXPECT_EQ(daemon.waitForExit(), 0) << daemon.rawStderr();

  bool wellFormed = false;
  const Lines lines = daemon.lines(&wellFormed);
  EXPECT_TRUE(wellFormed) << daemon.rawStderr();
  EXPECT_EQ(std::count(lines.begin(), lines.end(), last), 1) << daemon.rawStderr();
  device.expectSettings(outcome == Outcome::Uploaded);
  EXPECT_EQ(fs::exists(device.path("driver/battery_params.bin")), outcome == Outcome::Uploaded);
  return lines;
}

// The model padded with empty messages up to the size cap: read whole, and
// only its first message kept, so the load costs time, not gigabytes (it took
// 6 GB when every message was); and it keeps the task busy for a while, so
// that the activities asked for meanwhile overlap the upload. Both sides
// finish, the settings hold both sides' keys, and a report of ThreadSanitizer's
// (./scripts/test --tsan) would break the lines or the exit status.
TEST(Concurrency, DaemonRunsActivitiesDuringTheUpload) {
  ExampleDevice device;
  writeFile(device.path(kModel),
            kExample + std::string(PBStreamReader::kMaxFileSize - kExample.size(), '\0'));
  runDaemon(device, Outcome::Uploaded, true);
}

// Killed at random moments of its first start, the next start finds whole
// settings, the earlier ones kept, and either skips (the upload had been
// confirmed and recorded) or uploads again.
TEST(CrashSafety, DaemonKilledDuringItsWorkRecoversAtTheNextStart) {
  std::mt19937 rng(std::random_device{}());
  std::uniform_int_distribution<int> delay(0, 60);
  for (int trial = 0; trial < 40; ++trial) {
    SCOPED_TRACE("trial " + std::to_string(trial));
    ExampleDevice device;
    {
      // Going out of scope, a daemon still running is killed with SIGKILL.
      DaemonProcess first(device.dir, "default");
      std::this_thread::sleep_for(std::chrono::milliseconds(delay(rng)));
    }
    DaemonProcess second(device.dir, "default");
    ASSERT_TRUE(second.waitForLine({"upload succeeded", "Skipping"})) << second.rawStderr();
    second.signal(SIGTERM);
    EXPECT_EQ(second.waitForExit(), 0);
    device.expectSettings(true);
    // No temporary file left beside the settings and their lock.
    EXPECT_EQ(std::distance(fs::directory_iterator(device.path("state")), {}), 2);
  }
}

// A model of groups of an unknown field (1000) opened `depth` times and
// closed again, and nothing else.
std::string nestedGroups(size_t depth) {
  std::string body;
  for (size_t i = 0; i < 2 * depth; ++i) body += i < depth ? "\xc3\x3e" : "\xc4\x3e";
  std::string out;
  for (uint64_t n = body.size(); n; n >>= 7) out += static_cast<char>(n > 0x7f ? n | 0x80 : n);
  return out + body;
}

using Arrange = std::function<void(ExampleDevice&)>;
Arrange model(std::string bytes) {
  return [bytes](ExampleDevice& d) { writeFile(d.path(kModel), bytes); };
}
// Something else than a file at the model's path.
Arrange notAFile(std::function<void(const fs::path&)> make) {
  return [make](ExampleDevice& d) {
    fs::remove(d.path(kModel));
    make(d.path(kModel));
  };
}
Arrange settings(std::string text) {
  return [text](ExampleDevice& d) { writeFile(d.path(kState), text); };
}
const std::string kLoad =
    "error [batteryModelDataHandling] -[BatteryModelDataHandler loadProtobufModelWithFileName:] "
    "<Error> ";
const std::string kNotPresent = "getBatteryModelFileURLString:] <Error> file not present: @";
const std::string kAsEmpty = " is not a JSON object; reading it as empty";

// What the case does to the device, how the run ends, and part of a line of
// the run ("@" stands for the model file's path).
using Case = std::tuple<const char*, Arrange, Outcome, std::string>;
void PrintTo(const Case& c, std::ostream* os) {
  *os << std::get<0>(c);
}
const Case kCases[] = {
    {"a directory", notAFile([](const fs::path& p) { fs::create_directory(p); }), Outcome::Failed,
     "not a regular file"},
    {"a FIFO", notAFile([](const fs::path& p) { mkfifo(p.c_str(), 0600); }), Outcome::Failed,
     "not a regular file"},
    {"a symlink loop", notAFile([](const fs::path& p) { fs::create_symlink(p.filename(), p); }),
     Outcome::Failed, kNotPresent},
    {"a symlink to a dangling symlink", notAFile([](const fs::path& p) {
       fs::create_symlink("missing", p.parent_path() / "dangling");
       fs::create_symlink("dangling", p);
     }),
     Outcome::Failed, kNotPresent},
    // As root every file is readable, so the daemon runs as nobody, as a
    // service without privileges would meet a model file it may not read.
    {"unreadable",
     [](ExampleDevice& d) {
       if (geteuid() == 0) {
         for (const auto& entry : fs::recursive_directory_iterator(d.dir))
           ASSERT_EQ(lchown(entry.path().c_str(), 65534, 65534), 0);
         ASSERT_EQ(chown(d.dir.c_str(), 65534, 65534), 0);
         ASSERT_EQ(chown(d.path(kModel).c_str(), 0, 0), 0);
         d.launcher = {"/usr/bin/setpriv", "--reuid=65534", "--regid=65534", "--clear-groups"};
       }
       fs::permissions(d.path(kModel), fs::perms::none);
     },
     Outcome::Failed, kLoad + "readContent error is @: cannot open: Permission denied"},
    {"one byte over the cap", model(std::string(PBStreamReader::kMaxFileSize + 1, '\0')),
     Outcome::Failed, "4194305 bytes is larger than the 4194304-byte limit for a model file"},
    {"a length prefix of 2^63", model(std::string("\x80\x80\x80\x80\x80\x80\x80\x80\x80\x01", 10)),
     Outcome::Failed,
     "message 0 at offset 0 claims 9223372036854775808 bytes but only 0 remain in the file"},
    {"cut short", model(kExample.substr(0, kExample.size() / 2)), Outcome::Failed,
     "message 0 at offset 0 claims "},
    {"groups nested 100000 deep", model(nestedGroups(100000)), Outcome::Failed,
     "message 0 at offset 0 could not be decoded"},
    {"the example with its bytes reversed", model(std::string(kExample.rbegin(), kExample.rend())),
     Outcome::Failed, kLoad + "readContent error is "},
    // Read, then refused only because an empty model cannot fill the record.
    {"groups nested as deep as allowed", model(nestedGroups(64)), Outcome::Failed,
     "createKextModelFromProtobufModel:] <Error> R0 nil"},
    // Device data of the wrong shape (each malformed kind is in the platform
    // tests): the daemon meets a device with no boot session and no services.
    {"device.json truncated",
     [](ExampleDevice& d) { writeFile(d.path("device.json"), R"({"sysctl": {"kern.boot)"); },
     Outcome::NoBootSession, "error [device] simulated device "},
    {"a boot UUID that is not UTF-8",
     [](ExampleDevice& d) {
       json j = json::parse(readFile(d.path("device.json")));
       j["sysctl"]["kern.bootsessionuuid"] = {{"$data", "11c3281100"}};
       writeFile(d.path("device.json"), j.dump());
     },
     Outcome::NoBootSession, "error [main] Unable to get current boot UUID"},
    // Settings cut short or holding no object read as empty: the boot session
    // counts as new, the upload runs and a whole file replaces them.
    {"settings truncated", settings(kEarlierState.dump(2).substr(0, 30)), Outcome::Uploaded,
     kAsEmpty},
    {"settings an array", settings(R"(["savedBootUUID", "earlier-boot"])"), Outcome::Uploaded,
     kAsEmpty},
    {"settings a string", settings(R"("savedBootUUID")"), Outcome::Uploaded, kAsEmpty},
    {"settings empty", settings(""), Outcome::Uploaded, kAsEmpty},
    {"settings binary", settings(std::string("\x00\xff\x7b\x22", 4)), Outcome::Uploaded, kAsEmpty},
};

class HostileInput : public testing::TestWithParam<Case> {};

TEST_P(HostileInput, IsLoggedAndLeavesNothingPartial) {
  const auto& [name, arrange, outcome, part] = GetParam();
  SCOPED_TRACE(name);
  ExampleDevice device;
  arrange(device);
  if (HasFatalFailure()) return;
  const Lines lines = runDaemon(device, outcome);
  std::string line = part;
  if (auto at = line.find('@'); at != std::string::npos)
    line.replace(at, 1, device.path(kModel).string());
  const auto logged = [&](const std::string& text) {
    return std::any_of(lines.begin(), lines.end(),
                       [&](const std::string& l) { return l.find(text) != std::string::npos; });
  };
  EXPECT_TRUE(logged(line)) << testing::PrintToString(lines);
  // A refusal before the model was read whole reaches no record builder.
  EXPECT_FALSE(outcome == Outcome::Failed && line.find("createKext") == std::string::npos &&
               logged("createKextModelFromProtobufModel"))
      << testing::PrintToString(lines);
}

INSTANTIATE_TEST_SUITE_P(Daemon, HostileInput, testing::ValuesIn(kCases));

}  // namespace
}  // namespace kolvrand::test
