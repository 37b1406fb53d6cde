// SPDX-License-Identifier: MIT
// rcmodel validate: whether the daemon would load each model file, and why not.
#include <cstdio>
#include <span>

#include "base/CommonCrypto.h"
#include "base/Utf8.h"
#include "model/OTAParamRC.h"
#include "pipeline/BatteryModelDataHandler.h"
#include "pipeline/KextBatteryModel.h"
#include "pipeline/KextBatteryModelSources.h"
#include "pipeline/PBStreamReader.h"
#include "tools/rcmodel/Tool.h"
#include "tools/rcmodel/WireCheck.h"

namespace kolvrand::rcmodel {

namespace {

constexpr const char* kHelp = R"HELP(usage: rcmodel validate FILE...

For each model file: whether it decodes; where its encoding is one the
standard protocol-buffer parser (protoc, libprotobuf) rejects or reads
otherwise than the daemon does (a field number 0, a wire type 6 or 7, an
end-group tag with no group open, a field under a wire type not its own, a
tag or varint of needless length, a message field given twice), each with its
offset in the file; and whether its first message fills the record the daemon
sends to the driver: every list's element count against the count the record
carries, the resistance tables that are missing, and the elements beyond the
record's count, which the daemon drops. A file the daemon would load and the
standard parser reads alike ends with "ok" and its record's SHA-1.

Exit status: 0 when every file ends with "ok"; 1 when the daemon would refuse
at least one or the standard parser would not read one as the daemon does; 2
for a wrong command line.
)HELP";

void row(const std::string& field, size_t held, size_t carried) {
  std::string verdict = "ok";
  if (held < carried)
    verdict = "SHORT: " + std::to_string(carried - held) + " missing, the daemon refuses this";
  else if (held > carried)
    verdict = std::to_string(held - carried) + " beyond the record, dropped";
  std::printf("  %-40s %6zu %6zu  %s\n", field.c_str(), held, carried, verdict.c_str());
}

// The file's first message, its number of messages and its wire problems,
// one message at a time; nullptr after reporting why it does not decode.
std::shared_ptr<OTAParamRC> read(const std::string& path, size_t* count, WireProblems* wire) {
  auto bytes = readModelInput("validate", path);
  if (!bytes) return nullptr;
  const std::span<const uint8_t> file(*bytes);
  std::shared_ptr<OTAParamRC> first;
  NSError why;
  if (!forEachModel(file, &why, [&](const auto& m, const PBStreamReader::Frame& frame) {
        if (!first) first = m;
        ++*count;
        checkWire(frame.body, static_cast<size_t>(frame.body.data() - file.data()), wire);
        return true;
      })) {
    error("validate", path + ": " + why.localizedDescription +
                          "; check that it is a model file (rcmodel decode shows its messages)");
    return nullptr;
  }
  if (!first) error("validate", path + ": " + kNoMessage);
  return first;
}

// Prints the report of one file; true when it ends with "ok".
bool validate(const std::string& path) {
  std::printf("%s\n", visibleText(path).c_str());
  size_t count = 0;
  WireProblems wire;
  std::shared_ptr<OTAParamRC> model = read(path, &count, &wire);
  if (!model) {
    std::printf("  decodes: no; the daemon refuses it\n");
    return false;
  }
  std::printf("  decodes: yes, %zu message%s%s\n", count, count == 1 ? "" : "s",
              count > 1 ? "; the daemon uses the first" : "");
  for (const WireProblem& p : wire.shown)
    std::printf("  wire: offset %zu: %s\n", p.offset, p.text.c_str());
  if (wire.count > wire.shown.size())
    std::printf("  wire: %zu more like these\n", wire.count - wire.shown.size());

  std::printf("  %-40s %6s %6s\n", "list", "held", "record");
  for (const KextListCheck& c : checkKextLists(*model)) {
    if (!c.list)
      std::printf("  %-40s %6s %6s  MISSING: the record needs all %zu resistance tables\n", c.table,
                  "-", "-", kextTableSources().size());
    else
      row(c.name(), c.held, c.carried);
  }

  // What the record carries for values the model may leave out.
  if (!model->hasBmuResistance())
    std::printf("  note: no bmuResistance; the record carries zeros\n");
  if (!model->hasMaxRdcRatio()) std::printf("  note: maxRdcRatio not set; the record carries 0\n");
  if (!model->hasMaxRdcRatioR2Extrap())
    std::printf("  note: maxRdcRatioR2Extrap not set; the record carries 0\n");
  if (!model->hasBaselineWRdc())
    std::printf("  note: baselineWRdc not set; the record carries 0\n");
  if (!model->hasMLBConfig())
    std::printf("  note: MLBConfig not set; the record carries 0 (kKVRRegularMLB)\n");

  // The verdict is the daemon's own builder's, so it can never disagree.
  BatteryModelDataHandler quiet;
  std::unique_ptr<KextBatteryModel> record = quiet.createKextModelFromProtobufModel(model.get());
  if (!record) {
    std::printf("  refused: the daemon would not load this model\n");
    return false;
  }
  const SHA1Digest digest = sha1(record.get(), sizeof(KextBatteryModel));
  const std::string hash = hexString(digest.data(), digest.size());
  if (wire.count > 0) {
    std::printf(
        "  read otherwise: the daemon would load it (record SHA-1 %s), but the standard parser "
        "rejects it or reads another model (the wire lines above)\n",
        hash.c_str());
    return false;
  }
  std::printf("  ok: the daemon would load it; record SHA-1 %s\n", hash.c_str());
  return true;
}

int run(const Arguments& a) {
  if (a.operands.empty()) return usageError(a.command, "give at least one model file");
  bool all = true;
  for (size_t i = 0; i < a.operands.size(); ++i) {
    if (i > 0) std::printf("\n");
    std::fflush(stdout);
    all = validate(a.operands[i]) && all;
    std::fflush(stdout);
  }
  return all ? kExitOK : kExitFailed;
}

}  // namespace

const Command kValidate{"validate", kHelp, 0, run};

}  // namespace kolvrand::rcmodel
