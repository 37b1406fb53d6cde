// SPDX-License-Identifier: MIT
#include "platform/Dispatch.h"

#include <pthread.h>
#include <signal.h>

#include <condition_variable>
#include <cstdio>
#include <cstdlib>
#include <deque>
#include <exception>
#include <future>
#include <thread>
#include <vector>

#include "platform/Activity.h"
#include "platform/Internal.h"

namespace kolvrand {

namespace {

// How long dispatch_main waits for the work in progress once asked to stop:
// far beyond any upload or aging run (milliseconds), well within the
// service's stop timeout (30 s).
constexpr std::chrono::seconds kStopGrace{5};

// The signals that dispatch_main serves; every other thread keeps them blocked.
sigset_t servedSignals() {
  sigset_t set;
  sigemptyset(&set);
  sigaddset(&set, SIGTERM);
  sigaddset(&set, SIGINT);
  sigaddset(&set, SIGUSR1);
  return set;
}

// What the worker thread shares with its queue. The worker holds its own
// reference, so a queue released from one of its own blocks stays valid until
// the worker has left its loop.
struct Core {
  std::string label;
  std::mutex mutex;
  std::condition_variable wake;     // worker: work or stop
  std::condition_variable settled;  // drain and stop: a block finished
  std::deque<dispatch_block_t> pending;
  uint64_t submitted = 0;
  uint64_t finished = 0;
  bool busy = false;
  bool stopping = false;
  std::thread::id worker;

