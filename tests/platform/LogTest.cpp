// SPDX-License-Identifier: MIT
// Log messages: their formatting, levels per category, the sinks, and the
// message IDs of the daemon's key lines.
#include <gtest/gtest.h>
#include <unistd.h>

#include <climits>
#include <cmath>
#include <cstdio>
#include <map>
#include <nlohmann/json.hpp>
#include <set>

#include "base/MessageIDs.h"
#include "base/Value.h"
#include "platform/Log.h"
#include "tests/support/Files.h"
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
  // long and size_t are as wide as the target's: 32 bits on armhf.
  char widths[64];
  std::snprintf(widths, sizeof widths, "%lx %zx", -1L, size_t(-1));
  const std::tuple<const char*, std::vector<LogArg>, std::string> cases[] = {
      {"%d|%i|%5d|%-3d|%04x", args(-5, 17, 42, 7, 0x1f), "-5|17|   42|7  |001f"},
      // The length modifier narrows the argument as C's va_arg would.
      {"%x %u %d %hhx", args(-1, -1, 0xffffffffu, 0x1ff), "ffffffff 4294967295 -1 ff"},
      {"%lx %zx", args(-1L, size_t(-1)), widths},
      {"0x%lx %llu", args(uint64_t{0x2168}, ULLONG_MAX), "0x2168 18446744073709551615"},
      // An argument of another kind than the directive's is converted, never
      // read as something it is not.
      {"%d %d %s %s %.1f", args(2.9, hi, 7, 1.5, "y"), "2 0 7 1.5 0.0"},
      {"%s|%.2s|%5s|%-4s|", args("hello", "hello", "hi", hi), "hello|he|   hi|hi  |"},
      {"%s %@ %@ %@ %@",
       args(nullText, nullptr, std::string_view("str"), std::optional<std::string>(),
            std::shared_ptr<Value>()),
       "(null) (null) str (null) (null)"},
      {"%@",
       args(Value(Dictionary{
           {"s", Value("q\"\\\n\t\x01")},
           {"d", Value(Data{0, 0xab})},
           {"l", Value(Array{Value(true), Value(false), Value(Number::fromFloat(0.5f)),
                             Value(Number::fromDouble(-1e300)), Value(Number::fromDouble(NAN)),
                             Value(Number::fromFloat(-INFINITY))})}})),
       R"({"s": "q\"\\\n\t\u0001", "d": <00ab>, "l": [true, false, 0.5, -1e+300, nan, -inf]})"},
      {"%.3f %g %c%c %p", args(3.14159, 1e20, 'o', 'k', reinterpret_cast<const void*>(0x10)),
       "3.142 1e+20 ok 0x10"},
      // Missing arguments print nothing, surplus ones are ignored; a field
      // wider than the bound, an unknown conversion and a cut-off directive
      // print as they stand.
      {"100%% %d%% %d.", args(5), "100% 5% ."},
      {"%d %s", args(1, "x", "surplus"), "1 x"},
      {"%300d|%99999d|%k|%5", args(1, 2), std::string(299, ' ') + "1|%99999d|%k|%5"},
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

// The daemon's key lines carry the message ID of their entry in the journal
// catalog the package installs, read here by journalctl's own catalog parser
// in a root of its own: each line of message_ids.json finds the entry that
// explains it, and no entry is without its line.
// ID -> subject, as `journalctl --list-catalog` lists them; empty when
// journalctl is not at hand.
std::map<std::string, std::string> catalog(const test::TempDir& root) {
  test::writeFile(root.path() / "usr/lib/systemd/catalog/kolvrand.catalog",
                  test::readFile(KOLVRAND_SOURCE_DIR "/packaging/catalog/kolvrand.catalog"));
  const std::string journalctl = "journalctl --root='" + root.path().string() + "' ";
  std::map<std::string, std::string> entries;
  if (std::system((journalctl + "--update-catalog").c_str()) != 0) return entries;
  std::FILE* list = popen((journalctl + "--list-catalog").c_str(), "r");
  char line[512];
  while (list && std::fgets(line, sizeof line, list)) {
    std::string text(line);
    if (text.size() > 33 && text[32] == ' ')
      entries[text.substr(0, 32)] = text.substr(33, text.find_last_not_of('\n') - 32);
  }
  if (list) pclose(list);
  return entries;
}

TEST(MessageIDs, KeyLinesFindTheirCatalogEntry) {
  if (access("/usr/bin/journalctl", X_OK) != 0 && access("/bin/journalctl", X_OK) != 0)
    GTEST_SKIP() << "no journalctl";
  const test::TempDir root;
  const std::map<std::string, std::string> entries = catalog(root);
  ASSERT_FALSE(entries.empty());
  const auto rows =
      nlohmann::json::parse(test::readFile(KOLVRAND_SOURCE_DIR "/tests/platform/message_ids.json"));
  std::set<std::string> used;
  for (const auto& row : rows) {
    if (row.is_string()) continue;
    const std::string line = row[0], subject = row[1];
    SCOPED_TRACE(line);
    const std::string id(messageIDFor(line));
    if (subject.empty()) {
      EXPECT_EQ(id, "");
      continue;
    }
    ASSERT_TRUE(entries.contains(id)) << id;
    EXPECT_NE(entries.at(id).find(subject), std::string::npos) << entries.at(id);
    used.insert(id);
  }
  EXPECT_EQ(used.size(), entries.size());
}

}  // namespace
}  // namespace kolvrand
