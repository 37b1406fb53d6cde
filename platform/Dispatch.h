// SPDX-License-Identifier: MIT
// Work queues in the manner of libdispatch: a serial queue with one worker
// thread, a once-only guard, and the main loop that dispatch_main stands for.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>

namespace kolvrand {

class DispatchQueue;
using dispatch_queue_t = std::shared_ptr<DispatchQueue>;
using dispatch_block_t = std::function<void()>;

struct dispatch_queue_attr_t {
  uint64_t autoreleaseFrequency = 0;
};

inline constexpr dispatch_queue_attr_t DISPATCH_QUEUE_SERIAL{};
inline constexpr uint64_t DISPATCH_AUTORELEASE_FREQUENCY_INHERIT = 0;
inline constexpr uint64_t DISPATCH_AUTORELEASE_FREQUENCY_WORK_ITEM = 1;

dispatch_queue_attr_t dispatch_queue_attr_make_with_autorelease_frequency(
    dispatch_queue_attr_t attr, uint64_t frequency);

// A serial queue whose worker thread runs the submitted blocks one at a time,
// in submission order. Every block (and all it captured) is destroyed as soon
// as it has run, which is what DISPATCH_AUTORELEASE_FREQUENCY_WORK_ITEM asks
// for; the attribute is taken for the call's sake and changes nothing. The first queue a
// process creates blocks SIGTERM, SIGINT and SIGUSR1 in the calling thread, so
// every thread created afterwards leaves them to dispatch_main.
dispatch_queue_t dispatch_queue_create(const char* label, dispatch_queue_attr_t attr);
void dispatch_async(const dispatch_queue_t& queue, dispatch_block_t block);

class DispatchQueue {
 public:
  explicit DispatchQueue(std::string label);
  ~DispatchQueue();  // finishes the block in progress, drops the rest, joins
  const std::string& label() const;
  void async(dispatch_block_t block);
  // Blocks until every block submitted so far has run (tests).
  void drain();
  // Stops after the block in progress; later submissions are dropped.
  void stop();

 private:
  struct State;
  std::unique_ptr<State> s_;
};

using dispatch_once_t = std::once_flag;
template <typename F>
void dispatch_once(dispatch_once_t* predicate, F&& block) {
  std::call_once(*predicate, std::forward<F>(block));
}

// The main thread waits for signals for the rest of the process's life:
// SIGUSR1 runs every registered activity in its run state; SIGTERM and SIGINT
// stop every queue once its block in progress has finished and end the
// process with status 0, without that block when it has not finished within
// five seconds.
[[noreturn]] void dispatch_main();

}  // namespace kolvrand
