// SPDX-License-Identifier: MIT
// The daemon's two handlers on simulated devices, where its own runs do not
// go: each state of the battery-aging activity with each value of
// "updateConditionMet", and the battery-model task without a handler or
// defaults. (An unreadable boot session is crossed by the daemon's runs.)
#include <gtest/gtest.h>

#include "daemon/BatteryAgingActivity.h"
#include "daemon/BatteryModelTask.h"
#include "pipeline/DaemonIdentifier.h"
#include "tests/support/TestDevice.h"

namespace kolvrand {
namespace {

using Lines = std::vector<std::string>;

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
