// SPDX-License-Identifier: MIT
#include "daemon/ServiceStatus.h"

#include <algorithm>
#include <cstdio>

#include "base/Hex.h"
#include "base/Value.h"

namespace kolvrand {

namespace {

// The driver's published hash, in hex; read back after a verified upload it
// is the record's.
std::string publishedHash(BatteryModelDataHandler* handler) {
  std::optional<Dictionary> vector;
  if (!handler || !handler->getKVRDebugDict(&vector) || !vector) return "(unreadable)";
  const Value* model = vector->find("KVRBatteryModel");
  const Value* hash =
      model && model->isDictionary() ? model->asDictionary()->find("RCParamsHash") : nullptr;
  if (!hash || !hash->isData()) return "(unreadable)";
  return hexString(hash->asData()->data(), hash->asData()->size());
}

}  // namespace

std::string batteryModelStatus(const BatteryModelTaskResult& result,
                               BatteryModelDataHandler* handler,
                               const std::optional<std::string>& firstError) {
  std::string status;
  switch (result.outcome) {
    case BatteryModelTaskResult::Uploaded: {
      char chem[16];
      std::snprintf(chem, sizeof chem, "0x%x", result.chemID);
      status = std::string("uploaded and verified: chem ID ") + chem + ", SHA-1 " +
               publishedHash(handler);
      break;
    }
    case BatteryModelTaskResult::Skipped:
      status = "skipped: already uploaded in this boot";
      break;
    case BatteryModelTaskResult::Failed:
      status = "failed: " + firstError.value_or("Battery data upload failed");
      break;
  }
  // The notify protocol reads one assignment a line.
  std::replace_if(
      status.begin(), status.end(), [](char c) { return c == '\n' || c == '\r'; }, ' ');
  return status;
}

}  // namespace kolvrand
