// SPDX-License-Identifier: MIT
#include "model/OTAParamRC.h"

namespace kolvrand {

std::string OTAParamRC::mLBConfigAsString(int32_t value) {
  switch (value) {
    case kKVRRegularMLB:
      return "kKVRRegularMLB";
    case kKVRNorthSouthSplitMLB:
      return "kKVRNorthSouthSplitMLB";
    default:
      return "(unknown: " + std::to_string(value) + ")";
  }
}

int32_t OTAParamRC::StringAsMLBConfig(std::optional<std::string_view> string) {
  return string && *string == "kKVRNorthSouthSplitMLB" ? kKVRNorthSouthSplitMLB : kKVRRegularMLB;
}

KVR_DEFINE_FIELD_TABLE(OTAParamRC, KVR_OTA_PARAM_RC_FIELDS)

}  // namespace kolvrand
