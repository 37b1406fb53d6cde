// SPDX-License-Identifier: MIT
// The daemon's key lines carry the message ID of their entry in the journal
// catalog the package installs, read here by journalctl's own catalog parser
// in a root of its own: each line of message_ids.json finds the entry that
// explains it, and no entry is without its line.
#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdio>
#include <map>
#include <nlohmann/json.hpp>
#include <set>

#include "base/MessageIDs.h"
#include "tests/support/Files.h"

namespace kolvrand {
namespace {

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
