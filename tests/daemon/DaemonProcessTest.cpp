// The real daemon, run on temporary copies of the example device: what it
// prints on stderr, what it stores, and how it ends.
#include <gtest/gtest.h>

#include <algorithm>
#include <fstream>
#include <nlohmann/json.hpp>

#include "tests/support/DaemonProcess.h"
#include "tests/tools/RunTool.h"

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

// Whoever sets the target type must not lead the daemon out of the Library:
// a device type that is no directory name is answered as a missing file,
// whatever lies where it points, and rcmodel status says the same.
TEST(Daemon, DeviceTypeThatIsNoDirectoryNameNamesNoFile) {
  const std::string kOld = "00000000-0000-0000-0000-000000000000";
  const std::vector<std::string> types = {
      "..", ".", "", "a/b", "/ABS", "../../../x", std::string("x\0/../../../x", 14)};
  for (std::string type : types) {
    SCOPED_TRACE(type);
    DeviceCopy device;
    const fs::path models = device.dir() / "Library/KVR/BatteryModels";
    if (type == "/ABS") type = (device.dir() / "x").string();
    // A chem ID outside the table, so the target type decides, and its model
    // wherever the type would lead.
    device.json()["registry"]["TesvarSmartBattery"]["BatteryData"]["AlgoChemID"] = 0x1234;
    device.json()["sysctl"]["hw.targettype"] = type;
    device.save();
    const std::string model = test::readWhole(models / "T618e/2168.rcmodel");
    for (const fs::path dir :
         {models, models / "a/b", device.dir() / "x", device.dir() / "Library/KVR"}) {
      fs::create_directories(dir);
      test::writeWhole(dir / "1234.rcmodel", model);
    }
    fs::create_directories(device.dir() / "state");
    std::ofstream(device.dir() / "state/com.tesvar.kolvrand.json")
        << nlohmann::json{{"savedBootUUID", kOld}}.dump();

    test::DaemonProcess daemon(device.dir(), "error");
    ASSERT_TRUE(daemon.waitForLine({"upload succeeded", "upload failed"}));
    daemon.signal(SIGTERM);
    EXPECT_EQ(daemon.waitForExit(), 0);
    const std::string path = (models.string() + "/") + type.c_str() + "/1234.rcmodel";
    EXPECT_EQ(daemon.lines(),
              (Lines{"error [batteryModelDataHandling] -[BatteryModelDataHandler "
                     "getBatteryModelFileURLString:] <Error> file not present: " +
                         path,
                     "error [batteryModelDataHandling] -[BatteryModelDataHandler "
                     "moveBatteryModelDataFromDiskToKext:] <Error> file (null) does not exist",
                     "error [main] Battery data upload failed"}))
        << daemon.rawStderr();
    EXPECT_FALSE(fs::exists(device.dir() / "driver/battery_params.bin"));
    EXPECT_EQ(device.state()["savedBootUUID"], kOld);

    test::Scratch scratch;
    const test::ToolRun status = scratch.rcmodel({"status"}, "", device.dir().string());
    EXPECT_NE(status.out.find("\nmodel file exists:   no\n"), std::string::npos) << status.out;
    EXPECT_NE(status.out.find("\nverdict:             missing\n"), std::string::npos) << status.out;
  }
}

// The daemon takes no arguments but answers --help and --version as any Linux
// program does; in no case does an argument start it.
TEST(Daemon, ArgumentsAreAnsweredWithoutStartingTheDaemon) {
  struct Case {
    std::vector<std::string> args;
    int status;
    std::string out, err;  // what each starts with
  } const cases[] = {
      {{"--help"}, 0, "usage: kolvrand [--help | --version]\n", ""},
      {{"--version"}, 0, "kolvrand " KOLVRAND_VERSION "\n", ""},
      {{"-h"}, 2, "", "kolvrand: unexpected argument \"-h\"\nusage: kolvrand"},
      {{"--help", "extra"}, 2, "", "kolvrand: unexpected argument \"extra\"\nusage: kolvrand"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.args.front());
    DeviceCopy device;
    test::DaemonProcess daemon(device.dir(), "debug", {}, c.args);
    EXPECT_EQ(daemon.waitForExit(), c.status);
    EXPECT_TRUE(daemon.rawStdout().starts_with(c.out)) << daemon.rawStdout();
    EXPECT_TRUE(daemon.rawStderr().starts_with(c.err)) << daemon.rawStderr();
    if (c.err.empty()) EXPECT_EQ(daemon.rawStderr(), "");
    EXPECT_FALSE(fs::exists(device.dir() / "state"));
    EXPECT_FALSE(fs::exists(device.dir() / "driver"));
  }
}

// A log-level setting the daemon does not understand is named in one line,
// and the defaults apply.
TEST(Daemon, UnderstoodLogLevelsOnly) {
  DeviceCopy device;
  test::DaemonProcess daemon(device.dir(), "garbage,main=loud,batteryModelDataHandling=debug");
  ASSERT_TRUE(daemon.waitForLine({"upload succeeded"}));
  daemon.signal(SIGTERM);
  EXPECT_EQ(daemon.waitForExit(), 0);
  const Lines lines = daemon.lines();
  ASSERT_FALSE(lines.empty());
  EXPECT_TRUE(lines.front().starts_with(
      "error [platform] KOLVRAND_LOG_LEVEL: \"garbage\", \"main=loud\" not understood"))
      << daemon.rawStderr();
  EXPECT_EQ(Lines(lines.begin() + 1, lines.end()),
            Lines{"default [main] Battery data upload succeeded"});
}

}  // namespace
}  // namespace kolvrand
