#include <gtest/gtest.h>

#include <mutex>
#include <thread>

#include "platform/Activity.h"

namespace kolvrand {
namespace {

struct Call {
  std::string activity;
  xpc_activity_state_t state;
  std::thread::id thread;
};

class Activity : public ::testing::Test {
 protected:
  void TearDown() override { xpc_activity_stop(); }

  xpc_activity_handler_t recorder(std::string name) {
    return [this, name](xpc_activity_t a) {
      std::lock_guard lock(mutex);
      calls.push_back(
          {name + ":" + a->identifier, xpc_activity_get_state(a), std::this_thread::get_id()});
    };
  }
  std::vector<std::pair<std::string, xpc_activity_state_t>> seen() {
    xpc_activity_drain();
    std::lock_guard lock(mutex);
    std::vector<std::pair<std::string, xpc_activity_state_t>> out;
    for (const auto& c : calls) out.emplace_back(c.activity, c.state);
    return out;
  }

  std::mutex mutex;
  std::vector<Call> calls;
};

TEST_F(Activity, ChecksInAtRegistrationAndRunsOnEveryDelivery) {
  xpc_activity_register("a", XPC_ACTIVITY_CHECK_IN, recorder("h1"));
  xpc_activity_register("b", XPC_ACTIVITY_CHECK_IN, recorder("h2"));
  xpc_activity_deliver_run();
  // Registering an identifier again replaces its handler (and checks it in).
  xpc_activity_register("a", XPC_ACTIVITY_CHECK_IN, recorder("h3"));
  xpc_activity_deliver_run();
  using S = std::vector<std::pair<std::string, xpc_activity_state_t>>;
  EXPECT_EQ(seen(), (S{{"h1:a", XPC_ACTIVITY_STATE_CHECK_IN},
                       {"h2:b", XPC_ACTIVITY_STATE_CHECK_IN},
                       {"h1:a", XPC_ACTIVITY_STATE_RUN},
                       {"h2:b", XPC_ACTIVITY_STATE_RUN},
                       {"h3:a", XPC_ACTIVITY_STATE_CHECK_IN},
                       {"h2:b", XPC_ACTIVITY_STATE_RUN},
                       {"h3:a", XPC_ACTIVITY_STATE_RUN}}));
  // All on the service's one thread, never the caller's.
  for (const auto& c : calls) {
    EXPECT_NE(c.thread, std::this_thread::get_id());
    EXPECT_EQ(c.thread, calls.front().thread);
  }
}

TEST_F(Activity, StopEndsDeliveriesUntilTheNextRegistration) {
  xpc_activity_register("a", XPC_ACTIVITY_CHECK_IN, recorder("h"));
  xpc_activity_drain();
  xpc_activity_stop();
  xpc_activity_deliver_run();
  xpc_activity_drain();
  EXPECT_EQ(seen().size(), 1u);
  xpc_activity_register("b", XPC_ACTIVITY_CHECK_IN, recorder("h"));
  xpc_activity_deliver_run();
  EXPECT_EQ(seen().size(), 3u);
}

}  // namespace
}  // namespace kolvrand
