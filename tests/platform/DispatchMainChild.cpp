// Runs dispatch_main in a scenario named by argv[1] and reports on stdout,
// after its pid:
//   activity  one activity; prints "state N" at every call of its handler
//   stop      a slow block ("started", then "finished") and one queued after it
#include <unistd.h>

#include <chrono>
#include <string>
#include <thread>

#include "platform/Activity.h"
#include "platform/Dispatch.h"

namespace {

void say(std::string line) {
  line += '\n';
  ssize_t n = ::write(STDOUT_FILENO, line.data(), line.size());
  (void)n;
}

}  // namespace

int main(int argc, char** argv) {
  using namespace kolvrand;
  std::string scenario = argc > 1 ? argv[1] : "";
  say(std::to_string(::getpid()));
  auto queue = dispatch_queue_create("child", DISPATCH_QUEUE_SERIAL);
  if (scenario == "activity") {
    xpc_activity_register("com.tesvar.kolvrand.test", XPC_ACTIVITY_CHECK_IN, [](xpc_activity_t a) {
      say("state " + std::to_string(xpc_activity_get_state(a)));
    });
  } else if (scenario == "stop") {
    dispatch_async(queue, [] {
      say("started");
      std::this_thread::sleep_for(std::chrono::milliseconds(300));
      say("finished");
    });
    dispatch_async(queue, [] { say("dropped"); });
  } else {
    return 2;
  }
  dispatch_main();
}
