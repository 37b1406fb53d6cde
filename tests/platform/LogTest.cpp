#include <fcntl.h>
#include <gtest/gtest.h>

#include <unistd.h>
#include <cmath>

#include <algorithm>
#include <climits>
#include <cstdint>
#include <cstdio>
#include <thread>

#include "platform/Log.h"
#include "platform/Value.h"
#include "tests/platform/TestUtil.h"

namespace kolvrand {
namespace {

template <typename... T>
std::vector<LogArg> args(const T&... a) {
  return {makeLogArg(a)...};
}

struct FormatCase {
  const char* format;
  std::vector<LogArg> args;
  std::string expected;
};

TEST(FormatLogMessage, MatchesPrintf) {
  const char* nullText = nullptr;
  const std::string hi = "hi";  // LogArg views it: it must outlive the table
  // long, size_t and ptrdiff_t are as wide as the target's: 32 bits on armhf.
  char widths[96];
  std::snprintf(widths, sizeof widths, "%lx %llx %jx %zx %tx", -1L, -1LL, intmax_t{-1}, size_t(-1),
                ptrdiff_t{-1});
  const FormatCase cases[] = {
      {"%d|%i", args(-5, 17), "-5|17"},
      {"[%5d|%-5d|%05d]", args(42, 42, -42), "[   42|42   |-0042]"},
      {"%+d % d", args(7, 7), "+7  7"},
      {"%x %X %o %#x %#o", args(0x1ff, 0xabc, 8, 255, 8), "1ff ABC 10 0xff 010"},
      // The length modifier narrows the argument as C's va_arg would.
      {"%hhx %hx %hhd %hd", args(0x1ff, 0x12345, 255, 65535), "ff 2345 -1 -1"},
      {"%x %u %d", args(-1, -1, 0xffffffffu), "ffffffff 4294967295 -1"},
      {"%lx %llx %jx %zx %tx", args(-1L, -1LL, -1L, size_t(-1), -1L), widths},
      {"%lld %llu", args(LLONG_MIN, ULLONG_MAX), "-9223372036854775808 18446744073709551615"},
      {"chemId 0x%lx", args(uint64_t{uint32_t{0x80000000}}), "chemId 0x80000000"},
      {"%c%c", args('o', 'k'), "ok"},
      {"%s|%.2s|%5s|%-4s|", args("hello", "hello", "hi", hi), "hello|he|   hi|hi  |"},
      {"%s", args(nullText), "(null)"},
      {"%@ %@ %@", args(nullptr, std::string_view("str"), std::optional<std::string>()),
       "(null) str (null)"},
      {"%@", args(Value(Dictionary{{"a", Value(Number::fromSigned(1))}})), "{\"a\": 1}"},
      {"%@", args(std::shared_ptr<Value>()), "(null)"},
      {"%@",
       args(Value(Dictionary{
           {"s", Value("q\"\\\n\t\x01")},
           {"d", Value(Data{0, 0xab})},
           {"l", Value(Array{Value(true), Value(false), Value(Number::fromFloat(0.5f)),
                             Value(Number::fromDouble(-1e300)), Value(Number::fromDouble(NAN)),
                             Value(Number::fromFloat(-INFINITY))})}})),
       R"({"s": "q\"\\\n\t\u0001", "d": <00ab>, "l": [true, false, 0.5, -1e+300, nan, -inf]})"},
      {"%.3f %e %g %g", args(3.14159, 12345.678, 0.0001, 1e20), "3.142 1.234568e+04 0.0001 1e+20"},
      {"%5.1f|%-9.2e|", args(3.14159, 1.5), "  3.1|1.50e+00 |"},
      {"%f", args(2), "2.000000"},
      {"%p", args(reinterpret_cast<const void*>(0x1234)), "0x1234"},
      {"100%% %d%%", args(5), "100% 5%"},
      {"%*d|%-*d|%.*s", args(4, 7, 3, 7, 2, "abc"), "   7|7  |ab"},
      {"%{public}s <Error> %{private}d", args("m", 3), "m <Error> 3"},
      // Missing arguments print nothing; surplus ones are ignored.
      {"%d and %d.", args(1), "1 and ."},
      {"%d %s", args(1, "x", "surplus"), "1 x"},
      {"trailing %", {}, "trailing %"},
      {"%k", {}, "%k"},
  };
  for (const auto& c : cases)
    EXPECT_EQ(formatLogMessage(c.format, c.args), c.expected) << "format: " << c.format;
}

struct LevelCase {
  const char* levels;
  const char* category;
  LogLevel level;
  bool enabled;
};

TEST(LogLevels, EnablesLevelsPerCategory) {
  const LevelCase cases[] = {
      {"", "main", LogLevel::Error, true},
      {"", "main", LogLevel::Default, true},
      {"", "main", LogLevel::Debug, false},
      {"debug", "any", LogLevel::Debug, true},
      {"DEBUG", "any", LogLevel::Debug, true},
      {"error", "any", LogLevel::Default, false},
      {"error", "any", LogLevel::Error, true},
      {"default,main=debug", "main", LogLevel::Debug, true},
      {"default,main=debug", "other", LogLevel::Debug, false},
      {"debug,main=error", "main", LogLevel::Default, false},
      {"debug,main=error", "other", LogLevel::Debug, true},
      // A later bare level overrides earlier per-category items.
      {"main=debug,error", "main", LogLevel::Default, false},
      {" main = debug , dispatch=error", "main", LogLevel::Debug, true},
      {" main = debug , dispatch=error", "dispatch", LogLevel::Default, false},
      // Unknown items are skipped (the daemon warns of them and keeps the
      // defaults).
      {"verbose,main=loud,=debug,x=debug", "main", LogLevel::Default, true},
      {"verbose,main=loud,=debug,x=debug", "x", LogLevel::Debug, false},
  };
  for (const auto& c : cases) {
    setLogLevelSpec(c.levels);
    EXPECT_EQ(os_log_create("com.tesvar.kolvrand", c.category)->enabled(c.level), c.enabled)
        << "levels \"" << c.levels << "\" category " << c.category << " level "
        << static_cast<int>(c.level);
  }
  setLogLevelSpec("");
}

struct Counted {
  int* described;
  std::string description() const {
    ++*described;
    return "counted";
  }
};

TEST(Log, DisabledMessagesAreNotFormattedAndEnabledOnesReachTheSink) {
  test::CapturedLog captured;
  setLogLevelSpec("default");
  auto log = os_log_create("com.tesvar.kolvrand", "main");
  int described = 0;
  os_log_debug(log, "%@", Counted{&described});
  EXPECT_EQ(described, 0);
  EXPECT_TRUE(captured->entries().empty());

  os_log_error(log, "%s <Error> %@\n", "-[X y]", Counted{&described});
  EXPECT_EQ(described, 1);
  auto entries = captured->entries();
  ASSERT_EQ(entries.size(), 1u);
  EXPECT_EQ(entries[0].level, LogLevel::Error);
  EXPECT_EQ(entries[0].subsystem, "com.tesvar.kolvrand");
  EXPECT_EQ(entries[0].category, "main");
  EXPECT_EQ(entries[0].message, "-[X y] <Error> counted\n");
  setLogLevelSpec("");
}

// Redirects fd 2 into a pipe for the life of the object.
class StderrPipe {
 public:
  StderrPipe() {
    EXPECT_EQ(::pipe2(fds_, O_CLOEXEC), 0);
    ::fcntl(fds_[1], F_SETPIPE_SZ, 1 << 20);
    saved_ = ::dup(STDERR_FILENO);
    ::dup2(fds_[1], STDERR_FILENO);
  }
  ~StderrPipe() {
    restore();
    ::close(fds_[0]);
  }
  // Restores stderr and returns everything written meanwhile.
  std::string take() {
    restore();
    std::string out;
    char buf[4096];
    ssize_t n;
    while ((n = ::read(fds_[0], buf, sizeof buf)) > 0) out.append(buf, static_cast<size_t>(n));
    return out;
  }

