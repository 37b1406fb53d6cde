#include <gtest/gtest.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <future>
#include <thread>

#include "platform/Dispatch.h"

namespace kolvrand {
namespace {

using namespace std::chrono_literals;

dispatch_queue_t makeQueue() {
  return dispatch_queue_create(
      "test", dispatch_queue_attr_make_with_autorelease_frequency(
                  DISPATCH_QUEUE_SERIAL, DISPATCH_AUTORELEASE_FREQUENCY_WORK_ITEM));
}

// Records into `events` when the last copy of it goes away.
struct Marker {
  std::vector<std::string>* events;
  int id;
  ~Marker() { events->push_back("free " + std::to_string(id)); }
};

bool servedSignalsBlocked() {
  sigset_t set;
  pthread_sigmask(SIG_BLOCK, nullptr, &set);
  return sigismember(&set, SIGTERM) && sigismember(&set, SIGINT) && sigismember(&set, SIGUSR1);
}

// Creating a queue also leaves the served signals to the main loop, in the
// caller and in the worker.
TEST(DispatchQueue, RunsBlocksInOrderOnOneWorkerAndFreesEachRightAfterItRan) {
  auto q = makeQueue();
  EXPECT_TRUE(servedSignalsBlocked());
  std::vector<std::string> events;  // touched only by the worker until drain
  std::vector<std::thread::id> threads;
  std::atomic<int> blocked{0};
  for (int i = 0; i < 200; ++i) {
    dispatch_async(q, [&, i, m = std::make_shared<Marker>(&events, i)] {
      events.push_back("run " + std::to_string(m->id));
      threads.push_back(std::this_thread::get_id());
      blocked += servedSignalsBlocked();
    });
  }
  q->drain();
  ASSERT_EQ(events.size(), 400u);
  for (int i = 0; i < 200; ++i) {
    EXPECT_EQ(events[2 * i], "run " + std::to_string(i));
    EXPECT_EQ(events[2 * i + 1], "free " + std::to_string(i));
  }
  EXPECT_NE(threads.front(), std::this_thread::get_id());
  EXPECT_EQ(std::count(threads.begin(), threads.end(), threads.front()), 200);
  EXPECT_EQ(blocked, 200);
}

TEST(DispatchQueue, StopFinishesTheBlockInProgressAndDropsTheRest) {
  auto q = makeQueue();
  std::promise<void> started;
  std::atomic<bool> finished{false}, ranLater{false};
  std::vector<std::string> events;
  dispatch_async(q, [&] {
    started.set_value();
    std::this_thread::sleep_for(50ms);
    finished = true;
  });
  dispatch_async(q, [&] { ranLater = true; });
  started.get_future().wait();
  q->stop();
  EXPECT_TRUE(finished);
  dispatch_async(q, [&, m = std::make_shared<Marker>(&events, 1)] { ranLater = true; });
  q->drain();
  EXPECT_FALSE(ranLater);
  EXPECT_EQ(events, std::vector<std::string>{"free 1"});  // dropped blocks are freed

  // A queue may be released by its own block.
  q = makeQueue();
  std::promise<void> released;
  dispatch_async(q,
                 [q, m = std::shared_ptr<void>(nullptr, [&](void*) { released.set_value(); })] {});
  q.reset();  // the block now holds the last reference
  EXPECT_EQ(released.get_future().wait_for(5s), std::future_status::ready);
}

// The child process runs dispatch_main and first prints its pid; a read
// that hangs is ended by the test's timeout.
class MainLoopChild {
 public:
  explicit MainLoopChild(const std::string& scenario)
      : out_(::popen((DISPATCH_MAIN_CHILD " " + scenario).c_str(), "r")) {
    pid_ = std::stoi(line());
  }
  ~MainLoopChild() {
    if (!out_) return;
    signal(SIGKILL);
    exitStatus();
  }
  std::string line() {  // "" at the end
    char buf[256];
    if (!out_ || !std::fgets(buf, sizeof buf, out_)) return "";
    std::string l = buf;
    return l.substr(0, l.find('\n'));
  }
  void signal(int sig) { ::kill(pid_, sig); }
  int exitStatus() {  // once the output is read to its end
    for (std::string l; !(l = line()).empty();) rest.push_back(l);
    const int status = ::pclose(out_);
    out_ = nullptr;
    return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
  }
  std::vector<std::string> rest;  // the lines exitStatus() read

 private:
  FILE* out_;
  pid_t pid_ = -1;
};

TEST(DispatchMain, Sigusr1RunsTheActivitiesAndSigintEndsWithStatus0) {
  MainLoopChild child("activity");
  EXPECT_EQ(child.line(), "state 0");
  child.signal(SIGUSR1);
  EXPECT_EQ(child.line(), "state 2");
  child.signal(SIGUSR1);
  EXPECT_EQ(child.line(), "state 2");
  child.signal(SIGINT);
  EXPECT_EQ(child.exitStatus(), 0);
  EXPECT_TRUE(child.rest.empty());
}

TEST(DispatchMain, SigtermLetsTheBlockInProgressFinish) {
  MainLoopChild child("stop");
  EXPECT_EQ(child.line(), "started");
  child.signal(SIGTERM);
  EXPECT_EQ(child.exitStatus(), 0);
  // The queued block never ran.
  EXPECT_EQ(child.rest, std::vector<std::string>{"finished"});
}

}  // namespace
}  // namespace kolvrand
