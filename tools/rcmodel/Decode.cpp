// rcmodel decode: a model file as JSON, one message per line.
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
decoded (the stream reader's description goes to stderr) or holds no message;
2 for a wrong command line.
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

  NSError why;
  auto models =
      PBStreamReader::readProtoBuffersOfClass<OTAParamRC>(std::span<const uint8_t>(*bytes), &why);
  if (!models) {
    error(a.command, path + ": " + why.localizedDescription +
                         "; if it holds one bare message without its length, use --raw");
    return kExitFailed;
  }
  if (models->empty()) {
    error(a.command, path + ": " + kNoMessage);
    return kExitFailed;
  }
  for (const auto& model : *models) print(*model);
  return std::fflush(stdout) == 0 ? kExitOK : kExitFailed;
}

}  // namespace

const Command kDecode{"decode", kHelp, kRawOption, run};

}  // namespace kolvrand::rcmodel
