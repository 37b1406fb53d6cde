#include <gtest/gtest.h>

#include <nlohmann/json.hpp>

#include "platform/Defaults.h"
#include "tests/platform/TestUtil.h"

namespace kolvrand {
namespace {

using test::readFileText;
using test::TempDir;
using test::writeFile;

constexpr const char* kSuite = "com.tesvar.kolvrand";

TEST(Defaults, ReadsEachTypeOnlyAsItselfAndSeesWritesMadeElsewhere) {
  TempDir dir;
  auto d = NSUserDefaults::initWithSuiteName(kSuite, dir.path());
  auto same = NSUserDefaults::initWithSuiteName(kSuite, dir.path() / "." / "");
  ASSERT_TRUE(d && same);
  EXPECT_EQ(d->path(), dir.path() / "com.tesvar.kolvrand.json");
  ASSERT_TRUE(d->setObject("C5B4-11", "s"));
  ASSERT_TRUE(d->setInteger(INT64_MIN, "min"));
  ASSERT_TRUE(d->setBool(true, "b"));
  writeFile(dir.path() / "other.json", R"({"big": 18446744073709551615, "f": 1.5, "n": null})");
  auto other = NSUserDefaults::initWithSuiteName("other", dir.path());

  const struct {
    const NSUserDefaults& defaults;
    const char* key;
    std::optional<std::string> string;
    bool boolean;
  } cases[] = {{*same, "s", "C5B4-11", false},       {*same, "min", std::nullopt, false},
               {*same, "b", std::nullopt, true},     {*d, "absent", std::nullopt, false},
               {*other, "big", std::nullopt, false}, {*other, "n", std::nullopt, false}};
  for (const auto& c : cases) {
    EXPECT_EQ(c.defaults.stringForKey(c.key), c.string) << c.key;
    EXPECT_EQ(c.defaults.boolForKey(c.key), c.boolean) << c.key;
  }
  EXPECT_EQ(nlohmann::json::parse(readFileText(d->path())),
            nlohmann::json({{"s", "C5B4-11"}, {"min", INT64_MIN}, {"b", true}}));
  // Another process replacing the file is seen at the next read.
  writeFile(d->path(), R"({"s": "two"})");
  EXPECT_EQ(same->stringForKey("s"), "two");
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
  EXPECT_EQ(readFileText(d->path()), R"({"savedBootUUID": "u"})");
  EXPECT_FALSE(std::filesystem::exists(dir.path() / "com.tesvar.kolvrand.json.lock"));
}

}  // namespace
}  // namespace kolvrand
