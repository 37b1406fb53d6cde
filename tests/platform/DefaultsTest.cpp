#include <gtest/gtest.h>

#include <nlohmann/json.hpp>

#include "platform/Defaults.h"
#include "tests/platform/TestUtil.h"

namespace kolvrand {
namespace {

using test::readFileText;
using test::writeFile;

constexpr const char* kSuite = "com.tesvar.kolvrand";

TEST(Defaults, ReadsEachTypeOnlyAsItselfAndSeesWritesMadeElsewhere) {
  test::TempDir dir;
  auto d = NSUserDefaults::initWithSuiteName(kSuite, dir.path());
  auto same = NSUserDefaults::initWithSuiteName(kSuite, dir.path() / "." / "");
  ASSERT_TRUE(d && same);
  ASSERT_TRUE(d->setObject("C5B4-11", "s") && d->setInteger(INT64_MIN, "min") &&
              d->setBool(true, "b"));
  writeFile(dir.path() / "other.json", R"({"big": 18446744073709551615, "f": 1.5, "n": null})");
  auto other = NSUserDefaults::initWithSuiteName("other", dir.path());
  const std::tuple<const NSUserDefaults&, const char*, std::optional<std::string>, bool> cases[] = {
      {*same, "s", "C5B4-11", false},       {*same, "min", std::nullopt, false},
      {*same, "b", std::nullopt, true},     {*d, "absent", std::nullopt, false},
      {*other, "big", std::nullopt, false}, {*other, "n", std::nullopt, false}};
  for (const auto& [defaults, key, string, boolean] : cases) {
    EXPECT_EQ(defaults.stringForKey(key), string) << key;
    EXPECT_EQ(defaults.boolForKey(key), boolean) << key;
  }
  EXPECT_EQ(nlohmann::json::parse(readFileText(dir.path() / "com.tesvar.kolvrand.json")),
            nlohmann::json({{"s", "C5B4-11"}, {"min", INT64_MIN}, {"b", true}}));
  // Another process replacing the file is seen at the next read.
  writeFile(d->path(), R"({"s": "two"})");
  EXPECT_EQ(same->stringForKey("s"), "two");
}

TEST(Defaults, FailsOnlyWhenTheDirectoryCannotBeMadeOrTheNameIsNoFileName) {
  test::TempDir dir;
  writeFile(dir.path() / "file", "");
  EXPECT_FALSE(NSUserDefaults::initWithSuiteName(kSuite, dir.path() / "file" / "state"));
  EXPECT_FALSE(NSUserDefaults::initWithSuiteName("", dir.path()));
  EXPECT_FALSE(NSUserDefaults::initWithSuiteName("a/b", dir.path()));
  // A missing directory, nested too, is created.
  auto d = NSUserDefaults::initWithSuiteName(kSuite, dir.path() / "a" / "b");
  EXPECT_TRUE(d && d->setInteger(1, "k"));

  // For tools that look at the daemon's state without changing it: an
  // existing suite opens for reading only, and nothing is created.
  EXPECT_FALSE(NSUserDefaults::openExistingSuiteNamed(kSuite, dir.path() / "state"));
  EXPECT_FALSE(NSUserDefaults::openExistingSuiteNamed(kSuite, dir.path()));
  EXPECT_FALSE(std::filesystem::exists(dir.path() / "state"));
  writeFile(dir.path() / "com.tesvar.kolvrand.json", R"({"k": "u"})");
  auto existing = NSUserDefaults::openExistingSuiteNamed(kSuite, dir.path());
  ASSERT_TRUE(existing);
  EXPECT_EQ(existing->stringForKey("k"), "u");
  EXPECT_FALSE(existing->setObject("v", "k"));
  EXPECT_EQ(readFileText(existing->path()), R"({"k": "u"})");
  EXPECT_FALSE(std::filesystem::exists(dir.path() / "com.tesvar.kolvrand.json.lock"));
}

}  // namespace
}  // namespace kolvrand
