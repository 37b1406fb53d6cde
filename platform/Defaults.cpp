// SPDX-License-Identifier: MIT
#include "platform/Defaults.h"

#include <fcntl.h>
#include <sys/file.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <cstring>
#include <map>
#include <mutex>

#include "base/ValueJSON.h"
#include "platform/Backend.h"
#include "platform/FileManager.h"
#include "platform/Internal.h"

namespace kolvrand {

struct NSUserDefaults::Suite {
  std::filesystem::path path;      // STATE/SUITE.json
  std::filesystem::path lockPath;  // STATE/SUITE.json.lock
  std::mutex mutex;                // orders this process's reads and writes
  bool readOnly = false;           // opened by openExistingSuiteNamed: never written
};

namespace {

const os_log_t& defaultsLog() {
  return platform::platformLog("defaults");
}

// flock(2) on the suite's lock file. The data file itself is replaced by
// rename at every write, so it cannot carry the lock.
class FileLock {
 public:
  // Without `create`, a missing lock file is not made and nothing is locked.
  FileLock(const std::filesystem::path& path, int operation, bool create = true) {
    // O_NONBLOCK: a FIFO put in the lock file's place must not hold the
    // open until a writer comes.
    constexpr int kFlags = O_CLOEXEC | O_NONBLOCK | O_NOCTTY;
    fd_ = create ? ::open(path.c_str(), O_RDWR | O_CREAT | kFlags, 0600)
                 : ::open(path.c_str(), O_RDONLY | kFlags);
    if (fd_ < 0) {
      error_ = errno;
      return;
    }
    while (::flock(fd_, operation) != 0) {
      if (errno == EINTR) continue;
      error_ = errno;
      ::close(fd_);
      fd_ = -1;
      return;
    }
  }
  ~FileLock() {
    if (fd_ >= 0) ::close(fd_);  // releases the lock
  }
  FileLock(const FileLock&) = delete;
  FileLock& operator=(const FileLock&) = delete;

  bool locked() const { return fd_ >= 0; }
  int error() const { return error_; }

