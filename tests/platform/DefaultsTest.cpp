#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <nlohmann/json.hpp>

#include "platform/Defaults.h"
#include "tests/platform/TestUtil.h"

namespace kolvrand {
namespace {

using test::readFileText;
using test::TempDir;
using test::writeFile;

constexpr const char* kSuite = "com.tesvar.kolvrand";

nlohmann::json fileContent(const NSUserDefaults& d) {
  return nlohmann::json::parse(readFileText(d.path()));
}

TEST(Defaults, ReadsEachTypeOnlyAsItself) {
  TempDir dir;
  auto d = NSUserDefaults::initWithSuiteName(kSuite, dir.path());
  ASSERT_TRUE(d);
  EXPECT_EQ(d->path(), dir.path() / "com.tesvar.kolvrand.json");
  ASSERT_TRUE(d->setObject("C5B4-11", "s"));
  ASSERT_TRUE(d->setInteger(INT64_MIN, "min"));
  ASSERT_TRUE(d->setInteger(8552, "i"));
  ASSERT_TRUE(d->setBool(true, "b"));
  writeFile(dir.path() / "other.json", R"({"big": 18446744073709551615, "f": 1.5, "n": null})");
  auto other = NSUserDefaults::initWithSuiteName("other", dir.path());

  struct Case {
    const NSUserDefaults& defaults;
    const char* key;
    std::optional<std::string> string;
    int64_t integer;
    bool boolean;
    bool exists;
  };
  const Case cases[] = {
      {*d, "s", "C5B4-11", 0, false, true},
      {*d, "i", std::nullopt, 8552, false, true},
      {*d, "min", std::nullopt, INT64_MIN, false, true},
      {*d, "b", std::nullopt, 0, true, true},
      {*d, "absent", std::nullopt, 0, false, false},
      {*other, "big", std::nullopt, 0, false, true},
      {*other, "f", std::nullopt, 0, false, true},
      {*other, "n", std::nullopt, 0, false, true},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(c.defaults.stringForKey(c.key), c.string) << c.key;
    EXPECT_EQ(c.defaults.integerForKey(c.key), c.integer) << c.key;
    EXPECT_EQ(c.defaults.boolForKey(c.key), c.boolean) << c.key;
    EXPECT_EQ(c.defaults.objectForKeyExists(c.key), c.exists) << c.key;
  }

  ASSERT_TRUE(d->setBool(false, "b"));
  ASSERT_TRUE(d->removeObjectForKey("s"));
  EXPECT_EQ(fileContent(*d), nlohmann::json({{"min", INT64_MIN}, {"i", 8552}, {"b", false}}));
}

TEST(Defaults, SeesWritesMadeOutsideThisObject) {
  TempDir dir;
  auto a = NSUserDefaults::initWithSuiteName(kSuite, dir.path());
  auto b = NSUserDefaults::initWithSuiteName(kSuite, dir.path() / "." / "");
  ASSERT_TRUE(a && b);
  ASSERT_TRUE(a->setObject("one", "savedBootUUID"));
  EXPECT_EQ(b->stringForKey("savedBootUUID"), "one");
  // Another process replacing the file is seen at the next read.
  writeFile(a->path(), R"({"savedBootUUID": "two"})");
  EXPECT_EQ(a->stringForKey("savedBootUUID"), "two");
}

TEST(Defaults, UnreadableContentReadsAsEmptyAndIsReplacedByTheNextWrite) {
  for (const char* content : {"{\"savedChemID\": 8552", "[1, 2]", "\"text\"", "", "\x01\xff"}) {
    TempDir dir;
    test::CapturedLog captured;
    auto d = NSUserDefaults::initWithSuiteName(kSuite, dir.path());
    writeFile(d->path(), content);
    EXPECT_FALSE(d->objectForKeyExists("savedChemID")) << content;
    EXPECT_EQ(captured->count(LogLevel::Error, "defaults"), 1u) << content;
    ASSERT_TRUE(d->setBool(true, "updateConditionMet"));
    EXPECT_EQ(fileContent(*d), nlohmann::json({{"updateConditionMet", true}})) << content;
  }
}

TEST(Defaults, FailsOnlyWhenTheDirectoryCannotBeMadeOrTheNameIsNoFileName) {
  TempDir dir;
  writeFile(dir.path() / "file", "");
  EXPECT_FALSE(NSUserDefaults::initWithSuiteName(kSuite, dir.path() / "file" / "state"));
  EXPECT_FALSE(NSUserDefaults::initWithSuiteName("", dir.path()));
  EXPECT_FALSE(NSUserDefaults::initWithSuiteName("a/b", dir.path()));
  // A missing directory, nested too, is created.
  auto d = NSUserDefaults::initWithSuiteName(kSuite, dir.path() / "a" / "b");
  ASSERT_TRUE(d);
  EXPECT_TRUE(d->setInteger(1, "k"));
}

// For tools that look at the daemon's state without changing it.
TEST(Defaults, AnExistingSuiteOpensForReadingOnlyAndNothingIsCreated) {
  TempDir dir;
  EXPECT_FALSE(NSUserDefaults::openExistingSuiteNamed(kSuite, dir.path() / "state"));
  EXPECT_FALSE(NSUserDefaults::openExistingSuiteNamed(kSuite, dir.path()));
  EXPECT_FALSE(std::filesystem::exists(dir.path() / "state"));

  writeFile(dir.path() / "com.tesvar.kolvrand.json", R"({"savedBootUUID": "u"})");
  auto d = NSUserDefaults::openExistingSuiteNamed(kSuite, dir.path());
  ASSERT_TRUE(d);
  EXPECT_EQ(d->stringForKey("savedBootUUID"), "u");
  EXPECT_FALSE(d->setObject("v", "savedBootUUID"));
  EXPECT_FALSE(d->removeObjectForKey("savedBootUUID"));
  EXPECT_EQ(readFileText(d->path()), R"({"savedBootUUID": "u"})");
  EXPECT_FALSE(std::filesystem::exists(dir.path() / "com.tesvar.kolvrand.json.lock"));
}

TEST(Defaults, TwoProcessesWritingDifferentKeysLoseNothing) {
  TempDir dir;
  constexpr int kWrites = 40;
  auto writeKeys = [&](const char* prefix) {
    auto d = NSUserDefaults::initWithSuiteName(kSuite, dir.path());
    bool ok = d != nullptr;
    for (int i = 0; ok && i < kWrites; ++i)
      ok = d->setInteger(i, std::string(prefix) + std::to_string(i)) &&
           d->setInteger(i, std::string(prefix) + "last");
    return ok;
  };
  pid_t child = ::fork();
  ASSERT_GE(child, 0);
  if (child == 0) ::_exit(writeKeys("child") ? 0 : 1);
  bool parentOk = writeKeys("parent");
  int status = 0;
  ASSERT_EQ(::waitpid(child, &status, 0), child);
  ASSERT_TRUE(parentOk);
  ASSERT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0);

  auto d = NSUserDefaults::initWithSuiteName(kSuite, dir.path());
  for (const char* prefix : {"child", "parent"}) {
    for (int i = 0; i < kWrites; ++i)
      EXPECT_EQ(d->integerForKey(std::string(prefix) + std::to_string(i)), i) << prefix << i;
    EXPECT_EQ(d->integerForKey(std::string(prefix) + "last"), kWrites - 1);
  }
  EXPECT_EQ(fileContent(*d).size(), size_t{2 * (kWrites + 1)});
}

}  // namespace
}  // namespace kolvrand
