// rcmodel encode: JSON back into a model file.
#include <cstdio>
#include <span>

#include "model/OTAParamRC.h"
#include "pipeline/PBStreamWriter.h"
#include "tools/rcmodel/ModelJSON.h"
#include "tools/rcmodel/Tool.h"

namespace kolvrand::rcmodel {

namespace {

constexpr const char* kHelp = R"HELP(usage: rcmodel encode [--raw] JSON|- -o FILE

Writes the model file FILE (- for standard output) from the JSON file JSON (or
standard input): an object is one OTAParamRC message; an array of objects, or
one object a line (JSON Lines, what rcmodel decode prints), several; each is
written with its length in front as the daemon reads them. A model file holds
at least one message, and decoding FILE gives the JSON back.

  --raw       JSON is one object, written as one bare message without its
              length (what protoc --decode reads).
  -o FILE     the file to write; nothing is written when the JSON is wrong.
              A symlink is written through; a FIFO or a device is written in
              place; a file is replaced whole or, on failure, left as it was.

Keys are those of the dictionary form; a key left out leaves its field unset
(chemID then is 0). Floats are any JSON number within a float's range, rounded
to the nearest 32-bit float, or "NaN", "Infinity", "-Infinity". "chemID" is an
integer from 0 to 4294967295. "MLBConfig" is "kKVRRegularMLB",
"kKVRNorthSouthSplitMLB", "(unknown: N)" or an integer.

Exit status: 0 when FILE was written; 1 when it could not be written; 2 for a
wrong command line or wrong JSON, with the JSON path of the first wrong value.
)HELP";

int run(const Arguments& a) {
  if (a.operands.size() != 1) return usageError(a.command, "give one JSON file, or - for stdin");
  if (!a.output) return usageError(a.command, "give the model file to write with -o FILE");
  const std::string& path = a.operands.front();

  auto text = readInput(a.command, path);
  if (!text) return kExitUsage;
  JSONError why;
  auto models = modelsFromJSON(
      std::string_view(reinterpret_cast<const char*>(text->data()), text->size()), a.raw, &why);
  if (!models) {
    std::string hint;
    if (why.reason.starts_with("expected a float"))
      hint = " (NaN and the infinities are written \"NaN\", \"Infinity\", \"-Infinity\")";
    else if (why.reason.starts_with("unknown key"))
      hint = " (the keys are those rcmodel decode prints)";
    error(a.command,
          (path == "-" ? "stdin" : path) + ": " + why.message() + hint + "; nothing was written");
    return kExitUsage;
  }

  std::vector<uint8_t> bytes;
  if (a.raw) {
    bytes = models->front()->data();
  } else {
    bytes = PBStreamWriter::dataForMessages(std::span<const std::shared_ptr<OTAParamRC>>(*models));
  }
  if (!writeOutput(a.command, *a.output,
                   std::string_view(reinterpret_cast<const char*>(bytes.data()), bytes.size())))
    return kExitFailed;
  return kExitOK;
}

}  // namespace

const Command kEncode{"encode", kHelp, kRawOption | kOutputOption, run};

}  // namespace kolvrand::rcmodel
