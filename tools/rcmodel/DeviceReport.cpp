// SPDX-License-Identifier: MIT
#include "tools/rcmodel/DeviceReport.h"

#include <cstdio>
#include <cstdlib>

#include "base/Utf8.h"
#include "pipeline/DaemonIdentifier.h"
#include "platform/IOKit.h"
#include "platform/Log.h"

namespace kolvrand::rcmodel {

std::string deviceName() {
  const char* device = std::getenv("KOLVRAND_DEVICE");
  return device && *device ? std::string("simulated device ") + device : "this host";
}

std::shared_ptr<BatteryModelDataHandler> handlerWithoutSettings() {
  auto handler = std::make_shared<BatteryModelDataHandler>();
  handler->setLog(os_log_create(DaemonIdentifier, "batteryModelDataHandling"));
  return handler;
}

namespace {
bool serviceFound(const char* className) {
  return IOServiceGetMatchingService(kIOMasterPortDefault, IOServiceMatching(className)) != 0;
}
}  // namespace

bool batteryDriverFound() {
  return serviceFound("TesvarSmartBattery");
}

bool powerDriverFound() {
  return serviceFound(kvr_driver::kServiceClass);
}

std::string chemIDText(BatteryModelDataHandler& handler, uint32_t chemID) {
  char text[96];
  std::snprintf(text, sizeof text, "0x%x (%u)", chemID, chemID);
  std::string result = text;
  // The same registry read the daemon's chem-ID read starts with, made again
  // without its replacement of one ID by another.
  const auto reported =
      static_cast<uint32_t>(handler.getIntValueForKeyFromBatteryData("AlgoChemID"));
  if (reported != chemID) {
    std::snprintf(text, sizeof text, ", the battery reports 0x%x (%u)", reported, reported);
    result += text;
  }
  return result;
}

std::optional<Data> publishedHash(BatteryModelDataHandler& handler) {
  std::optional<Dictionary> kvrVector;
  if (!handler.getKVRDebugDict(&kvrVector) || !kvrVector) return std::nullopt;
  const Value* model = kvrVector->find(kvr_driver::kBatteryModelKey);
  if (!model || !model->isDictionary()) return std::nullopt;
  const Value* hash = model->asDictionary()->find(kvr_driver::kParamsHashKey);
  if (!hash || !hash->isData()) return std::nullopt;
  return *hash->asData();
}

void reportLine(const char* key, const std::string& value) {
  std::printf("%-20s %s\n", (std::string(key) + ":").c_str(), visibleText(value).c_str());
}

}  // namespace kolvrand::rcmodel
