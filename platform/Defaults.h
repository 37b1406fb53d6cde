// SPDX-License-Identifier: MIT
// Persistent settings in the manner of NSUserDefaults with a suite name. A
// suite is one JSON object in STATE/SUITE.json; every defaults object of one
// suite in a process sees the same values. Every set is durable before it
// returns and is a read-modify-write under a file lock, so processes writing
// different keys never lose each other's.
#pragma once

#include <cstdint>
#include <filesystem>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

namespace kolvrand {

class NSUserDefaults {
 public:
  // nil only when the state directory cannot be created or opened, or when
  // the suite name is no file name ("", ".", "..", or with a '/'). The
  // directory is the backend's state directory.
  static std::shared_ptr<NSUserDefaults> initWithSuiteName(std::string_view suite);
  // The same, in an explicit directory.
  static std::shared_ptr<NSUserDefaults> initWithSuiteName(std::string_view suite,
                                                           const std::filesystem::path& dir);

  // An existing suite, for reading only: nil when its file does not exist,
  // cannot be read (then *why, when given, says "PATH: REASON"; it is empty
  // for a suite that is not there) or the name is no file name. Nothing is
  // created, not even a lock file, and every set returns false.
  static std::shared_ptr<NSUserDefaults> openExistingSuiteNamed(std::string_view suite,
                                                                std::string* why = nullptr);
  static std::shared_ptr<NSUserDefaults> openExistingSuiteNamed(std::string_view suite,
                                                                const std::filesystem::path& dir,
                                                                std::string* why = nullptr);

  // An absent key, or a value of another type, reads as nil, 0 or false.
  std::optional<std::string> stringForKey(std::string_view key) const;
  bool boolForKey(std::string_view key) const;

  // Each returns false (after logging) when the value could not be made
  // durable; the file then keeps its previous content.
  bool setObject(std::string_view value, std::string_view key);
  bool setInteger(int64_t value, std::string_view key);
  bool setBool(bool value, std::string_view key);

  const std::filesystem::path& path() const;

  struct Suite;  // shared by all objects of one suite file in the process
  explicit NSUserDefaults(std::shared_ptr<Suite> suite) : suite_(std::move(suite)) {}

 private:
  std::shared_ptr<Suite> suite_;
};

}  // namespace kolvrand
