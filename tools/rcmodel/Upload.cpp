// SPDX-License-Identifier: MIT
// rcmodel upload: the supported "upload now", with the daemon's own code; it
// never touches the daemon's settings.
#include <cstdio>

#include "base/CommonCrypto.h"
#include "base/Hex.h"
#include "model/OTAParamRC.h"
#include "pipeline/KextBatteryModel.h"
#include "platform/Backend.h"
#include "platform/IOKit.h"
#include "tools/rcmodel/DeviceReport.h"
#include "tools/rcmodel/Tool.h"

namespace kolvrand::rcmodel {

namespace {

constexpr const char* kHelp = R"HELP(usage: rcmodel upload [FILE]

Uploads a battery model to the power-management driver now, with the daemon's
own code, and checks the hash the driver then publishes.

  without FILE  the daemon's own transfer: the battery's chem ID, the device
                type, the model file the daemon loads (rcmodel status shows
                which), its record, the upload and its verification
  with FILE     the record of the first message of the model file FILE

It prints each step, the record's SHA-1 and the driver's. The daemon's
settings are not written: the daemon's next start in this boot still skips.
This is the way to load the model again after the power-management driver was
reloaded (which leaves it empty), and to load a model installed or changed
while the system runs.

It needs access to the driver's node: root, or a member of the group that
owns it (kolvrand for /dev/tesvar_kvr). With KOLVRAND_DEVICE=DIR it uploads
to the simulated device in DIR.

Exit status: 0 when the driver's hash matches the record's; 1 when a driver is
missing, access is denied, the model is missing or refused, or the driver
refuses the record or publishes another hash (each said in one line on
stderr, after the daemon's own lines); 2 for a wrong command line.
)HELP";

// Whether the driver's node may be opened as the upload opens it. Only a
// refusal for lack of privilege is answered here; other failures are the
// upload's to report, in the daemon's words.
bool accessDenied() {
  const io_service_t service = IOServiceGetMatchingService(
      kIOMasterPortDefault, IOServiceMatching(kvr_driver::kServiceClass));
  io_connect_t connection = 0;
  const kern_return_t result = IOServiceOpen(service, mach_task_self(), 0, &connection);
  if (result == KERN_SUCCESS) IOServiceClose(connection);
  return result == kIOReturnNotPrivileged;
}

int refuse(const Arguments& a, const std::string& why) {
  error(a.command, why);
  return kExitFailed;
}

int run(const Arguments& a) {
  if (a.operands.size() > 1) return usageError(a.command, "give at most one model file");
  if (std::optional<std::string> error = platform::deviceSelectionError()) return refuse(a, *error);
  routeLogToStderr(a.command);
  const bool fromFile = !a.operands.empty();
  const std::shared_ptr<BatteryModelDataHandler> handler = handlerWithoutSettings();
  reportLine("device", deviceName());

  // A given file is read and checked before any driver is touched.
  std::unique_ptr<KextBatteryModel> record;
  if (fromFile) {
    const std::string& path = a.operands.front();
    std::shared_ptr<OTAParamRC> model = readFirstModel(a.command, path);
    if (!model) return kExitFailed;
    record = handler->createKextModelFromProtobufModel(model.get());
    if (!record)
      return refuse(a, path +
                           ": the daemon would refuse this model (see above); rcmodel "
                           "validate " +
                           path + " lists every list against the record");
    reportLine("model file", path);
  }

  // What is wrong with the device first, each in one line.
  if (!powerDriverFound())
    return refuse(a,
                  "the power-management driver is not loaded: no device stands for "
                  "TesvarKVR (the reference driver: modprobe tesvar_kvr)");
  if (!fromFile && !batteryDriverFound())
    return refuse(a,
                  "the battery driver is not loaded: no power supply stands for "
                  "TesvarSmartBattery, so there is no chem ID to choose the model by (the "
                  "reference driver: modprobe tesvar_smart_battery); or give a model FILE");
  if (accessDenied()) return refuse(a, kNoAccess);

  uint32_t chemID = 0;
  if (!fromFile) {
    chemID = handler->getBatteryChemID();
    reportLine("chem ID", chemIDText(*handler, chemID));
    const std::optional<std::string> type = handler->getDeviceType(chemID);
    reportLine("device type", type ? *type : "(none)");
    const std::optional<std::string> path = handler->getBatteryModelFileURLString(chemID);
    if (!path) {
      const std::optional<std::string> where = handler->getBatteryModelFilePath(chemID);
      return refuse(a, where ? "no model file for this battery: install it as " + *where
                             : std::string("no model file for this battery (see above)"));
    }
    reportLine("model file", *path);
    std::shared_ptr<OTAParamRC> model = handler->loadProtobufModelWithFileName(path);
    if (!model)
      return refuse(a, *path + ": the daemon cannot load this file (see above); rcmodel decode " +
                           *path + " shows what it holds");
    record = handler->createKextModelFromProtobufModel(model.get());
    if (!record)
      return refuse(a, *path +
                           ": the daemon would refuse this model (see above); rcmodel "
                           "validate " +
                           *path + " lists every list against the record");
  }

  const SHA1Digest digest = sha1(record.get(), sizeof(KextBatteryModel));
  reportLine("record SHA-1", hexString(digest.data(), digest.size()));
  std::fflush(stdout);
  // Without a file, the daemon's transfer itself: it finds, loads and builds
  // the same record again and sends and verifies it.
  const bool verified = fromFile ? handler->setBatteryModelDataToKernel(record.get())
                                 : handler->moveBatteryModelDataFromDiskToKext(chemID);
  const std::optional<Data> published = publishedHash(*handler);
  reportLine("driver's hash",
             published ? hexString(published->data(), published->size()) : "(none published)");
  const bool matches = published && *published == Data(digest.begin(), digest.end());
  reportLine("result", verified && matches ? "uploaded and verified" : "failed");
  std::fflush(stdout);
  if (!verified || !matches) return refuse(a, "the driver does not hold this record (see above)");
  return kExitOK;
}

}  // namespace

const Command kUpload{"upload", kHelp, 0, run};

}  // namespace kolvrand::rcmodel
