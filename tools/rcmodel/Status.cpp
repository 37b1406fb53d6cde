// SPDX-License-Identifier: MIT
// rcmodel status: what is wrong with the device, what the daemon on it would
// load and whether the driver holds it. Read-only: it reads what the daemon
// reads, through the daemon's own code, and never uploads or writes a setting.
#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <mutex>

#include "base/CommonCrypto.h"
#include "base/Utf8.h"
#include "model/OTAParamRC.h"
#include "pipeline/BatteryModelDataHandler.h"
#include "pipeline/BootSession.h"
#include "pipeline/DaemonIdentifier.h"
#include "pipeline/KextBatteryModel.h"
#include "platform/Backend.h"
#include "platform/Defaults.h"
#include "tools/rcmodel/DeviceReport.h"
#include "tools/rcmodel/Tool.h"

namespace kolvrand::rcmodel {

namespace {

constexpr const char* kHelp = R"HELP(usage: rcmodel status

Reports, for the device in use (this host, or the simulated device in the
directory named by KOLVRAND_DEVICE), what the daemon would do, without doing
any of it. First what is wrong with the device: whether the battery driver and
the power-management driver are there and whether the latter holds a record.
Then the current and the saved boot-session UUID, the battery's chem ID (and
the one the battery reports, when the daemon reads it as another), the device
type and the serial-number suffix, the model file the daemon would load,
whether it exists and decodes, the SHA-1 of the record it would send, the hash
the driver publishes, a verdict and, where something would help, the next step:

  loaded     the daemon uploaded in this boot session and the driver holds
             exactly this model's record
  no driver  the battery driver or the power-management driver is not loaded
  missing    there is no model file, or it does not decode, or the daemon would
             refuse it
  empty      the driver holds no record (it was loaded or reloaded after the
             daemon's upload, or the daemon has not uploaded yet)
  unknown    the daemon's settings (as for a user who may not read its state
             directory) or the boot session cannot be read, so whether the
             daemon uploaded in this boot session cannot be told; the report
             says why
  stale      the daemon has not uploaded in this boot session
  mismatch   the driver holds another record than this model's (the model
             file changed since the upload, or the upload was not confirmed)

`rcmodel upload` loads the model into the driver now, for empty, stale and
mismatch alike.

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

std::string orNone(const std::optional<std::string>& s) {
  return s ? (s->empty() ? "(empty)" : *s) : "(none)";
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
  const auto line = reportLine;

  // What is wrong with the device comes first: without a driver, what
  // follows (a chem ID of 0, a model path made from it) is only what the
  // daemon would make of its absence.
  line("device", deviceName());
  const std::shared_ptr<BatteryModelDataHandler> handler = handlerWithoutSettings();
  const bool battery = batteryDriverFound(), power = powerDriverFound();
  const std::optional<Data> published = power ? publishedHash(*handler) : std::nullopt;
  line("battery driver",
       battery ? "found" : "not found: no power supply stands for TesvarSmartBattery");
  line("power-management driver", !power      ? "not found: no device stands for TesvarKVR"
                                  : published ? "found, holds a record"
                                              : "found, holds no record");

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

  const uint32_t chemID = handler->getBatteryChemID();
  line("chem ID", battery ? chemIDText(*handler, chemID)
                          : "(none: no battery driver; the daemon would use 0)");
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
  line("model file", orNone(path) + (battery ? "" : " (from chem ID 0: no battery driver)"));
  line("model file exists", !found ? "no" : regular ? "yes" : "no, not a regular file");
  line("model decodes", !regular ? "-" : model ? "yes" : "no");

  std::unique_ptr<KextBatteryModel> record;
  if (model) record = handler->createKextModelFromProtobufModel(model.get());
  std::optional<SHA1Digest> recordHash;
  if (record) recordHash = sha1(record.get(), sizeof(KextBatteryModel));
  line("record SHA-1", recordHash ? hexString(recordHash->data(), recordHash->size())
                       : model    ? "(refused by the record builder)"
                                  : "-");
  line("driver's hash",
       published ? hexString(published->data(), published->size()) : "(none published)");

  const bool holdsIt =
      recordHash && published && *published == Data(recordHash->begin(), recordHash->end());
  const char* verdict = "loaded";
  std::string next = "rcmodel upload";
  if (!battery || !power) {
    verdict = "no driver";
    next = !battery ? "load the battery driver (the reference one: modprobe tesvar_smart_battery)"
                    : "load the power-management driver (the reference one: modprobe tesvar_kvr)";
  } else if (!recordHash) {
    verdict = "missing";
    next = !found && path ? "install the model as " + *path + ", then rcmodel upload"
           : found        ? "rcmodel validate " + *found + " says why the daemon refuses it"
                          : "";
  } else if (!published) {
    verdict = "empty";
  } else if (!current || !unreadable.empty()) {
    verdict = "unknown";
    if (holdsIt) next.clear();
  } else if (!thisSession) {
    verdict = "stale";
  } else if (!holdsIt) {
    verdict = "mismatch";
  } else {
    next.clear();
  }
  line("verdict", verdict);
  if (!next.empty()) line("next step", next);

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
