// SPDX-License-Identifier: MIT
// The real daemon, run on simulated devices holding the example models: what
// it prints on stderr, what it stores, and how it ends.
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <algorithm>

#include "base/CommonCrypto.h"
#include "base/Hex.h"
#include "base/Value.h"
#include "tests/support/DaemonProcess.h"
#include "tests/support/TestDevice.h"
#include "tests/tools/RunTool.h"

namespace kolvrand {
namespace {

namespace fs = std::filesystem;
using Lines = std::vector<std::string>;
using nlohmann::json;

struct Device : test::TestDevice {
  Device() {
    fs::copy(fs::path(KOLVRAND_SOURCE_DIR) / "examples/device/Library", dir() / "Library",
             fs::copy_options::recursive);
  }
  fs::path models() const { return dir() / "Library/KVR/BatteryModels"; }
};

// Starts the daemon, waits for one of `texts`, stops it with SIGTERM and
// returns its lines; `before` runs once the text came, `wellFormed` says
// whether every line had the exact "kolvrand[PID]: " prefix.
Lines runDaemon(const Device& device, const std::string& levels,
                std::initializer_list<std::string_view> texts,
                const std::function<void(test::DaemonProcess&)>& before = {},
                bool* wellFormed = nullptr) {
  test::DaemonProcess daemon(device.dir(), levels);
  EXPECT_TRUE(daemon.waitForLine(texts)) << daemon.rawStderr();
  if (before) before(daemon);
  daemon.signal(SIGTERM);
  EXPECT_EQ(daemon.waitForExit(), 0) << daemon.rawStderr();
  return daemon.lines(wellFormed);
}

TEST(Daemon, UploadsOncePerBootSessionServesTheActivityAndStopsCleanly) {
  Device device;
  bool wellFormed = false;
  // The upload's last line first, so that it comes before the stop's however
  // slowly the task runs (under an emulator, say).
  Lines lines = runDaemon(
      device, "debug", {"upload succeeded"},
      [](test::DaemonProcess& daemon) {
        ASSERT_TRUE(daemon.waitForLine({"checking in"}));
        daemon.signal(SIGUSR1);
        ASSERT_TRUE(daemon.waitForLine({"compensation has finished"}));
      },
      &wellFormed);
  EXPECT_TRUE(wellFormed) << testing::PrintToString(lines);
  // The task (the first three) and the activity run on threads of their own:
  // each keeps its order, and the stop comes last.
  const Lines expected = {
      "debug [main] Battery data upload run for chemId 0x2168",
      "debug [batteryModelDataHandling] -[BatteryModelDataHandler getBatteryModelFileURLString:] "
      "workingDirURL resource: " +
          (device.models() / "T618e/2168.rcmodel").string() + " ",
      "default [main] Battery data upload succeeded",
      "debug [main] battery aging update checking in! ",
      "debug [main] battery aging periodic trigger",
      "debug [main] trigger condition met, start to run some workload...",
      "debug [main] battery aging compensation has finished successfully",
      "debug [dispatch] stopping on signal 15"};
  std::stable_partition(lines.begin(), lines.end(), [&](const std::string& l) {
    return std::find(expected.begin(), expected.begin() + 3, l) != expected.begin() + 3;
  });
  EXPECT_EQ(lines, expected);
  EXPECT_EQ(device.state(), (json{{"savedBootUUID", "11111111-2222-3333-4444-555555555555"},
                                  {"savedChemID", 8552},
                                  {"updateConditionMet", false}}));

  EXPECT_EQ(runDaemon(device, "default", {"Skipping"}),
            Lines{"default [main] Main Unchanged boot UUID. Skipping battery model task"});
  // After a reboot it uploads again. A log-level setting with items it does
  // not understand is named in one line, and the defaults apply.
  json rebooted = test::defaultDeviceJSON();
  rebooted["sysctl"]["kern.bootsessionuuid"] = "99999999-8888-7777-6666-555555555555";
  device.writeDeviceJSON(rebooted);
  Lines again =
      runDaemon(device, "garbage,main=loud,batteryModelDataHandling=debug", {"upload succeeded"});
  ASSERT_EQ(again.size(), 2u) << testing::PrintToString(again);
  EXPECT_TRUE(again[0].starts_with(
      "error [platform] KOLVRAND_LOG_LEVEL: \"garbage\", \"main=loud\" not understood"));
  EXPECT_EQ(again[1], "default [main] Battery data upload succeeded");
  EXPECT_EQ(device.state()["savedBootUUID"], rebooted["sysctl"]["kern.bootsessionuuid"]);
}

// A datagram socket of a service manager's, as NOTIFY_SOCKET names one.
class NotifySocket {
 public:
  explicit NotifySocket(const fs::path& path) : path_(path) {
    fd_ = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    path.string().copy(address.sun_path, sizeof address.sun_path - 1);
    EXPECT_EQ(bind(fd_, reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
    const timeval timeout{60, 0};
    setsockopt(fd_, SOL_SOCKET, SO_RCVTIMEO, &timeout, sizeof timeout);
  }
  ~NotifySocket() { close(fd_); }
  std::string variable() const { return "NOTIFY_SOCKET=" + path_.string(); }
  // The next datagram; "" when none came within a minute.
  std::string receive() const {
    char buffer[4096];
    const ssize_t n = recv(fd_, buffer, sizeof buffer, 0);
    return n > 0 ? std::string(buffer, static_cast<size_t>(n)) : "";
  }

 private:
  fs::path path_;
  int fd_ = -1;
};

// The service manager hears READY=1 once the daemon is set up, and one status
// line for the battery-model task: what it uploaded, that it skipped, or the
// innermost line of the failure's chain (the task and the set-up run on
// threads of their own, so the two come in either order).
TEST(Daemon, TellsTheServiceManagerItIsReadyAndHowTheUploadEnded) {
  const struct {
    const char* name;
    void (*prepare)(Device&);
    std::string status;  // DIR stands for the device's directory
  } rows[] = {
      {"uploaded", nullptr, "uploaded and verified: chem ID 0x2168, SHA-1 "},
      {"already uploaded in this boot session",
       [](Device& d) {
         test::writeFile(d.statePath(),
                         json{{"savedBootUUID", "11111111-2222-3333-4444-555555555555"}}.dump());
       },
       "skipped: already uploaded in this boot"},
      {"no model file", [](Device& d) { fs::remove_all(d.models()); },
       "failed: -[BatteryModelDataHandler getBatteryModelFileURLString:] <Error> file not present: "
       "DIR/Library/KVR/BatteryModels/T618e/2168.rcmodel"},
      {"no battery driver",
       [](Device& d) {
         json j = test::defaultDeviceJSON();
         j["registry"].erase("TesvarSmartBattery");
         d.writeDeviceJSON(j);
       },
       "failed: -[BatteryModelDataHandler getIntValueForKeyFromBatteryData:] <Error> powerService "
       "null"},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.name);
    Device device;
    if (row.prepare) row.prepare(device);
    const NotifySocket manager(device.dir() / "notify");
    test::DaemonProcess daemon(device.dir(), "error", {}, {}, {manager.variable()});
    std::vector<std::string> heard = {manager.receive(), manager.receive()};
    std::sort(heard.begin(), heard.end());
    std::string status = row.status;
    if (const size_t at = status.find("DIR"); at != status.npos)
      status.replace(at, 3, device.dir().string());
    if (status.ends_with("SHA-1 ")) {
      const std::string record = test::readFile(device.dir() / "driver/battery_params.bin");
      const SHA1Digest digest = sha1(record.data(), record.size());
      status += hexString(digest.data(), digest.size());
    }
    EXPECT_EQ(heard, (std::vector<std::string>{"READY=1", "STATUS=" + status}));
    daemon.signal(SIGTERM);
    EXPECT_EQ(daemon.waitForExit(), 0) << daemon.rawStderr();
  }
}

// Whoever sets the target type must not lead the daemon out of the Library:
// a device type that is no directory name is answered as a missing file,
// whatever lies where it points, and rcmodel status says the same.
TEST(Daemon, DeviceTypeThatIsNoDirectoryNameNamesNoFile) {
  const std::string kOld = "00000000-0000-0000-0000-000000000000";
  for (std::string type : std::vector<std::string>{"..", ".", "", "a/b", "/ABS", "../../../x",
                                                   std::string("x\0/../../../x", 14)}) {
    SCOPED_TRACE(type);
    Device device;
    if (type == "/ABS") type = (device.dir() / "x").string();
    // A chem ID outside the table, so the target type decides, and its model
    // wherever the type would lead.
    json j = test::defaultDeviceJSON();
    j["registry"]["TesvarSmartBattery"]["BatteryData"]["AlgoChemID"] = 0x1234;
    j["sysctl"]["hw.targettype"] = type;
    device.writeDeviceJSON(j);
    const std::string model = test::readFile(device.models() / "T618e/2168.rcmodel");
    for (const fs::path& dir : {device.models(), device.models() / "a/b", device.dir() / "x",
                                device.dir() / "Library/KVR"})
      test::writeFile(dir / "1234.rcmodel", model);
    test::writeFile(device.statePath(), json{{"savedBootUUID", kOld}}.dump());

    const std::string handler = "error [batteryModelDataHandling] -[BatteryModelDataHandler ";
    const std::string path = device.models().string() + "/" + type.c_str() + "/1234.rcmodel";
    EXPECT_EQ(runDaemon(device, "error", {"upload succeeded", "upload failed"}),
              (Lines{handler + "getBatteryModelFileURLString:] <Error> file not present: " + path,
                     handler + "moveBatteryModelDataFromDiskToKext:] <Error> file (null) does "
                               "not exist",
                     "error [main] Battery data upload failed"}));
    EXPECT_FALSE(fs::exists(device.dir() / "driver/battery_params.bin"));
    EXPECT_EQ(device.state()["savedBootUUID"], kOld);

    const test::ToolRun status = test::Scratch().rcmodel({"status"}, "", device.dir().string());
    EXPECT_NE(status.out.find("\nmodel file exists:   no\n"), std::string::npos) << status.out;
    EXPECT_NE(status.out.find("\nverdict:             missing\n"), std::string::npos) << status.out;
  }
}

// The daemon takes no arguments but answers --help and --version as any Linux
// program does; in no case does an argument start it.
TEST(Daemon, ArgumentsAreAnsweredWithoutStartingTheDaemon) {
  const struct {
    std::vector<std::string> args;
    int status;
    std::string out, err;  // what each starts with
  } cases[] = {
      {{"--help"}, 0, "usage: kolvrand [--help | --version]\n", ""},
      {{"--version"}, 0, "kolvrand " KOLVRAND_VERSION "\n", ""},
      {{"-h"}, 2, "", "kolvrand: unexpected argument \"-h\"\nusage: kolvrand"},
      {{"--help", "extra"}, 2, "", "kolvrand: unexpected argument \"extra\"\nusage: kolvrand"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.args.back());
    Device device;
    test::DaemonProcess daemon(device.dir(), "debug", {}, c.args);
    EXPECT_EQ(daemon.waitForExit(), c.status);
    EXPECT_TRUE(daemon.rawStdout().starts_with(c.out)) << daemon.rawStdout();
    EXPECT_TRUE(daemon.rawStderr().starts_with(c.err)) << daemon.rawStderr();
    EXPECT_EQ(daemon.rawStderr().empty(), c.err.empty());
    EXPECT_FALSE(fs::exists(device.dir() / "state") || fs::exists(device.dir() / "driver"));
  }
}

}  // namespace
}  // namespace kolvrand
