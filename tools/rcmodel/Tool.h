// What the commands of rcmodel share: arguments, input and output, messages.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace kolvrand {
class OTAParamRC;
}

namespace kolvrand::rcmodel {

// Exit codes: the model is refused, cannot be decoded, or a file cannot be
// read or written: 1; the command line or the JSON given is wrong: 2.
inline constexpr int kExitOK = 0;
inline constexpr int kExitFailed = 1;
inline constexpr int kExitUsage = 2;

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
  // error when an option is unknown or -o lacks its value. `allowed` lists
  // the options the command takes besides --help ("--raw", "-o").
  bool parse(const std::vector<std::string>& args, const std::vector<std::string_view>& allowed);
};

// Prints "rcmodel COMMAND: MESSAGE" on stderr, one line.
void error(const std::string& command, const std::string& message);
// A usage error: the message and where to read more; returns kExitUsage.
int usageError(const std::string& command, const std::string& message);

// The bytes of FILE, or of standard input for "-"; nullopt after reporting.
// Model files are read by the daemon's stream reader, with its checks and
// its error descriptions.
std::optional<std::vector<uint8_t>> readInput(const std::string& command, const std::string& path);
std::optional<std::vector<uint8_t>> readModelInput(const std::string& command,
                                                   const std::string& path);
// Writes `bytes` to FILE (through a temporary file renamed into place, so a
// failed write leaves nothing behind) or to standard output for "-".
bool writeOutput(const std::string& command, const std::string& path, std::string_view bytes);

// Routes the platform log to stderr as "rcmodel COMMAND: MESSAGE" lines, with
// only errors enabled: the daemon's own refusals show, its chatter does not.
void routeLogToStderr(const std::string& command);

// The file's messages as the daemon's stream reader reads them; nullptr after
// reporting the reader's error. *count receives the number of messages.
std::shared_ptr<OTAParamRC> readFirstModel(const std::string& command, const std::string& path,
                                           size_t* count = nullptr);

// The commands; each takes the arguments after its name and returns the exit
// code.
int runDecode(const std::vector<std::string>& args);
int runEncode(const std::vector<std::string>& args);
int runRecord(const std::vector<std::string>& args);
int runValidate(const std::vector<std::string>& args);
int runPlot(const std::vector<std::string>& args);
int runStatus(const std::vector<std::string>& args);

}  // namespace kolvrand::rcmodel
