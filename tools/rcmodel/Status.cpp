// SPDX-License-Identifier: MIT
// rcmodel status: what the daemon on this device would load and whether the
// driver holds it. Read-only: it reads what the daemon reads, through the
// daemon's own code, and never uploads or writes a setting.
#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <mutex>

#include "base/CommonCrypto.h"
#include "base/Utf8.h"
#include "daemon/BatteryModelTask.h"
#include "model/OTAParamRC.h"
#include "pipeline/BatteryModelDataHandler.h"
#include "pipeline/DaemonIdentifier.h"
#include "pipeline/KextBatteryModel.h"
#include "platform/Backend.h"
#include "platform/Defaults.h"
#include "tools/rcmodel/Tool.h"

namespace kolvrand::rcmodel {

namespace {

constexpr const char* kHelp = R"HELP(usage: rcmodel status

Reports, for the device in use (this host, or the simulated device in the
directory named by KOLVRAND_DEVICE), what the daemon would do, without doing
any of it: the current and the saved boot-session UUID, the battery's chem ID,
the device type and the serial-number suffix, the model file the daemon would
load, whether it exists and decodes, the SHA-1 of the record it would send, the
hash the driver publishes, and a verdict:

  loaded    the daemon uploaded in this boot session and the driver holds
            exactly this model's record
  stale     the daemon has not uploaded in this boot session; its next start will
  mismatch  the driver holds another record than this model's (the model file
            changed since the upload, or the upload was not confirmed)
  missing   there is no model file, or it does not decode, or the daemon would
            refuse it
  unknown   the daemon's settings (as for a user who may not read its state
            directory) or the boot session cannot be read, so whether the
            daemon uploaded in this boot session cannot be told; the report
            says why

Every value read from the device is shown with control characters and bytes
that are no UTF-8 as escapes (\n, \x1b).

Nothing is uploaded and nothing is written. Exit status: 0 when the report was
printed, whatever the verdict; 2 for a wrong command line.
)HELP";

// Keeps the handler's error lines for the report instead of printing them.
class Collect : public LogSink {
 public:
  void write(LogLevel, std::string_view, std::string_view, std::string_view message) override {
    while (!message.empty() && (message.back() == '\n' || message.back() == ' '))
      message.remove_suffix(1);
    std::lock_guard lock(mutex_);
    lines_.emplace_back(message);
  }
  std::vector<std::string> lines() const {
    std::lock_guard lock(mutex_);
    return lines_;
  }

 private:
  mutable std::mutex mutex_;
  std::vector<std::string> lines_;
};

// One line of the report; `value` is shown as visibleText shows it, since it
// comes from the device (a target type, a path, a line the daemon logged).
void line(const char* key, const std::string& value) {
  std::printf("%-20s %s\n", (std::string(key) + ":").c_str(), visibleText(value).c_str());
}

std::string orNone(const std::optional<std::string>& s) {
  return s ? (s->empty() ? "(empty)" : *s) : "(none)";
}

// The hash the driver publishes under KVRVector / KVRBatteryModel / RCParamsHash.
std::optional<Data> publishedHash(BatteryModelDataHandler& handler) {
  std::optional<Dictionary> kvrVector;
  if (!handler.getKVRDebugDict(&kvrVector) || !kvrVector) return std::nullopt;
  const Value* model = kvrVector->find("KVRBatteryModel");
  if (!model || !model->isDictionary()) return std::nullopt;
  const Value* hash = model->asDictionary()->find("RCParamsHash");
  if (!hash || !hash->isData()) return std::nullopt;
  return *hash->asData();
}

