#include <gtest/gtest.h>

#include <unistd.h>
#include <cmath>

#include <algorithm>
#include <climits>
#include <cstdint>
#include <cstdio>
#include <thread>
#include <tuple>

#include "platform/Log.h"
#include "platform/Value.h"
#include "tests/support/TestDevice.h"

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

TEST(LogLevels, EnablesLevelsPerCategory) {
  // Level setting, category, and which of error, default, debug are enabled.
  const std::tuple<const char*, const char*, const char*> cases[] = {
      {"", "main", "110"},
      {"DEBUG", "any", "111"},
      {"error", "any", "100"},
      {"default,main=debug", "main", "111"},
      {"default,main=debug", "other", "110"},
      {"debug,main=error", "main", "100"},
      {"debug,main=error", "other", "111"},
      // A later bare level overrides earlier per-category items.
      {"main=debug,error", "main", "100"},
      {" main = debug , dispatch=error", "main", "111"},
      {" main = debug , dispatch=error", "dispatch", "100"},
      // Unknown items are skipped, keeping the defaults.
      {"verbose,main=loud,=debug,x=debug", "main", "110"},
      {"verbose,main=loud,=debug,x=debug", "x", "110"},
  };
  for (const auto& [levels, category, enabled] : cases) {
    setLogLevelSpec(levels);
    auto log = os_log_create("com.tesvar.kolvrand", category);
    for (int l = 0; l < 3; ++l)
      EXPECT_EQ(log->enabled(static_cast<LogLevel>(l)), enabled[l] == '1')
          << "levels \"" << levels << "\" category " << category << " level " << l;
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
  auto sink = std::make_shared<test::LogCapture>();
  setLogSink(sink);
  setLogLevelSpec("default");
  auto log = os_log_create("com.tesvar.kolvrand", "main");
  int described = 0;
  os_log_debug(log, "%@", Counted{&described});
  os_log_error(log, "%s <Error> %@\n", "-[X y]", Counted{&described});
  EXPECT_EQ(described, 1);
  EXPECT_EQ(sink->lines(), std::vector<std::string>{"error [main] -[X y] <Error> counted"});
  setLogSink(nullptr);
  setLogLevelSpec("");
}

// Without a sink, messages go to stderr; threads writing at once never
// interleave within a line.
TEST(Log, ConcurrentMessagesNeverInterleave) {
  setLogSink(nullptr);
  auto log = os_log_create("com.tesvar.kolvrand", "threads");
  constexpr int kThreads = 4, kMessages = 200;
  FILE* file = std::tmpfile();
  ASSERT_TRUE(file);
  const int saved = ::dup(STDERR_FILENO);
  ::dup2(::fileno(file), STDERR_FILENO);
  {
    std::vector<std::jthread> threads;
    for (int t = 0; t < kThreads; ++t)
      threads.emplace_back([&, t] {
        for (int i = 0; i < kMessages; ++i)
          os_log(log, "thread %d message %d with some padding to make it longer\n", t, i);
      });
  }
  ::dup2(saved, STDERR_FILENO);
  ::close(saved);
  // Every line whole and each exactly once, in whatever order the threads ran.
  const std::string prefix = "kolvrand[" + std::to_string(::getpid()) + "]: default [threads] ";
  std::vector<std::string> expected, lines;
  for (int t = 0; t < kThreads; ++t)
    for (int i = 0; i < kMessages; ++i)
      expected.push_back(prefix + "thread " + std::to_string(t) + " message " + std::to_string(i) +
                         " with some padding to make it longer");
  std::rewind(file);
  for (char buf[512]; std::fgets(buf, sizeof buf, file);) lines.push_back(buf);
  std::fclose(file);
  for (auto& l : lines) {
    EXPECT_TRUE(l.ends_with('\n')) << l;
    l.pop_back();
  }
  std::sort(expected.begin(), expected.end());
  std::sort(lines.begin(), lines.end());
  EXPECT_EQ(lines, expected);
}

}  // namespace
}  // namespace kolvrand
