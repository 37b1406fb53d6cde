// SPDX-License-Identifier: MIT
// Serial queues and the activity service. (The main loop's signals are
// crossed by the daemon's runs.)
#include <gtest/gtest.h>
#include <signal.h>

#include <future>
#include <mutex>
#include <set>
#include <thread>

#include "platform/Activity.h"
#include "platform/Dispatch.h"

namespace kolvrand {
namespace {

using namespace std::chrono_literals;
using Strings = std::vector<std::string>;

bool servedSignalsBlocked() {
  sigset_t set;
  pthread_sigmask(SIG_BLOCK, nullptr, &set);
  return sigismember(&set, SIGTERM) && sigismember(&set, SIGINT) && sigismember(&set, SIGUSR1);
}

// Creating a queue also leaves the served signals to the main loop, in the
// caller and in the worker.
TEST(DispatchQueue, RunsInOrderOnOneWorkerFreesEachBlockAndStopsAfterTheOneInProgress) {
  auto q = dispatch_queue_create(
      "test", dispatch_queue_attr_make_with_autorelease_frequency(
                  DISPATCH_QUEUE_SERIAL, DISPATCH_AUTORELEASE_FREQUENCY_WORK_ITEM));
  EXPECT_TRUE(servedSignalsBlocked());
  Strings events, expected;  // touched only by the worker until drain or stop
  std::set<std::thread::id> threads;
  // Records when the last copy of what a block captured goes away.
  const auto marker = [&](int id) {
    return std::shared_ptr<void>(
        nullptr, [&events, id](void*) { events.push_back("free " + std::to_string(id)); });
  };
  for (int i = 0; i < 200; ++i) {
    dispatch_async(q, [&, i, m = marker(i)] {
      events.push_back("run " + std::to_string(i) + (servedSignalsBlocked() ? "" : " unmasked"));
      threads.insert(std::this_thread::get_id());
    });
    expected.insert(expected.end(), {"run " + std::to_string(i), "free " + std::to_string(i)});
  }
  q->drain();
  EXPECT_EQ(events, expected);
  EXPECT_EQ(threads.size(), 1u);
  EXPECT_FALSE(threads.contains(std::this_thread::get_id()));

  // Stopped, it lets the block in progress finish and drops (and frees) the
  // rest, and whatever comes later.
  events.clear();
  std::promise<void> started;
  dispatch_async(q, [&] {
    started.set_value();
    std::this_thread::sleep_for(50ms);
    events.push_back("finished");
  });
  dispatch_async(q, [&, m = marker(1)] { events.push_back("ran 1"); });
  started.get_future().wait();
  q->stop();
  dispatch_async(q, [&, m = marker(2)] { events.push_back("ran 2"); });
  q->drain();
  EXPECT_EQ(events, (Strings{"finished", "free 1", "free 2"}));

  // A queue may be released by its own block.
  q = dispatch_queue_create("test", DISPATCH_QUEUE_SERIAL);
  std::promise<void> released;
  dispatch_async(q,
                 [q, m = std::shared_ptr<void>(nullptr, [&](void*) { released.set_value(); })] {});
  q.reset();  // the block now holds the last reference
  released.get_future().wait();
}

TEST(Activity, ChecksInAtRegistrationRunsOnEveryDeliveryAndStops) {
  std::mutex mutex;
  Strings calls;  // handler:identifier:state
  std::set<std::thread::id> threads;
  const auto recorder = [&](std::string name) {
    return [&, name](xpc_activity_t a) {
      std::lock_guard lock(mutex);
      calls.push_back(name + ":" + a->identifier + ":" + std::to_string(xpc_activity_get_state(a)));
      threads.insert(std::this_thread::get_id());
    };
  };
  const auto runAll = [] {
    xpc_activity_deliver_run();
    xpc_activity_drain();
  };
  xpc_activity_register("a", XPC_ACTIVITY_CHECK_IN, recorder("h1"));
  xpc_activity_register("b", XPC_ACTIVITY_CHECK_IN, recorder("h2"));
  runAll();
  // Registering an identifier again replaces its handler (and checks it in).
  xpc_activity_register("a", XPC_ACTIVITY_CHECK_IN, recorder("h3"));
  runAll();
  // All on the service's one thread, never the caller's.
  EXPECT_EQ(threads.size(), 1u);
  EXPECT_FALSE(threads.contains(std::this_thread::get_id()));
  // Stopped, it delivers nothing until the next registration.
  xpc_activity_stop();
  runAll();
  xpc_activity_register("c", XPC_ACTIVITY_CHECK_IN, recorder("h4"));
  runAll();
  xpc_activity_stop();
  EXPECT_EQ(calls, (Strings{"h1:a:0", "h2:b:0", "h1:a:2", "h2:b:2", "h3:a:0", "h2:b:2", "h3:a:2",
                            "h4:c:0", "h4:c:2"}));
}

}  // namespace
}  // namespace kolvrand
