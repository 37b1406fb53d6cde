// SPDX-License-Identifier: MIT
// The real daemon, run on simulated devices holding the example models: what
// it prints on stderr, what it stores, and how it ends; and its handlers
// called directly.
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <algorithm>

#include "base/CommonCrypto.h"
#include "base/Hex.h"
#include "base/Value.h"
#include "daemon/BatteryAgingActivity.h"
#include "daemon/BatteryModelTask.h"
#include "pipeline/DaemonIdentifier.h"
#include "pipeline/PBStreamReader.h"
#include "tests/support/ExampleDevice.h"
#include "tests/support/TestDevice.h"

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

const std::string kBootUUID = "11111111-2222-3333-4444-555555555555";  // the device's

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
// threads of their own, so the two come in either order). A log-level
// setting with items it does not understand is named in one line and the
// defaults apply: no debug line. Every line has the exact "kolvrand[PID]: "
// prefix.
TEST(Daemon, TellsTheServiceManagerItIsReadyAndHowTheUploadEnded) {
  const struct {
    const char* name;
    void (*prepare)(Device&);
    std::string status;  // DIR stands for the device's directory
    std::string last;    // line of stderr
  } rows[] = {
      {"uploaded", nullptr, "uploaded and verified: chem ID 0x2168, SHA-1 ",
       "default [main] Battery data upload succeeded"},
      {"already uploaded in this boot session",
       [](Device& d) {
         test::writeFile(d.statePath(), json{{"savedBootUUID", kBootUUID}}.dump());
       },
       "skipped: already uploaded in this boot",
       "default [main] Main Unchanged boot UUID. Skipping battery model task"},
      {"no model file", [](Device& d) { fs::remove_all(d.models()); },
       "failed: -[BatteryModelDataHandler getBatteryModelFileURLString:] <Error> file not present: "
       "DIR/Library/KVR/BatteryModels/T618e/2168.rcmodel",
       "error [main] Battery data upload failed"},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.name);
    Device device;
    if (row.prepare) row.prepare(device);
    const NotifySocket manager(device.dir() / "notify");
    test::DaemonProcess daemon(device.dir(), "garbage,main=loud,main=debug", {},
                               {manager.variable()});
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
    bool wellFormed = false;
    const Lines lines = daemon.lines(&wellFormed);
    ASSERT_TRUE(wellFormed && lines.size() >= 2) << daemon.rawStderr();
    EXPECT_TRUE(lines[0].starts_with(
        "error [platform] KOLVRAND_LOG_LEVEL: \"garbage\", \"main=loud\" not understood"))
        << lines[0];
    EXPECT_EQ(lines.back(), row.last);
    EXPECT_EQ(std::ranges::count_if(lines, [](auto& l) { return l.starts_with("debug "); }), 0);
  }
}

// The model padded with empty messages up to the size cap: read whole, and
// only its first message kept, so the load costs time, not gigabytes (it took
// 6 GB when every message was); and it keeps the task busy for a while, so
// that the activities asked for meanwhile overlap the upload. Both sides
// finish, the settings hold both sides' keys, and a report of ThreadSanitizer's
// (./scripts/test --tsan) would break the lines or the exit status.
TEST(Concurrency, DaemonRunsActivitiesDuringTheUpload) {
  test::ExampleDevice device;
  test::writeFile(
      device.path(test::kModel),
      test::kExample + std::string(PBStreamReader::kMaxFileSize - test::kExample.size(), '\0'));
  test::runDaemon(device, test::Outcome::Uploaded, true);
}

// The two handlers on simulated devices, where the daemon's own runs do not
// go: each state of the battery-aging activity with each value of
// "updateConditionMet", and the battery-model task without a handler or
// defaults. (An unreadable boot session is crossed by the daemon's runs.)
TEST(BatteryAgingActivity, EachStateLogsAndLeavesTheFlag) {
  const std::string line[] = {"debug [main] battery aging update checking in! ",
                              "debug [main] battery aging periodic trigger",
                              "debug [main] trigger condition met, start to run some workload...",
                              "debug [main] battery aging compensation has finished successfully"};
  constexpr auto kIn = XPC_ACTIVITY_STATE_CHECK_IN, kRun = XPC_ACTIVITY_STATE_RUN,
                 kWait = XPC_ACTIVITY_STATE_WAIT, kDone = XPC_ACTIVITY_STATE_DONE,
                 kDefer = XPC_ACTIVITY_STATE_DEFER;
  // The flag before and after: '-' absent, '0' false, '1' true; the lines
  // logged as letters: C, T, W, F for the lines above. The last case has no agent: only the
  // state is logged.
  const struct {
    xpc_activity_state_t state;
    char before;
    const char* logged;
    char after;
    bool agent = true;
  } cases[] = {{kIn, '-', "C", '-'},    {kIn, '0', "C", '0'},     {kIn, '1', "CWF", '0'},
               {kRun, '-', "TWF", '0'}, {kRun, '1', "TWF", '0'},  {kWait, '0', "", '0'},
               {kDone, '-', "", '-'},   {kDefer, '1', "WF", '0'}, {kRun, '1', "T", '1', false}};
  for (const auto& c : cases) {
    SCOPED_TRACE(testing::Message() << c.state << c.before << c.agent);
    test::TestDevice device;
    auto agent = ConditionCheckingAgent::init();
    ASSERT_TRUE(agent->defaults());
    if (c.before != '-') agent->defaults()->setBool(c.before == '1', "updateConditionMet");
    XPCActivity activity{"com.tesvar.kolvrand.batteryAgingUpdate", c.state};
    batteryAgingActivityHandler(&activity, os_log_create(DaemonIdentifier, "main"),
                                c.agent ? agent.get() : nullptr);
    Lines expected;
    for (const char* l = c.logged; *l; ++l)
      expected.push_back(line[std::string_view("CTWF").find(*l)]);
    EXPECT_EQ(device.logLines(), expected);
    EXPECT_EQ(device.state().value("updateConditionMet", nlohmann::json()),
              c.after == '-' ? nlohmann::json() : nlohmann::json(c.after == '1'));
  }
}

TEST(BatteryModelTask, FailsWithoutAHandlerOrDefaults) {
  test::TestDevice device;
  runBatteryModelTask(os_log_create(DaemonIdentifier, "main"), nullptr);
  EXPECT_EQ(device.logLines(), (Lines{"debug [main] Battery data upload run for chemId 0x0",
                                      "error [main] Battery data upload failed"}));
  EXPECT_FALSE(device.state().contains("savedBootUUID"));

  device.clearLog();
  std::filesystem::remove_all(device.dir() / "state");
  test::writeFile(device.dir() / "state", "not a directory");
  runBatteryModelTask(os_log_create(DaemonIdentifier, "main"),
                      BatteryModelDataHandler::init().get());
  const Lines lines = device.logLines();
  ASSERT_FALSE(lines.empty());
  EXPECT_EQ(lines.back(), "error [main] Could not allocate defaults");
  EXPECT_EQ(std::count(lines.begin(), lines.end(), lines.back()), 1);
}

}  // namespace
}  // namespace kolvrand
