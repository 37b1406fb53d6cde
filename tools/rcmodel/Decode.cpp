// SPDX-License-Identifier: MIT
// rcmodel decode: a model file as JSON, one message per line.
#include <algorithm>
#include <cstdio>
#include <span>

#include "model/OTAParamRC.h"
#include "pipeline/PBStreamReader.h"
#include "tools/rcmodel/ModelJSON.h"
#include "tools/rcmodel/Tool.h"

namespace kolvrand::rcmodel {

namespace {

constexpr const char* kHelp = R"HELP(usage: rcmodel decode [--raw] FILE|-

Prints each OTAParamRC message of the model file FILE (or of standard input) as
its dictionary form, one JSON object per line, in the order of the file.
Floats are written as the shortest decimal that reads back to the same 32-bit
float; NaN and the infinities as "NaN", "Infinity" and "-Infinity".

  --raw   FILE is one bare OTAParamRC message, without the length in front of
          it (as protoc --encode writes). What was read is printed even when
          the message breaks off; the exit status is then 1.

Exit status: 0 when every message decodes; 1 when the file cannot be read or
decoded (the stream reader's description goes to stderr, and nothing is
printed) or holds no message; 2 for a wrong command line. However many
messages the file holds, each is printed and dropped before the next is read.
)HELP";

void print(const OTAParamRC& model) {
  std::string line = renderJSON(model.dictionaryRepresentation());
  line += '\n';
  std::fwrite(line.data(), 1, line.size(), stdout);
}

int run(const Arguments& a) {
  if (a.operands.size() != 1) return usageError(a.command, "give one model file, or - for stdin");
  const std::string& path = a.operands.front();

  auto bytes = readModelInput(a.command, path);
  if (!bytes) return kExitFailed;

  if (a.raw) {
    OTAParamRC model;
    PBDataReader reader(bytes->data(), bytes->size());
    const bool ok = model.readFrom(reader);
    print(model);
    std::fflush(stdout);
    if (!ok) {
      error(a.command, path + ": the message breaks off at byte " +
                           std::to_string(reader.position()) + " of " +
                           std::to_string(bytes->size()) +
                           "; what was read before is printed (without --raw the file is read "
                           "as length-delimited messages)");
      return kExitFailed;
    }
    return kExitOK;
  }

  // The whole file is decoded before anything is printed, so that a damaged
  // message anywhere prints nothing; then again, one message at a time.
  // Neither pass keeps more than one message, whatever their number.
  NSError why;
  if (!forEachModel(*bytes, &why, [](const auto&, const auto&) { return true; })) {
    error(a.command, path + ": " + why.localizedDescription +
                         "; if it holds one bare message without its length, use --raw");
    return kExitFailed;
  }
  if (bytes->empty()) {
    error(a.command, path + ": " + kNoMessage);
    return kExitFailed;
  }
  // A message of the same bytes as the one before prints the same line.
  std::span<const uint8_t> previous;
  std::string line;
  forEachModel(*bytes, &why, [&](const auto& model, const PBStreamReader::Frame& frame) {
    if (line.empty() || !std::ranges::equal(frame.body, previous))
      line = renderJSON(model->dictionaryRepresentation()) + '\n';
    previous = frame.body;
    return std::fwrite(line.data(), 1, line.size(), stdout) == line.size();
  });
  return std::fflush(stdout) == 0 && !std::ferror(stdout) ? kExitOK : kExitFailed;
}

}  // namespace

const Command kDecode{"decode", kHelp, kRawOption, run};

}  // namespace kolvrand::rcmodel
