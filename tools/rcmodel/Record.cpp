// SPDX-License-Identifier: MIT
// rcmodel record: the record the daemon would send for a model file.
#include <cstdio>

#include "base/CommonCrypto.h"
#include "model/OTAParamRC.h"
#include "pipeline/BatteryModelDataHandler.h"
#include "pipeline/DaemonIdentifier.h"
#include "pipeline/KextBatteryModel.h"
#include "tools/rcmodel/Tool.h"

namespace kolvrand::rcmodel {

namespace {

constexpr const char* kHelp = R"HELP(usage: rcmodel record FILE [-o OUT]

Builds the 29056-byte record that the daemon sends to the power-management
driver from the first message of the model file FILE, with the daemon's own
loader and record builder and so with the same refusals, and prints the
record's SHA-1 in lower-case hexadecimal: the hash the driver publishes once it
holds this model.

  -o OUT   also write the record to OUT (- for standard output, then the
           SHA-1 goes to stderr).

Exit status: 0 when the record was built; 1 when the file cannot be decoded or
the daemon would refuse the model (its reasons go to stderr) or OUT cannot be
written; 2 for a wrong command line.
)HELP";

int run(const Arguments& a) {
  if (a.operands.size() != 1) return usageError(a.command, "give one model file");
  const std::string& path = a.operands.front();

  routeLogToStderr(a.command);
  auto handler = std::make_shared<BatteryModelDataHandler>();
  handler->setLog(os_log_create(DaemonIdentifier, "batteryModelDataHandling"));
  std::shared_ptr<OTAParamRC> model = handler->loadProtobufModelWithFileName(path);
  if (!model) {
    error(a.command, path + ": the daemon cannot load this file (see above); rcmodel decode " +
                         path + " shows what it holds");
    return kExitFailed;
  }
  std::unique_ptr<KextBatteryModel> record = handler->createKextModelFromProtobufModel(model.get());
  if (!record) {
    error(a.command, path + ": the daemon would refuse this model (see above); rcmodel validate " +
                         path + " lists every list against the record");
    return kExitFailed;
  }
  const SHA1Digest digest = sha1(record.get(), sizeof(KextBatteryModel));
  if (a.output && !writeOutput(a.command, *a.output,
                               std::string_view(reinterpret_cast<const char*>(record.get()),
                                                sizeof(KextBatteryModel))))
    return kExitFailed;
  std::FILE* out = a.output && isStandardOutput(*a.output) ? stderr : stdout;
  std::fprintf(out, "%s\n", hexString(digest.data(), digest.size()).c_str());
  return kExitOK;
}

}  // namespace

const Command kRecord{"record", kHelp, kOutputOption, run};

}  // namespace kolvrand::rcmodel
