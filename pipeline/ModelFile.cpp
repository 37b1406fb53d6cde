// Locating the model file for the battery and decoding its first message.
#include <cstdio>

#include "model/OTAParamRC.h"
#include "pipeline/BatteryModelDataHandler.h"
#include "pipeline/PBStreamReader.h"
#include "platform/FileManager.h"

namespace kolvrand {

namespace {
constexpr const char* kFileURLMethod = "-[BatteryModelDataHandler getBatteryModelFileURLString:]";
}

// The first half of getBatteryModelFileURLString, so its lines carry that name.
std::optional<std::string> BatteryModelDataHandler::getBatteryModelFilePath(uint32_t chemID) {
  static constexpr const char* kMethod = kFileURLMethod;
  NSFileManager& fileManager = NSFileManager::defaultManager();

  std::optional<std::string> deviceType = getDeviceType(chemID);
  if (!deviceType) {
    os_log_error(log_, "%s <Error> deviceType nil", kMethod);
    return std::nullopt;
  }
  std::optional<NSURL> workingDirURL =
      fileManager.URLForDirectory(NSLibraryDirectory, NSSystemDomainMask, nullptr, false, nullptr);
  if (!workingDirURL) {
    os_log_error(log_, "%s <Error> workingDirURL nil", kMethod);
    return std::nullopt;
  }
  // Only now, once a device type and a root are known, is the serial number read.
  const std::string suffix = getSpecialCaseBatteryModelIdentifier(chemID);

  char fileName[16];
  std::snprintf(fileName, sizeof fileName, "%x", chemID);
  const std::string name = std::string(fileName) + suffix + ".rcmodel";
  // A device type that is one plain name joins the root as a string, which
  // gives what appending path components gives, without their parsing.
  const std::string& type = *deviceType;
  if (!type.empty() && type.find('/') == std::string::npos && !workingDirURL->empty()) {
    std::string path = workingDirURL->native();
    if (path.back() != '/') path += '/';
    path.append("KVR/BatteryModels/").append(type).append("/").append(name);
    return path;
  }
  const NSURL url = *workingDirURL / "KVR" / "BatteryModels" / type / name;
  return url.string();
}

std::optional<std::string> BatteryModelDataHandler::getBatteryModelFileURLString(uint32_t chemID) {
  static constexpr const char* kMethod = kFileURLMethod;
  std::optional<std::string> path = getBatteryModelFilePath(chemID);
  if (!path) return std::nullopt;

  os_log_debug(log_, "%s workingDirURL resource: %@ \n", kMethod, *path);
  if (!NSFileManager::defaultManager().fileExistsAtPath(*path)) {
    os_log_error(log_, "%s <Error> file not present: %@", kMethod, *path);
    return std::nullopt;
  }
  return path;
}

std::shared_ptr<OTAParamRC> BatteryModelDataHandler::loadProtobufModelWithFileName(
    const std::optional<std::string>& fileName) {
  static constexpr const char* kMethod =
      "-[BatteryModelDataHandler loadProtobufModelWithFileName:]";
  if (!fileName) {
    os_log_error(log_, "%s <Error> fileName nil", kMethod);
    return nullptr;
  }
  NSError error;
  // Further messages in the file are checked but not used, nor kept.
  auto first = PBStreamReader::readFirstProtoBufferOfClass<OTAParamRC>(*fileName, &error);
  if (!first) {
    os_log_error(log_, "%s <Error> readContent error is %@", kMethod, error.localizedDescription);
    return nullptr;
  }
  if (!*first) {
    os_log_error(log_, "%s <Error> protobufModelRCParams nil", kMethod);
    return nullptr;
  }
  return std::move(*first);
}

}  // namespace kolvrand
