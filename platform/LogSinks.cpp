// SPDX-License-Identifier: MIT
// Where messages go: journald when stderr is the journal, else one line each on stderr.
#include "platform/Log.h"

#include <sys/stat.h>
#include <sys/uio.h>
#include <unistd.h>
#define SD_JOURNAL_SUPPRESS_LOCATION
#include <systemd/sd-journal.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <mutex>

#include "base/LogTap.h"
#include "base/MessageIDs.h"
#include "base/Utf8.h"
#include "platform/FileManager.h"

namespace kolvrand {

namespace {

// By LogLevel: the name on stderr and the journal's priority.
constexpr const char* kLevelNames[] = {"error", "default", "debug"};
constexpr const char* kPriorities[] = {"PRIORITY=3", "PRIORITY=5", "PRIORITY=7"};

std::string_view withoutTrailingNewline(std::string_view message) {
  if (!message.empty() && message.back() == '\n') message.remove_suffix(1);
  return message;
}

void writeStderrLine(LogLevel level, std::string_view category, std::string_view message) {
  // One write per line under a process-wide mutex: lines of different threads
  // never interleave, and a line is never split by another process's output
  // as long as it fits in a pipe buffer.
  static auto* mutex = new std::mutex;
  std::string line = "kolvrand[" + std::to_string(::getpid()) +
                     "]: " + kLevelNames[static_cast<int>(level)] + " [";
  line.append(category);
  line += "] ";
  // One message, one line, and nothing a terminal would act on: text from
  // outside (a target type, a file name) may hold a line feed or an escape
  // sequence, which show as escapes here. The journal keeps them as they are.
  line += visibleText(withoutTrailingNewline(message));
  line += '\n';
  std::lock_guard lock(*mutex);
  writeAll(STDERR_FILENO, line);  // a log that cannot be written has nowhere to say so
}

class StderrSink final : public LogSink {
 public:
  void write(LogLevel level, std::string_view, std::string_view category,
             std::string_view message) override {
    writeStderrLine(level, category, message);
  }
};

class JournalSink final : public LogSink {
 public:
  void write(LogLevel level, std::string_view subsystem, std::string_view category,
             std::string_view message) override {
    const char* priority = kPriorities[static_cast<int>(level)];
    std::string sub = "KOLVRAND_SUBSYSTEM=";
    sub.append(subsystem);
    std::string cat = "KOLVRAND_CATEGORY=";
    cat.append(category);
    std::string msg = "MESSAGE=";
    msg.append(withoutTrailingNewline(message));
    static const char identifier[] = "SYSLOG_IDENTIFIER=kolvrand";
    // The key lines carry the ID of their catalog entry (journalctl -x).
    const std::string_view messageID = messageIDFor(message);
    std::string id = "MESSAGE_ID=";
    id.append(messageID);
    auto iov = [](const void* p, size_t n) { return iovec{const_cast<void*>(p), n}; };
    const iovec fields[] = {
        iov(priority, std::char_traits<char>::length(priority)),
        iov(identifier, sizeof identifier - 1),
        iov(sub.data(), sub.size()),
        iov(cat.data(), cat.size()),
        iov(msg.data(), msg.size()),
        iov(id.data(), id.size()),
    };
    const int count = static_cast<int>(std::size(fields)) - (messageID.empty() ? 1 : 0);
    if (sd_journal_sendv(fields, count) < 0) writeStderrLine(level, category, message);
  }
};

// systemd sets JOURNAL_STREAM to the device and inode of the stream it
// connected stdout/stderr to; if fd 2 is still that stream, the journal gets
// structured entries rather than bare lines. The native socket must exist
// too: entries sent without it vanish without an error.
bool stderrIsJournal() {
  if (::access("/run/systemd/journal/socket", F_OK) != 0) return false;
  const char* env = std::getenv("JOURNAL_STREAM");
  if (!env) return false;
  uintmax_t dev = 0, ino = 0;
  char extra = 0;
  if (std::sscanf(env, "%ju:%ju%c", &dev, &ino, &extra) != 2) return false;
  struct stat st {};
  if (::fstat(STDERR_FILENO, &st) != 0) return false;
  return static_cast<uintmax_t>(st.st_dev) == dev && static_cast<uintmax_t>(st.st_ino) == ino;
}

struct SinkState {
  std::mutex mutex;
  std::shared_ptr<LogSink> installed;
  std::shared_ptr<LogSink> standard;  // chosen once, at first use
};

SinkState& sinkState() {
  static auto* s = new SinkState;
  return *s;
}

std::shared_ptr<LogSink> currentSink() {
  SinkState& s = sinkState();
  std::lock_guard lock(s.mutex);
  if (s.installed) return s.installed;
  if (!s.standard) {
    if (stderrIsJournal())
      s.standard = std::make_shared<JournalSink>();
    else
      s.standard = std::make_shared<StderrSink>();
  }
  return s.standard;
}

}  // namespace

void setLogSink(std::shared_ptr<LogSink> sink) {
  SinkState& s = sinkState();
  std::lock_guard lock(s.mutex);
  s.installed = std::move(sink);
}

void emitLog(const OSLog& log, LogLevel level, std::string_view format,
             std::span<const LogArg> args) {
  std::string message = formatLogMessage(format, args);
  if (level == LogLevel::Error) FirstErrorTap::note(message);
  if (auto sink = currentSink()) sink->write(level, log.subsystem(), log.category(), message);
}

}  // namespace kolvrand