 private:
  int fd_ = -1;
  int error_ = 0;
};

// The suite's content; missing, unreadable or malformed files read as empty
// (the latter two logged), and the next write replaces them. Something else
// than a regular file in its place (a FIFO, a link to a device) or a file
// beyond the size of any settings is unreadable: it never blocks the reader
// or takes its memory.
JSON readSuite(const std::filesystem::path& path) {
  FileError error;
  auto text = platform::readFile(path, &error);
  if (!text) {
    if (error.code != ENOENT)
      os_log_error(defaultsLog(), "cannot read %s: %s\n", path.string(), error.reason);
    return JSON::object();
  }
  // Read as a view, through the lexer the JSON conversion uses: one copy of
  // it in the daemon.
  JSON j = JSON::parse(std::string_view(*text), nullptr, false);
  if (j.is_discarded() || !j.is_object()) {
    os_log_error(defaultsLog(), "%s is not a JSON object; reading it as empty\n", path.string());
    return JSON::object();
  }
  return j;
}

bool validSuiteName(std::string_view s) {
  return !s.empty() && s != "." && s != ".." && s.find('/') == std::string_view::npos &&
         s.find('\0') == std::string_view::npos;
}

struct SuiteTable {
  std::mutex mutex;
  std::map<std::string, std::weak_ptr<NSUserDefaults::Suite>> suites;
};

SuiteTable& suiteTable() {
  static auto* t = new SuiteTable;
  return *t;
}

// DIR/SUITE.json made absolute and normal, so that one file is one suite.
std::filesystem::path suitePath(std::string_view suite, const std::filesystem::path& dir) {
  std::error_code ec;
  const std::filesystem::path absolute = std::filesystem::absolute(dir, ec);
  return ((ec ? dir : absolute) / (std::string(suite) + ".json")).lexically_normal();
}

}  // namespace

std::shared_ptr<NSUserDefaults> NSUserDefaults::initWithSuiteName(std::string_view suite) {
  return initWithSuiteName(suite, platform::backend().stateDirectory());
}

std::shared_ptr<NSUserDefaults> NSUserDefaults::initWithSuiteName(
    std::string_view suite, const std::filesystem::path& dir) {
  if (!validSuiteName(suite)) {
    os_log_error(defaultsLog(), "invalid defaults suite name \"%s\"\n", suite);
    return nullptr;
  }
  std::error_code ec;
  std::filesystem::create_directories(dir, ec);
  int fd = ::open(dir.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (fd < 0) {
    int err = errno;
    os_log_error(defaultsLog(), "cannot use state directory %s: %s\n", dir.string(),
                 ec ? ec.message() : std::string(std::strerror(err)));
    return nullptr;
  }
  ::close(fd);

  const std::filesystem::path path = suitePath(suite, dir);
  SuiteTable& table = suiteTable();
  std::lock_guard lock(table.mutex);
  std::weak_ptr<Suite>& entry = table.suites[path.string()];
  std::shared_ptr<Suite> shared = entry.lock();
  if (!shared) {
    entry = shared = std::make_shared<Suite>();
    shared->path = path;
    shared->lockPath = path.string() + ".lock";
  }
  return std::make_shared<NSUserDefaults>(std::move(shared));
}

std::shared_ptr<NSUserDefaults> NSUserDefaults::openExistingSuiteNamed(std::string_view suite,
                                                                       std::string* why) {
  return openExistingSuiteNamed(suite, platform::backend().stateDirectory(), why);
}

std::shared_ptr<NSUserDefaults> NSUserDefaults::openExistingSuiteNamed(
    std::string_view suite, const std::filesystem::path& dir, std::string* why) {
  if (why) why->clear();
  if (!validSuiteName(suite)) return nullptr;
  auto shared = std::make_shared<Suite>();
  shared->path = suitePath(suite, dir);
  shared->lockPath = shared->path.string() + ".lock";
  shared->readOnly = true;
  // A suite that is not there is no error; one that may be there but cannot
  // be read (a directory the caller may not search, a file it may not read)
  // is, since its values are then unknown rather than absent.
  FileError error;
  if (!platform::readFile(shared->path, &error)) {
    if (why && error.code != ENOENT) *why = shared->path.string() + ": " + error.reason;
    return nullptr;
  }
  return std::make_shared<NSUserDefaults>(std::move(shared));
}

namespace {

// The current content under a shared lock, so a read never overlaps another
// process's read-modify-write. Without a lock file (read-only directory) the
// file is read as is; renames keep it whole either way.
JSON load(NSUserDefaults::Suite& s) {
  std::lock_guard lock(s.mutex);
  FileLock fileLock(s.lockPath, LOCK_SH, !s.readOnly);
  return readSuite(s.path);
}

// A writer killed between creating its temporary file (.SUITE.json.XXXXXX)
// and renaming it leaves that file behind. Temporaries are made only under
// the exclusive lock, so any found while holding it is such a leftover.
void removeStaleTemporaries(const std::filesystem::path& path) {
  const std::string prefix = "." + path.filename().string() + ".";
  std::error_code ec;
  for (std::filesystem::directory_iterator it(path.parent_path(), ec), end; !ec && it != end;
       it.increment(ec)) {
    const std::string name = it->path().filename().string();
    if (name.size() == prefix.size() + 6 && name.starts_with(prefix) &&
        std::all_of(name.begin() + static_cast<std::ptrdiff_t>(prefix.size()), name.end(),
                    [](unsigned char c) { return std::isalnum(c); })) {
      std::error_code ignored;
      std::filesystem::remove(it->path(), ignored);
    }
  }
}

// Read-modify-write under the exclusive lock, so that writers in other
// processes never lose each other's keys.
template <typename F>
bool update(NSUserDefaults::Suite& s, std::string_view key, F&& modify) {
  if (s.readOnly) {
    os_log_error(defaultsLog(), "%s is open for reading only; %s not written\n", s.path.string(),
                 key);
    return false;
  }
  std::lock_guard lock(s.mutex);
  FileLock fileLock(s.lockPath, LOCK_EX);
  if (!fileLock.locked()) {
    os_log_error(defaultsLog(), "cannot lock %s: %s; %s not written\n", s.lockPath.string(),
                 std::strerror(fileLock.error()), key);
    return false;
  }
  removeStaleTemporaries(s.path);
  JSON content = readSuite(s.path);
  modify(content);
  std::string step;
  if (int err =
          replaceFile(s.path, content.dump(2, ' ', false, JSON::error_handler_t::replace) + "\n",
                      0600, &step)) {
    os_log_error(defaultsLog(), "%s: %s: %s; %s not written\n", s.path.string(), step,
                 std::strerror(err), key);
    return false;
  }
  return true;
}

const JSON* find(const JSON& content, std::string_view key) {
  auto it = content.find(std::string(key));
  return it == content.end() ? nullptr : &*it;
}

}  // namespace

std::optional<std::string> NSUserDefaults::stringForKey(std::string_view key) const {
  JSON content = load(*suite_);
  const JSON* v = find(content, key);
  if (!v || !v->is_string()) return std::nullopt;
  return v->get<std::string>();
}

bool NSUserDefaults::boolForKey(std::string_view key) const {
  JSON content = load(*suite_);
  const JSON* v = find(content, key);
  return v && v->is_boolean() && v->get<bool>();
}

bool NSUserDefaults::setObject(std::string_view value, std::string_view key) {
  return update(*suite_, key, [&](JSON& c) { c[std::string(key)] = std::string(value); });
}

bool NSUserDefaults::setInteger(int64_t value, std::string_view key) {
  return update(*suite_, key, [&](JSON& c) { c[std::string(key)] = value; });
}

bool NSUserDefaults::setBool(bool value, std::string_view key) {
  return update(*suite_, key, [&](JSON& c) { c[std::string(key)] = value; });
}

const std::filesystem::path& NSUserDefaults::path() const {
  return suite_->path;
}

}  // namespace kolvrand
