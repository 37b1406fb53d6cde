// SPDX-License-Identifier: MIT
// One table of hostile inputs, rcmodel's and the daemon's: hostile_inputs.json.
// Its rows are grouped by the class of input they stand for (the string before
// a group names the class). Each row says what is put on a fresh copy of the
// example device ("given": path -> what, below) and then either
//   "sh": a shell command run there, rcmodel and kolvrand first on its PATH, with its exit
//     "status", patterns its standard output ("stdout") and error ("stderr")
//     must match (an error without a pattern must be empty, "not" one that
//     neither may), and "most": the memory (MiB of peak resident set) and time
//     (seconds) it may take, as kolvrand-measure finds them; "xml": a file it
//     writes that must hold only characters XML allows; or
//   "daemon": a run of the daemon there, and how it ends ("uploaded", "failed",
//     "no boot session", or "stopped" by SIGTERM while its work is stuck), with
//     part of a "line" it logs ("@" stands for the model file's path) and the
//     "savedChemID" it stores when not the example battery's.
// "as": "nobody" runs either without root's privileges.
//
// What "given" puts at a path: a string's text; {"hex"}: those bytes;
// {"zeros": N}; {"repeat": TEXT, "times": N}; {"example": "whole", "half" or
// "reversed"}: the device's model file so changed, and with "hex" those bytes
// added to its first message; {"groups": N}: a message of N nested groups;
// {"merge": JSON}: the file's JSON merged with it; {"fifo"}, {"link": TARGET},
// {"dir"}, {"remove"}; {"unreadable"}: no access for anyone but root; and
// {"locked"}: an exclusive lock on it held by this process during the run.
#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <regex>

#include "base/Hex.h"
#include "base/Utf8.h"
#include "tests/support/ExampleDevice.h"