  std::mutex joinMutex;  // the queue and dispatch_main may both join
  std::thread thread;
};

void runBlock(Core& core, dispatch_block_t& block) {
  try {
    block();
  } catch (const std::exception& e) {
    os_log_error(platform::platformLog("dispatch"), "a block on %s threw: %s\n", core.label,
                 e.what());
  } catch (...) {
    os_log_error(platform::platformLog("dispatch"), "a block on %s threw\n", core.label);
  }
}

void workerLoop(std::shared_ptr<Core> core) {
  std::unique_lock lock(core->mutex);
  for (;;) {
    core->wake.wait(lock, [&] { return core->stopping || !core->pending.empty(); });
    if (core->stopping) break;
    dispatch_block_t block = std::move(core->pending.front());
    core->pending.pop_front();
    core->busy = true;
    lock.unlock();
    runBlock(*core, block);
    // The block and all it captured go now, before the next block starts.
    block = nullptr;
    lock.lock();
    core->busy = false;
    ++core->finished;
    core->settled.notify_all();
  }
}

// Marks the queue stopped, drops what has not started and waits for the block
// in progress (unless called from that very block).
void stopCore(Core& core) {
  std::deque<dispatch_block_t> dropped;
  {
    std::unique_lock lock(core.mutex);
    core.stopping = true;
    dropped.swap(core.pending);
    core.wake.notify_all();
    if (std::this_thread::get_id() != core.worker)
      core.settled.wait(lock, [&] { return !core.busy; });
  }
  // Dropped blocks are destroyed outside the lock: their captures may submit.
}

// Every queue of the process, so that dispatch_main can stop them all.
struct QueueTable {
  std::mutex mutex;
  std::vector<std::weak_ptr<Core>> cores;
};

QueueTable& queueTable() {
  static auto* t = new QueueTable;
  return *t;
}

void remember(const std::shared_ptr<Core>& core) {
  QueueTable& t = queueTable();
  std::lock_guard lock(t.mutex);
  std::erase_if(t.cores, [](const std::weak_ptr<Core>& w) { return w.expired(); });
  t.cores.push_back(core);
}

// Waits for the worker to leave its loop, from any thread but the worker's.
void joinCore(Core& core) {
  std::lock_guard lock(core.joinMutex);
  if (core.thread.joinable() && core.thread.get_id() != std::this_thread::get_id())
    core.thread.join();
}

void stopAllQueues() {
  std::vector<std::shared_ptr<Core>> live;
  {
    QueueTable& t = queueTable();
    std::lock_guard lock(t.mutex);
    for (auto& w : t.cores)
      if (auto c = w.lock()) live.push_back(std::move(c));
  }
  for (auto& c : live) stopCore(*c);
  for (auto& c : live) joinCore(*c);
}

}  // namespace

struct DispatchQueue::State {
  std::shared_ptr<Core> core;
};

DispatchQueue::DispatchQueue(std::string label) : s_(std::make_unique<State>()) {
  s_->core = std::make_shared<Core>();
  s_->core->label = std::move(label);
  // The worker starts with the served signals blocked whatever the creating
  // thread's mask, so they always reach dispatch_main.
  sigset_t served = servedSignals(), old;
  pthread_sigmask(SIG_BLOCK, &served, &old);
  std::thread worker(workerLoop, s_->core);
  pthread_sigmask(SIG_SETMASK, &old, nullptr);
  {
    std::lock_guard lock(s_->core->mutex);
    s_->core->worker = worker.get_id();
  }
  {
    std::lock_guard lock(s_->core->joinMutex);
    s_->core->thread = std::move(worker);
  }
  remember(s_->core);
}

DispatchQueue::~DispatchQueue() {
  Core& core = *s_->core;
  stopCore(core);
  std::lock_guard lock(core.joinMutex);
  if (!core.thread.joinable()) return;
  // Released from one of its own blocks: the worker cannot join itself; it
  // leaves its loop on its own and then drops the last reference to the core.
  if (core.thread.get_id() == std::this_thread::get_id())
    core.thread.detach();
  else
    core.thread.join();
}

const std::string& DispatchQueue::label() const {
  return s_->core->label;
}

void DispatchQueue::async(dispatch_block_t block) {
  if (!block) return;
  Core& core = *s_->core;
  dispatch_block_t dropped;  // destroyed after the lock is released
  std::lock_guard lock(core.mutex);
  if (core.stopping) {
    dropped = std::move(block);
    return;
  }
  core.pending.push_back(std::move(block));
  ++core.submitted;
  core.wake.notify_one();
}

void DispatchQueue::drain() {
  Core& core = *s_->core;
  std::unique_lock lock(core.mutex);
  if (std::this_thread::get_id() == core.worker) return;  // would wait for itself
  uint64_t target = core.submitted;
  core.settled.wait(lock, [&] { return core.finished >= target || (core.stopping && !core.busy); });
}

void DispatchQueue::stop() {
  stopCore(*s_->core);
  joinCore(*s_->core);
}

dispatch_queue_attr_t dispatch_queue_attr_make_with_autorelease_frequency(
    dispatch_queue_attr_t attr, uint64_t frequency) {
  attr.autoreleaseFrequency = frequency;
  return attr;
}

dispatch_queue_t dispatch_queue_create(const char* label, dispatch_queue_attr_t) {
  static std::once_flag masked;
  std::call_once(masked, [] {
    sigset_t served = servedSignals();
    pthread_sigmask(SIG_BLOCK, &served, nullptr);
  });
  return std::make_shared<DispatchQueue>(label ? label : "");
}

void dispatch_async(const dispatch_queue_t& queue, dispatch_block_t block) {
  if (queue) queue->async(std::move(block));
}

void dispatch_main() {
  sigset_t served = servedSignals();
  pthread_sigmask(SIG_BLOCK, &served, nullptr);
  int signal = 0;
  for (;;) {
    if (sigwait(&served, &signal) != 0) continue;
    if (signal == SIGUSR1) {
      xpc_activity_deliver_run();
      continue;
    }
    break;
  }
  os_log_debug(platform::platformLog("dispatch"), "stopping on signal %d\n", signal);
  // The queues are stopped on a thread of their own, so that a block waiting
  // on something that never comes (a lock another process holds, a call that
  // does not return) cannot keep the process beyond the grace: the service
  // manager would kill it, with whatever half-done, once its stop timeout ran
  // out. The new thread inherits the served signals blocked.
  auto stopped = std::make_shared<std::promise<void>>();
  std::future<void> done = stopped->get_future();
  std::thread stopper([stopped] {
    stopAllQueues();
    xpc_activity_stop();
    stopped->set_value();
  });
  if (done.wait_for(kStopGrace) != std::future_status::ready) {
    os_log_error(platform::platformLog("dispatch"),
                 "the work in progress did not finish within %lld s; stopping without it\n",
                 static_cast<long long>(kStopGrace.count()));
    std::fflush(nullptr);
    std::_Exit(0);
  }
  stopper.join();
  std::fflush(nullptr);
  std::exit(0);
}

}  // namespace kolvrand
