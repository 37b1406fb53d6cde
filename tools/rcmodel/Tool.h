// SPDX-License-Identifier: MIT
// What the commands of rcmodel share: arguments, input and output, messages.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "pipeline/PBStreamReader.h"

namespace kolvrand {
class OTAParamRC;
}

namespace kolvrand::rcmodel {

// Exit codes: the model is refused, cannot be decoded, or a file cannot be
// read or written: 1; the command line or the JSON given is wrong: 2.
inline constexpr int kExitOK = 0;
inline constexpr int kExitFailed = 1;
inline constexpr int kExitUsage = 2;

// The options a command takes besides --help.
enum Option : unsigned { kRawOption = 1, kOutputOption = 2 };

// The arguments of one command, split into options and operands. "-" is an
// operand (standard input or output).
struct Arguments {
  explicit Arguments(std::string name) : command(std::move(name)) {}

  std::string command;  // "decode", ... for the messages
  std::vector<std::string> operands;
  bool help = false;
  bool raw = false;
  std::optional<std::string> output;  // -o / --output

  // Splits `args` (after the command name); false after printing a usage
  // error when an option is unknown or -o lacks its value.
  bool parse(const std::vector<std::string>& args, unsigned options);
};

// One command: its --help text, the options it takes, and what it does with
// arguments that parsed (--help is answered before).
struct Command {
  std::string_view name;
  const char* help;
  unsigned options;
  int (*run)(const Arguments&);
};

extern const Command kDecode, kEncode, kRecord, kValidate, kPlot, kStatus, kUpload;

// Parses `args` for `command` and runs it: the exit code.
int runCommand(const Command& command, const std::vector<std::string>& args);

// Why a file without messages is no model file, for every command that meets one.
inline constexpr const char* kNoMessage =
    "holds no message; a model file holds at least one OTAParamRC message";

// Prints "rcmodel COMMAND: MESSAGE" on stderr, one line: control characters
// and bytes that are no UTF-8 (of a file name, of a key) show as escapes.
void error(const std::string& command, const std::string& message);
// A usage error: the message and where to read more; returns kExitUsage.
int usageError(const std::string& command, const std::string& message);

// The most JSON rcmodel reads: a model file holds at most 4 MiB, and its JSON,
// printed with indentation, some five times that.
inline constexpr size_t kMaxJSONSize = 64 * 1024 * 1024;

// The bytes of FILE, or of standard input for "-"; nullopt after reporting.
// A file is read as every file is: a regular file (a FIFO is refused without
// waiting for a writer), at most kMaxJSONSize bytes. Model files are read by
// the daemon's stream reader, with its checks and its error descriptions.
std::optional<std::string> readInput(const std::string& command, const std::string& path);
std::optional<std::vector<uint8_t>> readModelInput(const std::string& command,
                                                   const std::string& path);
// Writes `bytes` to standard output for "-", else to PATH: a regular file (or
// the one a symlink ends at) is replaced whole or not at all; a FIFO or a
// device is written in place, and a path that names one of the process's
// descriptors is written into it. false after a one-line message.
bool writeOutput(const std::string& command, const std::string& path, std::string_view bytes);
// Whether an output path is standard output: "-", /dev/stdout, /dev/fd/1 or a
// link to one (what else the command prints then goes to stderr).
bool isStandardOutput(const std::string& path);

// Routes the platform log to stderr as "rcmodel COMMAND: MESSAGE" lines, with
// only errors enabled: the daemon's own refusals show, its chatter does not.
void routeLogToStderr(const std::string& command);

// Every message of a model file, decoded as the daemon's stream reader
// decodes it and handed to `take(model, frame)` (which returns false to stop
// early), one at a time and dropped after: memory stays that of one message
// however many the file holds. A message of the very bytes of the one before
// is not decoded again, and `take` gets the same model. false with *why when
// a message cannot be framed or decoded.
bool forEachModel(std::span<const uint8_t> file, NSError* why,
                  const std::function<bool(const std::shared_ptr<OTAParamRC>&,
                                           const PBStreamReader::Frame&)>& take);

// The file's first message as the daemon's stream reader reads the file
// (every message decoded, one at a time, and dropped); nullptr after
// reporting the reader's error. *count receives the number of messages.
std::shared_ptr<OTAParamRC> readFirstModel(const std::string& command, const std::string& path,
                                           size_t* count = nullptr);

}  // namespace kolvrand::rcmodel