int run(const Arguments& a) {
  if (!a.operands.empty()) return usageError(a.command, "status takes no file");
  if (std::optional<std::string> error = platform::deviceSelectionError()) {
    std::fprintf(stderr, "rcmodel: %s\n", error->c_str());
    return kExitFailed;
  }

  auto collect = std::make_shared<Collect>();
  setLogSink(collect);
  setLogLevelSpec("error");

  const char* device = std::getenv("KOLVRAND_DEVICE");
  line("device", device && *device ? std::string("simulated device ") + device : "this host");

  const std::optional<std::string> current = currentBootSessionUUID();
  std::optional<std::string> saved;
  bool thisSession = false;
  // Settings that cannot be read are not settings that are absent: whether
  // the daemon uploaded in this boot session is then unknown.
  std::string unreadable;
  if (auto defaults = NSUserDefaults::openExistingSuiteNamed(DaemonIdentifier, &unreadable)) {
    saved = defaults->stringForKey("savedBootUUID");
    thisSession = current && isSavedBootSession(*defaults, *current);
  }
  line("boot session", current ? *current : "(cannot be read)");
  line("saved boot session", !unreadable.empty()
                                 ? "(cannot be read: " + unreadable + ")"
                                 : orNone(saved) + (thisSession ? " (this boot session)" : ""));

  // A handler without defaults reads the chem ID without storing it.
  auto handler = std::make_shared<BatteryModelDataHandler>();
  handler->setLog(os_log_create(DaemonIdentifier, "batteryModelDataHandling"));
  const uint32_t chemID = handler->getBatteryChemID();
  char chem[48];
  std::snprintf(chem, sizeof chem, "0x%x (%u)", chemID, chemID);
  line("chem ID", chem);
  line("device type", orNone(handler->getDeviceType(chemID)));
  const std::string suffix = handler->getSpecialCaseBatteryModelIdentifier(chemID);
  line("suffix", suffix.empty() ? "(none)" : suffix);

  // The daemon's own first two stages, so that what is said of the file is
  // what the daemon would say; only a file it takes counts as existing.
  const std::optional<std::string> path = handler->getBatteryModelFilePath(chemID);
  const std::optional<std::string> found = handler->getBatteryModelFileURLString(chemID);
  std::shared_ptr<OTAParamRC> model;
  if (found) model = handler->loadProtobufModelWithFileName(found);
  std::error_code ec;
  const bool regular = found && std::filesystem::is_regular_file(*found, ec);
  line("model file", orNone(path));
  line("model file exists", !found ? "no" : regular ? "yes" : "no, not a regular file");
  line("model decodes", !regular ? "-" : model ? "yes" : "no");

  std::unique_ptr<KextBatteryModel> record;
  if (model) record = handler->createKextModelFromProtobufModel(model.get());
  std::optional<SHA1Digest> recordHash;
  if (record) recordHash = sha1(record.get(), sizeof(KextBatteryModel));
  line("record SHA-1", recordHash ? hexString(recordHash->data(), recordHash->size())
                       : model    ? "(refused by the record builder)"
                                  : "-");

  const std::optional<Data> published = publishedHash(*handler);
  line("driver's hash",
       published ? hexString(published->data(), published->size()) : "(none published)");

  const char* verdict = "loaded";
  if (!recordHash)
    verdict = "missing";
  else if (!current || !unreadable.empty())
    verdict = "unknown";
  else if (!thisSession)
    verdict = "stale";
  else if (!published || *published != Data(recordHash->begin(), recordHash->end()))
    verdict = "mismatch";
  line("verdict", verdict);

  // The device type is asked for twice (for the report and for the path), so
  // a failure to read it would show twice.
  std::vector<std::string> lines;
  for (const std::string& l : collect->lines())
    if (std::find(lines.begin(), lines.end(), l) == lines.end()) lines.push_back(l);
  if (!lines.empty()) {
    std::printf("\nthe daemon's code logged:\n");
    for (const std::string& l : lines) std::printf("  %s\n", visibleText(l).c_str());
  }
  std::fflush(stdout);
  setLogSink(nullptr);
  return kExitOK;
}

}  // namespace

const Command kStatus{"status", kHelp, 0, run};

}  // namespace kolvrand::rcmodel
