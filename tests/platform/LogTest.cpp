// SPDX-License-Identifier: MIT
#include <gtest/gtest.h>
#include <unistd.h>

#include <climits>
#include <cmath>
#include <set>
#include <thread>

#include "base/Value.h"
#include "platform/Log.h"
#include "tests/support/TestDevice.h"

namespace kolvrand {
namespace {

using Strings = std::vector<std::string>;

template <typename... T>
std::vector<LogArg> args(const T&... a) {
  return {makeLogArg(a)...};
}

TEST(FormatLogMessage, MatchesPrintf) {
  const char* nullText = nullptr;
  const std::string hi = "hi";  // LogArg views it: it must outlive the table
  // long, size_t and ptrdiff_t are as wide as the target's: 32 bits on armhf.
  char widths[96];
  std::snprintf(widths, sizeof widths, "%lx %llx %jx %zx %tx", -1L, -1LL, intmax_t{-1}, size_t(-1),
                ptrdiff_t{-1});
  const std::tuple<const char*, std::vector<LogArg>, std::string> cases[] = {
      {"%d|%i", args(-5, 17), "-5|17"},
      {"[%5d|%-5d|%05d]", args(42, 42, -42), "[   42|42   |-0042]"},
      {"%+d % d", args(7, 7), "+7  7"},
      {"%x %X %o %#x %#o", args(0x1ff, 0xabc, 8, 255, 8), "1ff ABC 10 0xff 010"},
      // The length modifier narrows the argument as C's va_arg would.
      {"%hhx %hx %hhd %hd", args(0x1ff, 0x12345, 255, 65535), "ff 2345 -1 -1"},
      {"%x %u %d", args(-1, -1, 0xffffffffu), "ffffffff 4294967295 -1"},
      {"%lx %llx %jx %zx %tx", args(-1L, -1LL, -1L, size_t(-1), -1L), widths},
      {"%lld %llu %qd %Lf", args(LLONG_MIN, ULLONG_MAX, 5, 1.5),
       "-9223372036854775808 18446744073709551615 5 1.500000"},
      // Floating-point arguments to integer conversions truncate and saturate.
      {"%d %d %u %llu %lld", args(2.9, NAN, -1.0, 1e30, -1e30),
       "2 0 4294967295 18446744073709551615 -9223372036854775808"},
      {"%c%c", args('o', 'k'), "ok"},
      {"%s|%.2s|%5s|%-4s|", args("hello", "hello", "hi", hi), "hello|he|   hi|hi  |"},
      {"%s %s %s %s %s", args(nullText, 7, 8u, 1.5, reinterpret_cast<const void*>(0x10)),
       "(null) 7 8 1.5 0x10"},
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
      {"%5.1f|%-9.2e|%.1f|%.1f", args(3.14159, 1.5, 3u, "x"), "  3.1|1.50e+00 |3.0|0.0"},
      {"%f", args(2), "2.000000"},
      {"%p", args(reinterpret_cast<const void*>(0x1234)), "0x1234"},
      {"100%% %d%%", args(5), "100% 5%"},
      // A negative * width left-aligns, a negative * precision is none.
      {"%*d|%-*d|%.*s|%*d|%.*s", args(4, 7, 3, 7, 2, "abc", -3, 7, -1, "abc"),
       "   7|7  |ab|7  |abc"},
      // Fields wider than printf's buffer, and beyond the bound of 4096.
      {"%300d|%99999d", args(1, 2), std::string(299, ' ') + "1|" + std::string(4095, ' ') + "2"},
      {"%{public}s <Error> %{private}d %{open", args("m", 3), "m <Error> 3 %{open"},
      // Missing arguments print nothing; surplus ones are ignored; %n writes
      // nothing.
      {"%d and %d.", args(1), "1 and ."},
      {"%d %s%n", args(1, "x", nullText, "surplus"), "1 x"},
      {"trailing %", {}, "trailing %"},
      {"%k %5.", {}, "%k %5."},
  };
  for (const auto& [format, arguments, expected] : cases)
    EXPECT_EQ(formatLogMessage(format, arguments), expected) << "format: " << format;
}

TEST(LogLevels, EnablesLevelsPerCategory) {
  // The setting, and which of error, default, debug are enabled for the
  // categories main, dispatch and x (a category the daemon has not). A later
  // bare level overrides earlier per-category items; items not understood
  // are skipped.
  const std::pair<const char*, std::string> cases[] = {
      {"", "110 110 110"},
      {"DEBUG", "111 111 111"},
      {"error", "100 100 100"},
      {"default,main=debug", "111 110 110"},
      {"debug,main=error", "100 111 111"},
      {"main=debug,error", "100 100 100"},
      {" main = debug , dispatch=error", "111 100 110"},
      {"verbose,main=loud,=debug,x=debug", "110 110 110"}};
  for (const auto& [levels, enabled] : cases) {
    setLogLevelSpec(levels);
    std::string actual;
    for (const char* category : {"main", "dispatch", "x"}) {
      auto log = os_log_create("com.tesvar.kolvrand", category);
      for (int l = 0; l < 3; ++l) actual += log->enabled(static_cast<LogLevel>(l)) ? '1' : '0';
      actual += ' ';
    }
    EXPECT_EQ(actual, enabled + ' ') << "levels \"" << levels << "\"";
  }
  setLogLevelSpec("");
}

struct Counted {
  int* described;
  std::string description() const { return std::to_string(++*described); }
};

TEST(Log, DisabledMessagesAreNotFormattedAndEnabledOnesReachTheSink) {
  test::TestDevice device;  // its sink keeps every message
  setLogLevelSpec("default");
  auto log = os_log_create("com.tesvar.kolvrand", "main");
  int described = 0;
  os_log_debug(log, "%@", Counted{&described});
  os_log_error(log, "%s <Error> %@\n", "-[X y]", Counted{&described});
  EXPECT_EQ(device.logLines(), Strings{"error [main] -[X y] <Error> 1"});
}

// Without a sink, messages go to stderr with the "kolvrand[PID]: " prefix;
// threads writing at once never interleave within a line.
TEST(Concurrency, LogLinesOfThreadsNeverInterleave) {
  setLogSink(nullptr);
  auto log = os_log_create("com.tesvar.kolvrand", "threads");
  FILE* file = std::tmpfile();
  ASSERT_TRUE(file);
  const int saved = ::dup(STDERR_FILENO);
  ::dup2(::fileno(file), STDERR_FILENO);
  std::multiset<std::string> expected, lines;  // in whatever order the threads ran
  {
    std::vector<std::jthread> threads;
    for (int t = 0; t < 4; ++t) {
      // A line feed within a message shows as \n: one message, one line.
      threads.emplace_back([&, t] {
        for (int i = 0; i < 200; ++i)
          os_log(log, "thread %d\nmessage %d with some padding to make it longer\n", t, i);
      });
      for (int i = 0; i < 200; ++i)
        expected.insert("kolvrand[" + std::to_string(::getpid()) + "]: default [threads] thread " +
                        std::to_string(t) + "\\nmessage " + std::to_string(i) +
                        " with some padding to make it longer\n");
    }
  }
  ::dup2(saved, STDERR_FILENO);
  ::close(saved);
  std::rewind(file);
  for (char buf[512]; std::fgets(buf, sizeof buf, file);) lines.insert(buf);
  std::fclose(file);
  EXPECT_EQ(lines, expected);
}

}  // namespace
}  // namespace kolvrand
