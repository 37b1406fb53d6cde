// SPDX-License-Identifier: MIT
// rcmodel encode: JSON back into a model file.
#include <cstdio>
#include <span>

#include "model/OTAParamRC.h"
#include "model/Wire.h"
#include "pipeline/PBStreamReader.h"
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

A model file the daemon would refuse for its size (more than 4194304 bytes)
is refused before anything is written. JSON is read from a regular file (or
standard input) of at most 67108864 bytes.

Exit status: 0 when FILE was written; 1 when it could not be written; 2 for a
wrong command line or wrong JSON, with the JSON path of the first wrong value,
or JSON whose model file would be too large.
)HELP";

int run(const Arguments& a) {
  if (a.operands.size() != 1) return usageError(a.command, "give one JSON file, or - for stdin");
  if (!a.output) return usageError(a.command, "give the model file to write with -o FILE");
  const std::string& path = a.operands.front();

  auto text = readInput(a.command, path);
  if (!text) return kExitUsage;

  // Each model is encoded as soon as its JSON is read, and the file stops
  // growing at the size the daemon reads; nothing is written before the
  // whole JSON has been read.
  constexpr size_t kLimit = PBStreamReader::kMaxFileSize;
  std::vector<uint8_t> bytes;
  size_t used = 0;
  ValueError why;
  const bool ok = forEachModelInJSON(
      *text, a.raw, {kLimit, &used}, &why,
      [&](std::shared_ptr<OTAParamRC> model, ValueError* refused) {
        const size_t size = model->encodedSize();
        const size_t framed = a.raw ? size : wire::varintSize(size) + size;
        if (framed > kLimit - used) {
          refused->reason = "with this model the file would be larger than the " +
                            std::to_string(kLimit) +
                            "-byte limit of a model file, which the daemon refuses";
          return false;
        }
        used += framed;
        std::vector<uint8_t> message = model->data();
        if (!a.raw) {
          uint8_t length[wire::kMaxVarintSize];
          bytes.insert(bytes.end(), length, length + wire::encodeVarint(length, message.size()));
        }
        bytes.insert(bytes.end(), message.begin(), message.end());
        return true;
      });
  if (!ok) {
    std::string hint;
    if (why.reason.starts_with("expected a float"))
      hint = " (NaN and the infinities are written \"NaN\", \"Infinity\", \"-Infinity\")";
    else if (why.reason.starts_with("unknown key"))
      hint = " (the keys are those rcmodel decode prints)";
    error(a.command,
          (path == "-" ? "stdin" : path) + ": " + why.message() + hint + "; nothing was written");
    return kExitUsage;
  }
  if (!writeOutput(a.command, *a.output,
                   std::string_view(reinterpret_cast<const char*>(bytes.data()), bytes.size())))
    return kExitFailed;
  return kExitOK;
}

}  // namespace

const Command kEncode{"encode", kHelp, kRawOption | kOutputOption, run};

}  // namespace kolvrand::rcmodel
