// SPDX-License-Identifier: MIT
// The process-wide object that carries the battery-model pipeline: battery
// identity, device type, model file, kernel record, upload and verification.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "base/Value.h"
#include "pipeline/DaemonAgent.h"

namespace kolvrand {

class OTAParamRC;
struct KextBatteryModel;

class BatteryModelDataHandler : public DaemonAgent<BatteryModelDataHandler> {
 public:
  // A handler with its own defaults and its "batteryModelDataHandling" log.
  static std::shared_ptr<BatteryModelDataHandler> init() {
    return make("batteryModelDataHandling");
  }

  // Battery identity, from the battery driver's "BatteryData".
  int32_t getIntValueForKeyFromBatteryData(const char* key);
  uint32_t getBatteryChemID();
  std::string getSpecialCaseBatteryModelIdentifier(uint32_t chemID);

  // Device type and model file.
  std::optional<std::string> getDeviceType(uint32_t chemID);
  std::optional<std::string> getBatteryModelFileURLString(uint32_t chemID);
  // Where getBatteryModelFileURLString looks, whether or not a file is there;
  // nil (logged under that method's name) without a device type or Library.
  // *namesFile is false when the device type is no directory name ("", ".",
  // "..", or with a "/" or a NUL), so that the path names no model file.
  std::optional<std::string> getBatteryModelFilePath(uint32_t chemID, bool* namesFile = nullptr);
  std::shared_ptr<OTAParamRC> loadProtobufModelWithFileName(
      const std::optional<std::string>& fileName);

  // The kernel record, its upload and verification.
  std::unique_ptr<KextBatteryModel> createKextModelFromProtobufModel(
      const OTAParamRC* protobufModel);
  bool moveBatteryModelDataFromDiskToKext(uint32_t chemID);
  bool setBatteryModelDataToKernel(const KextBatteryModel* kextModel);
  // Stores an owned copy of the driver's "KVRVector" dictionary in *dict.
  bool getKVRDebugDict(std::optional<Dictionary>* dict);
  bool verifyHashData(const uint8_t* sentHash);
};

}  // namespace kolvrand
