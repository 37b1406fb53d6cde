#include <gtest/gtest.h>

#include <mutex>
#include <thread>

#include "platform/Activity.h"

namespace kolvrand {
namespace {

TEST(Activity, ChecksInAtRegistrationRunsOnEveryDeliveryAndStops) {
  std::mutex mutex;
  std::vector<std::pair<std::string, xpc_activity_state_t>> calls;
  std::vector<std::thread::id> threads;
  auto recorder = [&](std::string name) {
    return [&, name](xpc_activity_t a) {
      std::lock_guard lock(mutex);
      calls.emplace_back(name + ":" + a->identifier, xpc_activity_get_state(a));
      threads.push_back(std::this_thread::get_id());
    };
  };
  xpc_activity_register("a", XPC_ACTIVITY_CHECK_IN, recorder("h1"));
  xpc_activity_register("b", XPC_ACTIVITY_CHECK_IN, recorder("h2"));
  xpc_activity_deliver_run();
  // Registering an identifier again replaces its handler (and checks it in).
  xpc_activity_register("a", XPC_ACTIVITY_CHECK_IN, recorder("h3"));
  xpc_activity_deliver_run();
  xpc_activity_drain();
  constexpr auto kIn = XPC_ACTIVITY_STATE_CHECK_IN, kRun = XPC_ACTIVITY_STATE_RUN;
  EXPECT_EQ(calls, (decltype(calls){{"h1:a", kIn},
                                    {"h2:b", kIn},
                                    {"h1:a", kRun},
                                    {"h2:b", kRun},
                                    {"h3:a", kIn},
                                    {"h2:b", kRun},
                                    {"h3:a", kRun}}));
  // All on the service's one thread, never the caller's.
  EXPECT_NE(threads.front(), std::this_thread::get_id());
  EXPECT_EQ(std::count(threads.begin(), threads.end(), threads.front()), 7);

  // Stopped, it delivers nothing until the next registration.
  xpc_activity_stop();
  xpc_activity_deliver_run();
  xpc_activity_drain();
  EXPECT_EQ(calls.size(), 7u);
  xpc_activity_register("c", XPC_ACTIVITY_CHECK_IN, recorder("h"));
  xpc_activity_deliver_run();
  xpc_activity_drain();
  EXPECT_EQ(calls.size(), 9u);
  xpc_activity_stop();
}

}  // namespace
}  // namespace kolvrand
