// SPDX-License-Identifier: MIT
// The handler's shell and the battery's identity: chem ID and the serial-number
// suffix, read afresh from the battery driver's "BatteryData" at every call.
#include <array>
#include <cstring>

#include "pipeline/BatteryModelDataHandler.h"
#include "pipeline/DaemonIdentifier.h"
#include "platform/Dispatch.h"
#include "platform/IOKit.h"

namespace kolvrand {

namespace {

constexpr uint32_t kChemIDReplacedOnRead = 6439;
constexpr uint32_t kChemIDReplacement = 8552;
constexpr uint32_t kChemIDWithSerialSuffix = 5640;

// The battery driver's "BatteryData" dictionary, or nullopt after logging
// which step failed. A property of another type counts as absent.
std::optional<Dictionary> copyBatteryData(const os_log_t& log, const char* method) {
  io_service_t service =
      IOServiceGetMatchingService(kIOMasterPortDefault, IOServiceMatching("TesvarSmartBattery"));
  if (!service) {
    os_log_error(log, "%s <Error> powerService null", method);
    return std::nullopt;
  }
  std::optional<Value> data = IORegistryEntryCreateCFProperty(service, "BatteryData");
  if (!data || !data->isDictionary()) {
    os_log_error(log, "%s <Error> batteryData null", method);
    return std::nullopt;
  }
  return std::move(*data->asDictionary());
}

}  // namespace

int32_t BatteryModelDataHandler::getIntValueForKeyFromBatteryData(const char* key) {
  static constexpr const char* kMethod =
      "-[BatteryModelDataHandler getIntValueForKeyFromBatteryData:]";
  if (!key) {
    os_log_error(log_, "%s <Error> key null", kMethod);
    return 0;
  }
  std::optional<Dictionary> batteryData = copyBatteryData(log_, kMethod);
  if (!batteryData) return 0;
  // The driver publishes numbers here; anything else is as good as absent.
  const Value* value = batteryData->find(key);
  if (!value || !value->isNumber()) {
    os_log_error(log_, "%s <Error> valueCF null", kMethod);
    return 0;
  }
  return value->asNumber()->int32Value();
}

uint32_t BatteryModelDataHandler::getBatteryChemID() {
  uint32_t chemID = static_cast<uint32_t>(getIntValueForKeyFromBatteryData("AlgoChemID"));
  if (chemID == kChemIDReplacedOnRead) chemID = kChemIDReplacement;
  if (defaults_) defaults_->setInteger(chemID, "savedChemID");
  return chemID;
}

std::string BatteryModelDataHandler::getSpecialCaseBatteryModelIdentifier(uint32_t chemID) {
  static constexpr const char* kMethod =
      "-[BatteryModelDataHandler getSpecialCaseBatteryModelIdentifier:]";
  if (chemID != kChemIDWithSerialSuffix) return "";

  // The serial number as a NUL-terminated string in 18 bytes. One that does
  // not fit leaves the buffer zeroed, so it reads as "a" like any serial
  // number without an '8' at index 15.
  std::array<char, 18> serial{};
  std::optional<Dictionary> batteryData = copyBatteryData(log_, kMethod);
  if (!batteryData) return "";
  const Value* value = batteryData->find("BatterySerialNumber");
  if (!value || !value->isString()) {
    os_log_error(log_, "%s <Error> valueCF null", kMethod);
    return "";
  }
  const std::string& text = *value->asString();
  if (text.size() < serial.size()) std::memcpy(serial.data(), text.data(), text.size());
  return serial[15] == '8' ? "b" : "a";
}

}  // namespace kolvrand
