// SPDX-License-Identifier: MIT
// The resistances of the board's current path between battery and system.
#pragma once

#include "model/FieldAccessors.h"
#include "model/GeneratedMessage.h"

// Has-bits follow the byte-wise order of the property names, not the field
// numbers.
// clang-format off
#define KVR_OTA_BMU_RESISTANCE_FIELDS(SUB, LIST, UINT32, FLOAT, ENUM)                              \
  FLOAT(1, traceResistance25C, TraceResistance25C, "traceResistance25C", 3)                        \
  FLOAT(2, traceResistanceTemperatureCoeff, TraceResistanceTemperatureCoeff,                       \
        "traceResistanceTemperatureCoeff", 4)                                                      \
  FLOAT(3, systemEquivalentResistance, SystemEquivalentResistance,                                 \
        "systemEquivalentResistance", 2)                                                           \
  FLOAT(4, downstreamCommonResistance, DownstreamCommonResistance,                                 \
        "downstreamCommonResistance", 0)                                                           \
  FLOAT(5, downstreamNorthResistance, DownstreamNorthResistance,                                   \
        "downstreamNorthResistance", 1)
// clang-format on

namespace kolvrand {

namespace detail {
KVR_FIELD_SLOTS(OTABMUResistanceSlots, KVR_OTA_BMU_RESISTANCE_FIELDS);
}

// Five optional floats. Per field (shown for traceResistance25C):
// traceResistance25C() (the stored value, whatever its bit),
// setTraceResistance25C(float) (value and bit), setHasTraceResistance25C(bool)
// (bit only), hasTraceResistance25C().
class OTABMUResistance
    : public detail::GeneratedMessage<OTABMUResistance, detail::OTABMUResistanceSlots> {
 public:
  KVR_ACCESSORS(KVR_OTA_BMU_RESISTANCE_FIELDS)

 private:
  friend GeneratedMessage;
  static constexpr const char* kClassName = "OTABMUResistance";
  static const detail::MessageTable& table();
};

}  // namespace kolvrand