namespace kolvrand::test {
namespace {

using Row = nlohmann::ordered_json;
using Clock = std::chrono::steady_clock;

// A row, named by its class and case in the test's name.
struct Case {
  Row row;
};
void PrintTo(const Case& c, std::ostream* os) {
  *os << c.row["class"].get<std::string>() << ": " << c.row["case"].get<std::string>();
}

std::vector<Case> rows() {
  std::vector<Case> out;
  std::string group;
  const Row table =
      Row::parse(readFile(KOLVRAND_SOURCE_DIR "/tests/reliability/hostile_inputs.json"));
  for (const Row& r : table) {
    if (r.is_string()) {
      group = r.get<std::string>();
      continue;
    }
    Row row = r;
    row["class"] = group;
    out.push_back({std::move(row)});
  }
  return out;
}

// Hex text, its bytes apart by spaces or not.
std::string hexBytes(std::string hex) {
  std::erase(hex, ' ');
  return fromHex(hex).value();
}

std::string varint(uint64_t n) {
  std::string out;
  for (; n > 0x7f; n >>= 7) out += static_cast<char>(n | 0x80);
  return out + static_cast<char>(n);
}

// The example model as `what` asks for it.
std::string exampleModel(const Row& what) {
  const std::string how = what["example"];
  std::string bytes = kExample;
  if (what.contains("hex")) {
    // The first message's length is one varint; its body grows by the bytes.
    size_t at = 0;
    while (static_cast<uint8_t>(bytes[at]) & 0x80) ++at;
    const std::string body = bytes.substr(at + 1) + hexBytes(what["hex"]);
    bytes = varint(body.size()) + body;
  }
  if (how == "half") return bytes.substr(0, bytes.size() / 2);
  if (how == "reversed") return std::string(bytes.rbegin(), bytes.rend());
  return bytes;
}

// A model of groups of an unknown field (1000) opened `depth` times and
// closed again, and nothing else.
std::string nestedGroups(size_t depth) {
  std::string body;
  for (size_t i = 0; i < 2 * depth; ++i) body += i < depth ? "\xc3\x3e" : "\xc4\x3e";
  return varint(body.size()) + body;
}

// Puts at `path` what `what` says; the descriptors of the locks it takes are
// added to *locks.
void give(const fs::path& path, const Row& what, std::vector<int>* locks) {
  std::error_code ec;
  fs::create_directories(path.parent_path(), ec);
  if (what.is_string()) return writeFile(path, what.get<std::string>());
  if (what.contains("merge")) {
    json j = json::parse(readFile(path));
    j.merge_patch(json::parse(what["merge"].dump()));
    return writeFile(path, j.dump());
  }
  if (what.contains("fifo") || what.contains("link") || what.contains("dir") ||
      what.contains("remove"))
    fs::remove_all(path, ec);
  if (what.contains("fifo")) {
    ASSERT_EQ(mkfifo(path.c_str(), 0644), 0);
  }
  if (what.contains("link")) fs::create_symlink(what["link"].get<std::string>(), path);
  if (what.contains("dir")) fs::create_directory(path);
  if (what.contains("locked")) {
    const int fd = ::open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600);
    ASSERT_TRUE(fd >= 0 && ::flock(fd, LOCK_EX) == 0);
    locks->push_back(fd);
  }
  if (what.contains("example")) writeFile(path, exampleModel(what));
  if (what.contains("groups")) writeFile(path, nestedGroups(what["groups"]));
  if (what.contains("zeros")) writeFile(path, std::string(what["zeros"].get<size_t>(), '\0'));
  if (what.contains("repeat")) {
    std::string text;
    for (size_t i = 0; i < what["times"].get<size_t>(); ++i) text += what["repeat"];
    writeFile(path, text);
  }
  if (what.contains("hex") && !what.contains("example")) writeFile(path, hexBytes(what["hex"]));
}

// Makes the device usable by nobody, except what is unreadable; the command
// that then runs another without privileges. Without root, what is
// unreadable is unreadable to this user already.
std::vector<std::string> asNobody(const ExampleDevice& d, const std::vector<fs::path>& unreadable) {
  if (geteuid() != 0) return {};
  for (const auto& entry : fs::recursive_directory_iterator(d.dir))
    EXPECT_EQ(lchown(entry.path().c_str(), 65534, 65534), 0);
  EXPECT_EQ(chown(d.dir.c_str(), 65534, 65534), 0);
  for (const fs::path& p : unreadable) EXPECT_EQ(chown(p.c_str(), 0, 0), 0);
  return {"/usr/bin/setpriv", "--reuid=65534", "--regid=65534", "--clear-groups"};
}

bool found(const std::string& text, const std::string& pattern) {
  return std::regex_search(text, std::regex(pattern));
}

class HostileInput : public testing::TestWithParam<Case> {};

TEST_P(HostileInput, IsRefusedOrBoundedAsItsRowSays) {
  const Row& row = GetParam().row;
  ExampleDevice device;
  std::vector<int> locks;
  std::vector<fs::path> unreadable;
  const Row given = row.value("given", Row::object());
  for (const auto& [relative, what] : given.items()) {
    give(device.path(relative), what, &locks);
    if (what.is_object() && what.contains("unreadable"))
      unreadable.push_back(device.path(relative));
  }
  if (HasFatalFailure()) return;
  std::vector<std::string> launcher;
  if (row.value("as", "") == "nobody") launcher = asNobody(device, unreadable);
  for (const fs::path& p : unreadable) fs::permissions(p, fs::perms::none);

  if (row.contains("sh")) {
    const fs::path files[] = {device.path(".stdin"), device.path(".stdout"),
                              device.path(".stderr")};
    writeFile(files[0], "");
    const fs::path report = device.path(".report");
    launcher.insert(launcher.end(), {KOLVRAND_MEASURE, report.string(), "/bin/sh", "-c",
                                     row["sh"].get<std::string>()});
    const char* path = std::getenv("PATH");
    const char* asan = std::getenv("ASAN_OPTIONS");
    // The sanitizer holds freed memory back, up to 256 MiB by default; the
    // limits are for the program's own.
    const DaemonEnvironment env(
        device.dir, std::nullopt,
        {"PATH=" + std::string(KOLVRAND_BINARY_DIR) + "/tools/rcmodel:" + KOLVRAND_BINARY_DIR +
             "/daemon:" + (path ? path : "/usr/bin:/bin"),
         "ASAN_OPTIONS=" + std::string(asan ? asan : "") + ":quarantine_size_mb=8",
         "EXAMPLES=" + std::string(KOLVRAND_SOURCE_DIR) + "/examples"});
    const pid_t pid = spawnProgram(launcher, env, files, device.dir);
    int status = 0;
    ASSERT_TRUE(pid > 0 && waitpid(pid, &status, 0) == pid);
    const std::string out = readFile(files[1]), err = readFile(files[2]);
    EXPECT_EQ(exitCode(status), row["status"].get<int>()) << err;
    EXPECT_TRUE(row.contains("stderr") ? found(err, row["stderr"]) : err.empty()) << err;
    EXPECT_TRUE(!row.contains("stdout") || found(out, row["stdout"])) << out.substr(0, 2000);
    EXPECT_TRUE(!row.contains("not") || !found(out + err, row["not"])) << out.substr(0, 2000);
    if (row.contains("xml")) {
      const std::string xml = readFile(device.path(row["xml"].get<std::string>()));
      EXPECT_TRUE(isValidUTF8(xml));
      // No control character but tab and line ends, nor U+FFFE or U+FFFF.
      EXPECT_FALSE(found(xml, "[\x01-\x08\x0b\x0c\x0e-\x1f]|\xef\xbf[\xbe\xbf]"));
      EXPECT_EQ(xml.find('\0'), std::string::npos);
    }
    double kib = 0, seconds = 0;
    std::istringstream(readFile(report)) >> kib >> seconds;
    std::cout << "peak " << kib / 1024 << " MiB, " << seconds << " s\n";
    if (row.contains("most")) {
      EXPECT_LE(kib / 1024, row["most"][0].get<double>()) << "MiB";
      EXPECT_LE(seconds, row["most"][1].get<double>()) << "seconds";
    }
  } else {
    device.launcher = launcher;
    device.savedChemID = row.value("savedChemID", device.savedChemID);
    const std::string outcome = row["daemon"];
    std::string line = row["line"];
    if (auto at = line.find('@'); at != std::string::npos)
      line.replace(at, 1, device.path(kModel).string());
    Lines lines;
    if (outcome == "stopped") {
      // Its work waits on the lock this process holds; SIGTERM ends it all
      // the same, well within the service's stop timeout (30 s).
      DaemonProcess daemon(device.dir, "debug", launcher);
      ASSERT_TRUE(daemon.waitForLine({"checking in"})) << daemon.rawStderr();
      std::this_thread::sleep_for(std::chrono::milliseconds(200));
      const auto start = Clock::now();
      daemon.signal(SIGTERM);
      EXPECT_EQ(daemon.waitForExit(std::chrono::seconds(30)), 0) << daemon.rawStderr();
      EXPECT_LT(Clock::now() - start, std::chrono::seconds(15));
      bool wellFormed = false;
      lines = daemon.lines(&wellFormed);
      EXPECT_TRUE(wellFormed) << daemon.rawStderr();
    } else {
      lines = runDaemon(device, outcome == "uploaded" ? Outcome::Uploaded
                                : outcome == "failed" ? Outcome::Failed
                                                      : Outcome::NoBootSession);
    }
    const auto logged = [&](const std::string& text) {
      return std::any_of(lines.begin(), lines.end(),
                         [&](const std::string& l) { return l.find(text) != std::string::npos; });
    };
    EXPECT_TRUE(logged(line)) << testing::PrintToString(lines);
    // Nothing from outside reaches stderr raw.
    EXPECT_FALSE(logged("\x1b")) << testing::PrintToString(lines);
    // A refusal before the model was read whole reaches no record builder.
    EXPECT_FALSE(outcome == "failed" && line.find("createKext") == std::string::npos &&
                 logged("createKextModelFromProtobufModel"))
        << testing::PrintToString(lines);
  }
  for (int fd : locks) ::close(fd);
  for (const fs::path& p : unreadable) fs::permissions(p, fs::perms::owner_all);
}

INSTANTIATE_TEST_SUITE_P(Table, HostileInput, testing::ValuesIn(rows()));

}  // namespace
}  // namespace kolvrand::test
