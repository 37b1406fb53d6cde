#include "tools/rcmodel/Tool.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <span>

#include "model/OTAParamRC.h"
#include "pipeline/PBStreamReader.h"
#include "platform/Log.h"

namespace kolvrand::rcmodel {

namespace {

class StderrSink : public LogSink {
 public:
  explicit StderrSink(std::string prefix) : prefix_(std::move(prefix)) {}
  void write(LogLevel, std::string_view, std::string_view, std::string_view message) override {
    while (!message.empty() && (message.back() == '\n' || message.back() == ' '))
      message.remove_suffix(1);
    std::fprintf(stderr, "%s: %.*s\n", prefix_.c_str(), static_cast<int>(message.size()),
                 message.data());
  }

 private:
  std::string prefix_;
};

std::optional<std::vector<uint8_t>> readStdin(const std::string& command, size_t limit) {
  std::vector<uint8_t> bytes;
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
                         "-byte limit; give a file instead");
      return std::nullopt;
    }
  }
}

// The stream reader's buffer type is its own business (a vector, or a buffer
// with bytes()); a model is small enough to copy.
template <typename Contents>
std::vector<uint8_t> copyBytes(const Contents& contents) {
  if constexpr (requires { contents.bytes(); }) {
    const auto bytes = contents.bytes();
    return std::vector<uint8_t>(bytes.begin(), bytes.end());
  } else {
    return std::vector<uint8_t>(contents.begin(), contents.end());
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
  std::fprintf(stderr, "rcmodel %s: %s\n", command.c_str(), message.c_str());
}

int usageError(const std::string& command, const std::string& message) {
  error(command, message + "; see rcmodel " + command + " --help");
  return kExitUsage;
}

std::optional<std::vector<uint8_t>> readInput(const std::string& command, const std::string& path) {
  // JSON written by hand is small; the limit only guards against the wrong file.
  constexpr size_t kLimit = 256 * 1024 * 1024;
  if (path == "-") return readStdin(command, kLimit);
  std::error_code ec;
  if (std::filesystem::is_directory(path, ec)) {
    error(command, path + ": is a directory; give a file");
    return std::nullopt;
  }
  std::FILE* file = std::fopen(path.c_str(), "rb");
  if (!file) {
    error(command, path + ": cannot open: " + std::strerror(errno) + "; check the file's path");
    return std::nullopt;
  }
  std::vector<uint8_t> bytes;
  uint8_t buffer[65536];
  size_t n = 0;
  while ((n = std::fread(buffer, 1, sizeof buffer, file)) > 0) {
    bytes.insert(bytes.end(), buffer, buffer + n);
    if (bytes.size() > kLimit) break;
  }
  const bool failed = std::ferror(file) || bytes.size() > kLimit;
  std::fclose(file);
  if (failed) {
    error(command, path + ": cannot read it whole");
    return std::nullopt;
  }
  return bytes;
}

std::optional<std::vector<uint8_t>> readModelInput(const std::string& command,
                                                   const std::string& path) {
  if (path == "-") return readStdin(command, PBStreamReader::kMaxFileSize);
  NSError why;
  auto file = PBStreamReader::readFile(path, &why);
  if (!file) {
    error(command, why.localizedDescription + "; give the path of a model file");
    return std::nullopt;
  }
  return copyBytes(*file);
}

void routeLogToStderr(const std::string& command) {
  setLogSink(std::make_shared<StderrSink>("rcmodel " + command));
  setLogLevelSpec("error");
}

std::shared_ptr<OTAParamRC> readFirstModel(const std::string& command, const std::string& path,
                                           size_t* count) {
  auto bytes = readModelInput(command, path);
  if (!bytes) return nullptr;
  NSError why;
  auto models =
      PBStreamReader::readProtoBuffersOfClass<OTAParamRC>(std::span<const uint8_t>(*bytes), &why);
  if (!models) {
    error(command, path + ": " + why.localizedDescription +
                       "; check that it is a model file (rcmodel decode shows its messages)");
    return nullptr;
  }
  if (count) *count = models->size();
  if (models->empty()) {
    error(command, path + ": " + kNoMessage);
    return nullptr;
  }
  return models->front();
}

}  // namespace kolvrand::rcmodel
