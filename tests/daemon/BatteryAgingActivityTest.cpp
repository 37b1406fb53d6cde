// The battery-aging handler: what each activity state logs and leaves in
// "updateConditionMet".
#include <gtest/gtest.h>

#include <fstream>

#include "daemon/BatteryAgingActivity.h"
#include "pipeline/DaemonIdentifier.h"
#include "tests/support/TestDevice.h"

namespace kolvrand {
namespace {

using Lines = std::vector<std::string>;
const std::string kCheckIn = "debug [main] battery aging update checking in! ";
const std::string kTrigger = "debug [main] battery aging periodic trigger";
const std::string kWorkload = "debug [main] trigger condition met, start to run some workload...";
const std::string kFinished = "debug [main] battery aging compensation has finished successfully";

struct Case {
  const char* name;
  xpc_activity_state_t state;
  std::optional<bool> flagBefore;  // nullopt: absent
  Lines expected;
  std::optional<bool> flagAfter;
  bool agent = true;
};

TEST(BatteryAgingActivity, EachStateLogsAndLeavesTheFlag) {
  const Case cases[] = {
      {"check-in, flag absent",
       XPC_ACTIVITY_STATE_CHECK_IN,
       std::nullopt,
       {kCheckIn},
       std::nullopt},
      {"check-in, flag false", XPC_ACTIVITY_STATE_CHECK_IN, false, {kCheckIn}, false},
      {"check-in, flag left set",
       XPC_ACTIVITY_STATE_CHECK_IN,
       true,
       {kCheckIn, kWorkload, kFinished},
       false},
      {"run", XPC_ACTIVITY_STATE_RUN, std::nullopt, {kTrigger, kWorkload, kFinished}, false},
      {"run, flag left set", XPC_ACTIVITY_STATE_RUN, true, {kTrigger, kWorkload, kFinished}, false},
      {"wait, flag false", XPC_ACTIVITY_STATE_WAIT, false, {}, false},
      {"done, flag absent", XPC_ACTIVITY_STATE_DONE, std::nullopt, {}, std::nullopt},
      {"defer, flag left set", XPC_ACTIVITY_STATE_DEFER, true, {kWorkload, kFinished}, false},
      {"no agent: only the state is logged", XPC_ACTIVITY_STATE_RUN, true, {kTrigger}, true, false},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    test::TestDevice device;
    auto agent = ConditionCheckingAgent::init();
    ASSERT_TRUE(agent->defaults());
    if (c.flagBefore) agent->defaults()->setBool(*c.flagBefore, "updateConditionMet");

    XPCActivity activity{"com.tesvar.kolvrand.batteryAgingUpdate", c.state};
    batteryAgingActivityHandler(&activity, os_log_create(DaemonIdentifier, "main"),
                                c.agent ? agent.get() : nullptr);

    EXPECT_EQ(device.logLines(), c.expected);
    nlohmann::json state = device.state();
    if (c.flagAfter)
      EXPECT_EQ(state["updateConditionMet"], *c.flagAfter);
    else
      EXPECT_FALSE(state.contains("updateConditionMet"));
  }
}

}  // namespace
}  // namespace kolvrand
