// SPDX-License-Identifier: MIT
// Locating the model file for the battery and decoding its first message.
#include <cstdio>
#include <string_view>

#include "model/OTAParamRC.h"
#include "pipeline/BatteryModelDataHandler.h"
#include "pipeline/PBStreamReader.h"
#include "platform/FileManager.h"

namespace kolvrand {

namespace {

constexpr const char* kFileURLMethod = "-[BatteryModelDataHandler getBatteryModelFileURLString:]";

// A device type is one directory below KVR/BatteryModels. Whoever can set the
// target type must not be able to point the daemon at a file of their
// choosing elsewhere; symlinks that whoever installs models puts inside the
// Library stay theirs to place.
bool isDirectoryName(std::string_view type) {
  return !type.empty() && type != "." && type != ".." &&
         type.find_first_of(std::string_view("/\0", 2)) == std::string_view::npos;
}

}  // namespace

// The first half of getBatteryModelFileURLString, so its lines carry that name.
std::optional<std::string> BatteryModelDataHandler::getBatteryModelFilePath(uint32_t chemID,
                                                                            bool* namesFile) {
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

  char chem[16];
  std::snprintf(chem, sizeof chem, "%x", chemID);
  // Joined as text, never resolved, so a device type that is no directory
  // name shows in the log as it came.
  std::string path = workingDirURL->native();
  if (!path.empty() && path.back() != '/') path += '/';
  path.append("KVR/BatteryModels/").append(*deviceType).append("/");
  path.append(chem).append(suffix).append(".rcmodel");
  if (namesFile) *namesFile = isDirectoryName(*deviceType);
  return path;
}

std::optional<std::string> BatteryModelDataHandler::getBatteryModelFileURLString(uint32_t chemID) {
  static constexpr const char* kMethod = kFileURLMethod;
  bool namesFile = false;
  std::optional<std::string> path = getBatteryModelFilePath(chemID, &namesFile);
  if (!path) return std::nullopt;

  os_log_debug(log_, "%s workingDirURL resource: %@ \n", kMethod, *path);
  if (!namesFile || !NSFileManager::defaultManager().fileExistsAtPath(*path)) {
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
