// SPDX-License-Identifier: MIT
#include "platform/Activity.h"

#include <memory>
#include <mutex>
#include <vector>

#include "platform/Dispatch.h"
#include "platform/Internal.h"

namespace kolvrand {

namespace {

struct Registration {
  std::string identifier;
  xpc_activity_handler_t handler;
};

// The activity service: the registered activities and the one thread (a
// serial queue of its own) on which their handlers run.
struct Service {
  std::mutex mutex;
  std::vector<std::shared_ptr<Registration>> registrations;
  std::shared_ptr<DispatchQueue> queue;  // made at the first registration
};

// Never destroyed: dispatch_main ends the process with exit() while handlers
// may still be referenced.
Service& service() {
  static auto* s = new Service;
  return *s;
}

void deliver(DispatchQueue& queue, std::shared_ptr<Registration> r, xpc_activity_state_t state) {
  queue.async([r = std::move(r), state] {
    XPCActivity activity{r->identifier, state};
    if (r->handler) r->handler(&activity);
  });
}

}  // namespace

void xpc_activity_register(const char* identifier, xpc_criteria_t, xpc_activity_handler_t handler) {
  auto r = std::make_shared<Registration>(
      Registration{identifier ? identifier : "", std::move(handler)});
  Service& s = service();
  std::lock_guard lock(s.mutex);
  if (!s.queue)
    s.queue =
        std::make_shared<DispatchQueue>(std::string(platform::kPlatformSubsystem) + ".activity");
  // Registering an identifier again replaces its handler.
  std::erase_if(s.registrations, [&](const auto& e) { return e->identifier == r->identifier; });
  s.registrations.push_back(r);
  deliver(*s.queue, std::move(r), XPC_ACTIVITY_STATE_CHECK_IN);
}

xpc_activity_state_t xpc_activity_get_state(xpc_activity_t activity) {
  return activity ? activity->state : XPC_ACTIVITY_STATE_WAIT;
}

void xpc_activity_deliver_run() {
  Service& s = service();
  std::lock_guard lock(s.mutex);
  if (!s.queue) return;
  for (const auto& r : s.registrations) deliver(*s.queue, r, XPC_ACTIVITY_STATE_RUN);
}

void xpc_activity_drain() {
  std::shared_ptr<DispatchQueue> queue;
  {
    Service& s = service();
    std::lock_guard lock(s.mutex);
    queue = s.queue;
  }
  if (queue) queue->drain();
}

void xpc_activity_stop() {
  std::shared_ptr<DispatchQueue> queue;
  std::vector<std::shared_ptr<Registration>> registrations;
  {
    Service& s = service();
    std::lock_guard lock(s.mutex);
    queue = std::move(s.queue);
    registrations.swap(s.registrations);
  }
  // A later registration starts a new service thread.
  if (queue) queue->stop();
}

}  // namespace kolvrand
