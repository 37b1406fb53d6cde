// The real daemon, run on temporary copies of the example device: what it
// prints on stderr, what it stores, and how it ends.
#include <gtest/gtest.h>

#include <algorithm>
#include <fstream>
#include <nlohmann/json.hpp>

#include "tests/support/DaemonProcess.h"

namespace kolvrand {
namespace {

namespace fs = std::filesystem;
using Lines = std::vector<std::string>;

class DeviceCopy {
 public:
  DeviceCopy() {
    char pattern[] = "/tmp/kolvrand-e2e.XXXXXX";
    dir_ = mkdtemp(pattern);
    fs::copy(fs::path(KOLVRAND_SOURCE_DIR) / "examples/device", dir_, fs::copy_options::recursive);
    std::ifstream in(dir_ / "device.json");
    json_ = nlohmann::json::parse(in);
  }
  ~DeviceCopy() { fs::remove_all(dir_); }
  const fs::path& dir() const { return dir_; }
  nlohmann::json& json() { return json_; }
  void save() const { std::ofstream(dir_ / "device.json") << json_.dump(2); }
  std::string bootUUID() const { return json_["sysctl"]["kern.bootsessionuuid"]; }
  nlohmann::json state() const {
    std::ifstream in(dir_ / "state/com.tesvar.kolvrand.json");
    return nlohmann::json::parse(in, nullptr, false);
  }

 private:
  fs::path dir_;
  nlohmann::json json_;
};

// The lines of `all` that are in `wanted`, in the order they came.
Lines only(const Lines& all, const Lines& wanted) {
  Lines out;
  std::copy_if(all.begin(), all.end(), std::back_inserter(out), [&](const std::string& l) {
    return std::find(wanted.begin(), wanted.end(), l) != wanted.end();
  });
  return out;
}

const std::string kCheckIn = "debug [main] battery aging update checking in! ";
const Lines kRun = {
    "debug [main] battery aging periodic trigger",
    "debug [main] trigger condition met, start to run some workload...",
    "debug [main] battery aging compensation has finished successfully",
};

TEST(Daemon, FirstStartUploadsRunsTheActivityAndStopsCleanly) {
  DeviceCopy device;
  test::DaemonProcess daemon(device.dir());
  ASSERT_TRUE(daemon.running());
  // The upload's last line, so that it comes before the stop's however slowly
  // the task runs (under an emulator, say).
  ASSERT_TRUE(daemon.waitForLine({"upload succeeded"}));
  ASSERT_TRUE(daemon.waitForLine({"checking in"}));
  daemon.signal(SIGUSR1);
  ASSERT_TRUE(daemon.waitForLine({"compensation has finished"}));
  daemon.signal(SIGTERM);
  EXPECT_EQ(daemon.waitForExit(), 0);

  bool wellFormed = false;
  Lines lines = daemon.lines(&wellFormed);
  EXPECT_TRUE(wellFormed) << daemon.rawStderr();
  // The task and the activity run on threads of their own: each keeps its order.
  const Lines task = {
      "debug [main] Battery data upload run for chemId 0x2168",
      "debug [batteryModelDataHandling] -[BatteryModelDataHandler getBatteryModelFileURLString:] "
      "workingDirURL resource: " +
          (device.dir() / "Library/KVR/BatteryModels/T618e/2168.rcmodel").string() + " ",
      "default [main] Battery data upload succeeded",
  };
  Lines activity = {kCheckIn};
  activity.insert(activity.end(), kRun.begin(), kRun.end());
  EXPECT_EQ(only(lines, task), task) << daemon.rawStderr();
  EXPECT_EQ(only(lines, activity), activity) << daemon.rawStderr();
  EXPECT_EQ(lines.back(), "debug [dispatch] stopping on signal 15");
  EXPECT_EQ(lines.size(), task.size() + activity.size() + 1) << daemon.rawStderr();

  EXPECT_EQ(device.state(), (nlohmann::json{{"savedBootUUID", device.bootUUID()},
                                            {"savedChemID", 8552},
                                            {"updateConditionMet", false}}));
}

TEST(Daemon, SecondStartInTheSameBootSessionSkipsAndAReebootUploadsAgain) {
  DeviceCopy device;
  for (const char* start : {"first", "second"}) {
    SCOPED_TRACE(start);
    test::DaemonProcess daemon(device.dir(), "default");
    ASSERT_TRUE(daemon.waitForLine({"upload succeeded", "Skipping"}));
    daemon.signal(SIGTERM);
    EXPECT_EQ(daemon.waitForExit(), 0);
    if (std::string(start) == "second") {
      EXPECT_EQ(daemon.lines(), Lines{"default [main] Main Unchanged boot UUID. Skipping battery "
                                      "model task"});
    }
  }
  device.json()["sysctl"]["kern.bootsessionuuid"] = "99999999-8888-7777-6666-555555555555";
  device.save();
  test::DaemonProcess daemon(device.dir(), "default");
  ASSERT_TRUE(daemon.waitForLine({"Battery data upload"}));
  daemon.signal(SIGTERM);
  EXPECT_EQ(daemon.waitForExit(), 0);
  EXPECT_EQ(daemon.lines(), Lines{"default [main] Battery data upload succeeded"});
  EXPECT_EQ(device.state()["savedBootUUID"], "99999999-8888-7777-6666-555555555555");
}

TEST(Daemon, MalformedDeviceFileIsLoggedAndTheDaemonStaysUp) {
  DeviceCopy device;
  std::ofstream(device.dir() / "device.json") << "{ not json";
  test::DaemonProcess daemon(device.dir(), "default");
  ASSERT_TRUE(daemon.waitForLine({"Unable to get current boot UUID"}));
  daemon.signal(SIGUSR1);
  daemon.signal(SIGINT);
  EXPECT_EQ(daemon.waitForExit(), 0);
  Lines lines = daemon.lines();
  EXPECT_EQ(std::count(lines.begin(), lines.end(), "error [main] Unable to get current boot UUID"),
            1)
      << daemon.rawStderr();
}

}  // namespace
}  // namespace kolvrand
