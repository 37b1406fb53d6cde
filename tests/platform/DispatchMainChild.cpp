// SPDX-License-Identifier: MIT
// Runs dispatch_main with one activity and reports on stdout, after its pid:
// "state N" at every call of the activity's handler, and at a run, from a
// queue of its own, a slow block ("started", then "finished") and one queued
// after it ("dropped").
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <string>
#include <thread>

#include "platform/Activity.h"
#include "platform/Dispatch.h"

namespace {

void say(const std::string& line) {
  std::puts(line.c_str());
  std::fflush(stdout);
}

}  // namespace

int main() {
  using namespace kolvrand;
  say(std::to_string(::getpid()));
  auto queue = dispatch_queue_create("child", DISPATCH_QUEUE_SERIAL);
  xpc_activity_register("com.tesvar.kolvrand.test", XPC_ACTIVITY_CHECK_IN,
                        [queue](xpc_activity_t a) {
                          say("state " + std::to_string(xpc_activity_get_state(a)));
                          if (xpc_activity_get_state(a) != XPC_ACTIVITY_STATE_RUN) return;
                          dispatch_async(queue, [] {
                            say("started");
                            // Long enough for the test's SIGINT to arrive
                            // meanwhile, however slowly an emulator runs.
                            std::this_thread::sleep_for(std::chrono::seconds(2));
                            say("finished");
                          });
                          dispatch_async(queue, [] { say("dropped"); });
                        });
  dispatch_main();
}
