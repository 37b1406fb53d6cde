// rcmodel validate: whether the daemon would load each model file, and why not.
#include <cstdio>

#include "model/OTAParamRC.h"
#include "pipeline/BatteryModelDataHandler.h"
#include "pipeline/KextBatteryModel.h"
#include "pipeline/KextBatteryModelSources.h"
#include "platform/CommonCrypto.h"
#include "tools/rcmodel/Tool.h"

namespace kolvrand::rcmodel {

namespace {

constexpr const char* kHelp = R"HELP(usage: rcmodel validate FILE...

For each model file: whether it decodes, and whether its first message fills
the record the daemon sends to the driver: every list's element count against
the count the record carries, the resistance tables that are missing, and the
elements beyond the record's count, which the daemon drops. A file the daemon
would load ends with "ok" and its record's SHA-1.

Exit status: 0 when the daemon would load every file; 1 when it would refuse
at least one; 2 for a wrong command line.
)HELP";

void row(const std::string& field, size_t held, size_t carried) {
  std::string verdict = "ok";
  if (held < carried)
    verdict = "SHORT: " + std::to_string(carried - held) + " missing, the daemon refuses this";
  else if (held > carried)
    verdict = std::to_string(held - carried) + " beyond the record, dropped";
  std::printf("  %-40s %6zu %6zu  %s\n", field.c_str(), held, carried, verdict.c_str());
}

// Prints the report of one file; true when the daemon would load it.
bool validate(const std::string& path) {
  std::printf("%s\n", path.c_str());
  size_t count = 0;
  std::shared_ptr<OTAParamRC> model = readFirstModel("validate", path, &count);
  if (!model) {
    std::printf("  decodes: no; the daemon refuses it\n");
    return false;
  }
  std::printf("  decodes: yes, %zu message%s%s\n", count, count == 1 ? "" : "s",
              count > 1 ? "; the daemon uses the first" : "");

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
  std::printf("  ok: the daemon would load it; record SHA-1 %s\n",
              hexString(digest.data(), digest.size()).c_str());
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
