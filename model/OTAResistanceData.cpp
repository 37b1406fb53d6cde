// SPDX-License-Identifier: MIT
#include "model/OTAResistanceData.h"

namespace kolvrand {

KVR_DEFINE_FIELD_TABLE(OTAResistanceData, KVR_OTA_RESISTANCE_DATA_FIELDS)

}  // namespace kolvrand
