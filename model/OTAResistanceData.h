// SPDX-License-Identifier: MIT
// A resistance table of the battery model: values at 25 °C and their
// temperature coefficients.
#pragma once

#include "model/FieldAccessors.h"
#include "model/GeneratedMessage.h"

// clang-format off
#define KVR_OTA_RESISTANCE_DATA_FIELDS(SUB, LIST, UINT32, FLOAT, ENUM)                             \
  LIST(1, resistance25Cs, Resistance25Cs, resistance25C, Resistance25C, "resistance25C")           \
  LIST(2, temperatureCoeffs, TemperatureCoeffs, temperatureCoeff, TemperatureCoeff,                \
       "temperatureCoeff")
// clang-format on

namespace kolvrand {

namespace detail {
KVR_FIELD_SLOTS(OTAResistanceDataSlots, KVR_OTA_RESISTANCE_DATA_FIELDS);
}

// Both lists are written one fixed32 entry per element and read from fixed32
// entries and packed runs mixed freely.
//
// Per list (shown for resistance25Cs): resistance25CsCount(), resistance25Cs()
// (nullptr when empty), clearResistance25Cs(), addResistance25C(float),
// resistance25CAtIndex(size_t) (throws NSRangeException past the end),
// setResistance25Cs(const float*, size_t).
class OTAResistanceData
    : public detail::GeneratedMessage<OTAResistanceData, detail::OTAResistanceDataSlots> {
 public:
  KVR_ACCESSORS(KVR_OTA_RESISTANCE_DATA_FIELDS)

 private:
  friend GeneratedMessage;
  static constexpr const char* kClassName = "OTAResistanceData";
  static const detail::MessageTable& table();
};

}  // namespace kolvrand
