#include <gtest/gtest.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <future>
#include <thread>

#include "platform/Dispatch.h"

extern char** environ;

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

TEST(DispatchQueue, RunsBlocksInOrderAndFreesEachRightAfterItRan) {
  auto q = makeQueue();
  std::vector<std::string> events;  // touched only by the worker until drain
  std::vector<std::thread::id> threads;
  for (int i = 0; i < 200; ++i) {
    dispatch_async(q, [&, i, m = std::make_shared<Marker>(&events, i)] {
      events.push_back("run " + std::to_string(m->id));
      threads.push_back(std::this_thread::get_id());
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
}

TEST(DispatchQueue, MayBeReleasedByItsOwnBlock) {
  auto q = makeQueue();
  std::promise<void> released;
  struct SetOnFree {
    std::promise<void>* p;
    ~SetOnFree() { p->set_value(); }
  };
  dispatch_async(q, [q, s = std::make_shared<SetOnFree>(&released)] {});
  q.reset();  // the block now holds the last reference
  EXPECT_EQ(released.get_future().wait_for(5s), std::future_status::ready);
}

TEST(DispatchQueue, CreatingAQueueLeavesTheServedSignalsToTheMainLoop) {
  auto q = makeQueue();
  auto blocked = [] {
    sigset_t set;
    pthread_sigmask(SIG_BLOCK, nullptr, &set);
    return sigismember(&set, SIGTERM) && sigismember(&set, SIGINT) && sigismember(&set, SIGUSR1);
  };
  EXPECT_TRUE(blocked());
  std::promise<bool> worker;
  dispatch_async(q, [&] { worker.set_value(blocked()); });
  EXPECT_TRUE(worker.get_future().get());
}

// The child process runs dispatch_main; its stdout comes back through a pipe.
class MainLoopChild {
 public:
  explicit MainLoopChild(const char* scenario) {
    int fds[2];
    EXPECT_EQ(::pipe(fds), 0);
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_adddup2(&actions, fds[1], STDOUT_FILENO);
    posix_spawn_file_actions_addclose(&actions, fds[0]);
    char* argv[] = {const_cast<char*>(DISPATCH_MAIN_CHILD), const_cast<char*>(scenario), nullptr};
    EXPECT_EQ(posix_spawn(&pid_, DISPATCH_MAIN_CHILD, &actions, nullptr, argv, environ), 0);
    posix_spawn_file_actions_destroy(&actions);
    ::close(fds[1]);
    out_ = fds[0];
  }
  ~MainLoopChild() {
    if (pid_ > 0) {
      ::kill(pid_, SIGKILL);
      ::waitpid(pid_, nullptr, 0);
    }
    ::close(out_);
  }

  // The next line of output, "" after 10 s or at the end.
  std::string line() {
    while (buffer_.find('\n') == std::string::npos) {
      pollfd p{out_, POLLIN, 0};
      if (::poll(&p, 1, 10000) <= 0) return "";
      char buf[256];
      ssize_t n = ::read(out_, buf, sizeof buf);
      if (n <= 0) return "";
      buffer_.append(buf, static_cast<size_t>(n));
    }
    size_t nl = buffer_.find('\n');
    std::string l = buffer_.substr(0, nl);
    buffer_.erase(0, nl + 1);
    return l;
  }
  void signal(int sig) { ::kill(pid_, sig); }
  int exitStatus() {
    int status = 0;
    ::waitpid(pid_, &status, 0);
    pid_ = -1;
    return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
  }

 private:
  pid_t pid_ = -1;
  int out_ = -1;
  std::string buffer_;
};

TEST(DispatchMain, Sigusr1RunsTheActivitiesAndSigtermEndsWithStatus0) {
  MainLoopChild child("activity");
  EXPECT_EQ(child.line(), "state 0");
  child.signal(SIGUSR1);
  EXPECT_EQ(child.line(), "state 2");
  child.signal(SIGUSR1);
  EXPECT_EQ(child.line(), "state 2");
  child.signal(SIGINT);
  EXPECT_EQ(child.exitStatus(), 0);
  EXPECT_EQ(child.line(), "");
}

TEST(DispatchMain, SigtermLetsTheBlockInProgressFinish) {
  MainLoopChild child("stop");
  EXPECT_EQ(child.line(), "started");
  child.signal(SIGTERM);
  EXPECT_EQ(child.exitStatus(), 0);
  EXPECT_EQ(child.line(), "finished");
  EXPECT_EQ(child.line(), "");  // the queued block never ran
}

}  // namespace
}  // namespace kolvrand