 private:
  void restore() {
    if (saved_ < 0) return;
    ::dup2(saved_, STDERR_FILENO);
    ::close(saved_);
    ::close(fds_[1]);
    saved_ = -1;
  }
  int fds_[2] = {-1, -1};
  int saved_ = -1;
};

TEST(Log, ConcurrentMessagesNeverInterleave) {
  setLogSink(nullptr);
  auto log = os_log_create("com.tesvar.kolvrand", "threads");
  constexpr int kThreads = 4, kMessages = 200;
  StderrPipe pipe;
  {
    std::vector<std::jthread> threads;
    for (int t = 0; t < kThreads; ++t)
      threads.emplace_back([&, t] {
        for (int i = 0; i < kMessages; ++i)
          os_log(log, "thread %d message %d with some padding to make it longer\n", t, i);
      });
  }
  // Every line whole and each exactly once, in whatever order the threads ran.
  std::string prefix = "kolvrand[" + std::to_string(::getpid()) + "]: default [threads] ";
  std::vector<std::string> expected, lines;
  for (int t = 0; t < kThreads; ++t)
    for (int i = 0; i < kMessages; ++i)
      expected.push_back(prefix + "thread " + std::to_string(t) + " message " + std::to_string(i) +
                         " with some padding to make it longer");
  std::string out = pipe.take();
  size_t start = 0;
  for (size_t end; (end = out.find('\n', start)) != std::string::npos; start = end + 1)
    lines.push_back(out.substr(start, end - start));
  EXPECT_EQ(start, out.size());
  std::sort(expected.begin(), expected.end());
  std::sort(lines.begin(), lines.end());
  EXPECT_EQ(lines, expected);
}

}  // namespace
}  // namespace kolvrand
