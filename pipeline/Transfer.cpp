// SPDX-License-Identifier: MIT
// The disk-to-kernel transfer: the four stages in order, stopping at the first
// that fails. Each stage's result lives until this method returns.
#include "model/OTAParamRC.h"
#include "pipeline/BatteryModelDataHandler.h"
#include "pipeline/KextBatteryModel.h"

namespace kolvrand {

bool BatteryModelDataHandler::moveBatteryModelDataFromDiskToKext(uint32_t chemID) {
  static constexpr const char* kMethod =
      "-[BatteryModelDataHandler moveBatteryModelDataFromDiskToKext:]";

  std::optional<std::string> path = getBatteryModelFileURLString(chemID);
  if (!path) {
    os_log_error(log_, "%s <Error> file %@ does not exist", kMethod, path);
    return false;
  }
  std::shared_ptr<OTAParamRC> protobufModel = loadProtobufModelWithFileName(path);
  if (!protobufModel) {
    os_log_error(log_, "%s <Error> protobufModel nil", kMethod);
    return false;
  }
  std::unique_ptr<KextBatteryModel> kextModel =
      createKextModelFromProtobufModel(protobufModel.get());
  if (!kextModel) {
    os_log_error(log_, "%s <Error> kextModel nil", kMethod);
    return false;
  }
  if (!setBatteryModelDataToKernel(kextModel.get())) {
    os_log_error(log_, "%s <Error> setBatteryModelDataToKernel failed", kMethod);
    return false;
  }
  return true;
}

}  // namespace kolvrand
