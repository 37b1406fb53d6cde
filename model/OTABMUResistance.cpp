// SPDX-License-Identifier: MIT
#include "model/OTABMUResistance.h"

namespace kolvrand {

KVR_DEFINE_FIELD_TABLE(OTABMUResistance, KVR_OTA_BMU_RESISTANCE_FIELDS)

}  // namespace kolvrand
