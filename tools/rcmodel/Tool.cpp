// SPDX-License-Identifier: MIT
#include "tools/rcmodel/Tool.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <span>

#include "base/Utf8.h"
#include "model/OTAParamRC.h"
#include "pipeline/PBStreamReader.h"
#include "platform/FileManager.h"
#include "platform/Log.h"

namespace kolvrand::rcmodel {

namespace {

class StderrSink : public LogSink {
 public:
  explicit StderrSink(std::string prefix) : prefix_(std::move(prefix)) {}
  void write(LogLevel, std::string_view, std::string_view, std::string_view message) override {
    while (!message.empty() && (message.back() == '\n' || message.back() == ' '))
      message.remove_suffix(1);
    const std::string line = prefix_ + ": " + visibleText(message) + "\n";
    std::fwrite(line.data(), 1, line.size(), stderr);
  }

 private:
  std::string prefix_;
};

template <typename Bytes>
std::optional<Bytes> readStdin(const std::string& command, size_t limit, const char* kind) {
  Bytes bytes;
  uint8_t buffer[65536];
  for (;;) {
    ssize_t n = ::read(STDIN_FILENO, buffer, sizeof buffer);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) {
      error(command, std::string("cannot read standard input: ") + std::strerror(errno));
      return std::nullopt;
    }
    if (n == 0) return bytes;
    bytes.insert(bytes.end(), buffer, buffer + n);
    if (bytes.size() > limit) {
      error(command, "standard input is larger than the " + std::to_string(limit) +
                         "-byte limit for " + kind);
      return std::nullopt;
    }
  }
}

}  // namespace

bool Arguments::parse(const std::vector<std::string>& args, unsigned options) {
  bool operandsOnly = false;
  for (size_t i = 0; i < args.size(); ++i) {
    const std::string& a = args[i];
    if (operandsOnly || a == "-" || a.empty() || a[0] != '-') {
      operands.push_back(a);
    } else if (a == "--") {
      operandsOnly = true;
    } else if (a == "-h" || a == "--help") {
      help = true;
    } else if (a == "--raw" && (options & kRawOption)) {
      raw = true;
    } else if ((a == "-o" || a == "--output") && (options & kOutputOption)) {
      if (i + 1 == args.size()) {
        usageError(command, a + " needs a file name");
        return false;
      }
      output = args[++i];
    } else if (a.starts_with("--output=") && (options & kOutputOption)) {
      output = a.substr(9);
    } else {
      usageError(command, "unknown option " + a);
      return false;
    }
  }
  return true;
}

int runCommand(const Command& command, const std::vector<std::string>& args) {
  Arguments a{std::string(command.name)};
  if (!a.parse(args, command.options)) return kExitUsage;
  if (a.help) {
    std::fputs(command.help, stdout);
    return kExitOK;
  }
  return command.run(a);
}

void error(const std::string& command, const std::string& message) {
  const std::string line = "rcmodel " + command + ": " + visibleText(message) + "\n";
  std::fwrite(line.data(), 1, line.size(), stderr);
}

int usageError(const std::string& command, const std::string& message) {
  error(command, message + "; see rcmodel " + command + " --help");
  return kExitUsage;
}

std::optional<std::string> readInput(const std::string& command, const std::string& path) {
  if (path == "-") return readStdin<std::string>(command, kMaxJSONSize, "JSON");
  FileError why;
  auto file = readRegularFile(path, kMaxJSONSize, &why);
  if (!file) {
    const std::string limit = std::to_string(kMaxJSONSize) + "-byte limit";
    error(command, path + ": " + why.reason +
                       (why.code == EFBIG    ? " for JSON; a model file's JSON needs far less"
                        : why.code == EINVAL ? "; give a JSON file (of at most the " + limit +
                                                   "), or - to read standard input"
                                             : "; check the file's path"));
    return std::nullopt;
  }
  return file->text();
}

std::optional<std::vector<uint8_t>> readModelInput(const std::string& command,
                                                   const std::string& path) {
  if (path == "-")
    return readStdin<std::vector<uint8_t>>(command, PBStreamReader::kMaxFileSize, "a model file");
  NSError why;
  auto file = PBStreamReader::readFile(path, &why);
  if (!file) {
    error(command, why.localizedDescription + "; give the path of a model file");
    return std::nullopt;
  }
  return file;
}

void routeLogToStderr(const std::string& command) {
  setLogSink(std::make_shared<StderrSink>("rcmodel " + command));
  setLogLevelSpec("error");
}

bool forEachModel(std::span<const uint8_t> file, NSError* why,
                  const std::function<bool(const std::shared_ptr<OTAParamRC>&,
                                           const PBStreamReader::Frame&)>& take) {
  std::shared_ptr<OTAParamRC> model;
  std::span<const uint8_t> previous;
  bool decoded = true;
  const bool framed = PBStreamReader::forEachFrame(file, why, [&](const auto& frame) {
    if (!model || !std::ranges::equal(frame.body, previous)) {
      model = std::make_shared<OTAParamRC>();
      PBDataReader reader(frame.body.data(), frame.body.size());
      if (!model->readFrom(reader)) {
        if (why) *why = PBStreamReader::messageError(frame.index, frame.offset);
        return decoded = false;
      }
      previous = frame.body;
    }
    return take(model, frame);
  });
  return framed && decoded;
}

std::shared_ptr<OTAParamRC> readFirstModel(const std::string& command, const std::string& path,
                                           size_t* count) {
  auto bytes = readModelInput(command, path);
  if (!bytes) return nullptr;
  NSError why;
  std::shared_ptr<OTAParamRC> first;
  size_t messages = 0;
  if (!forEachModel(*bytes, &why, [&](const auto& m, const auto&) {
        if (!first) first = m;
        ++messages;
        return true;
      })) {
    error(command, path + ": " + why.localizedDescription +
                       "; check that it is a model file (rcmodel decode shows its messages)");
    return nullptr;
  }
  if (count) *count = messages;
  if (!first) {
    error(command, path + ": " + kNoMessage);
    return nullptr;
  }
  return first;
}

}  // namespace kolvrand::rcmodel
