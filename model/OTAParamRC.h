// SPDX-License-Identifier: MIT
// The battery model: the root message of a model file.
#pragma once

#include <cstdint>

#include "model/FieldAccessors.h"
#include "model/GeneratedMessage.h"
#include "model/OTABMUResistance.h"
#include "model/OTAResistanceData.h"

// Field 17 is the only OTABMUResistance; chemID is always present and always
// written; has-bits follow the byte-wise order of the property names
// (baselineWRdc, mLBConfig, maxRdcRatio, maxRdcRatioR2Extrap).
// clang-format off
#define KVR_OTA_PARAM_RC_FIELDS(SUB, LIST, UINT32, FLOAT, ENUM)                                    \
  SUB(1, r0, R0, "R0", OTAResistanceData)                                                          \
  SUB(2, r1, R1, "R1", OTAResistanceData)                                                          \
  SUB(3, baselineR1, BaselineR1, "baselineR1", OTAResistanceData)                                  \
  SUB(4, r2, R2, "R2", OTAResistanceData)                                                          \
  SUB(5, baselineR2, BaselineR2, "baselineR2", OTAResistanceData)                                  \
  SUB(6, rCFreq1, RCFreq1, "RCFreq1", OTAResistanceData)                                           \
  SUB(7, rCFreq2, RCFreq2, "RCFreq2", OTAResistanceData)                                           \
  SUB(8, rCFreq3, RCFreq3, "RCFreq3", OTAResistanceData)                                           \
  LIST(9, agingCoeffForR0s, AgingCoeffForR0s, agingCoeffForR0, AgingCoeffForR0,                    \
       "agingCoeffForR0")                                                                          \
  LIST(10, agingCoeffForR0TemperatureCoeffs, AgingCoeffForR0TemperatureCoeffs,                     \
       agingCoeffForR0TemperatureCoeff, AgingCoeffForR0TemperatureCoeff,                           \
       "agingCoeffForR0TemperatureCoeff")                                                          \
  LIST(11, agingCoeffForR1s, AgingCoeffForR1s, agingCoeffForR1, AgingCoeffForR1,                   \
       "agingCoeffForR1")                                                                          \
  LIST(12, agingCoeffForR1TemperatureCoeffs, AgingCoeffForR1TemperatureCoeffs,                     \
       agingCoeffForR1TemperatureCoeff, AgingCoeffForR1TemperatureCoeff,                           \
       "agingCoeffForR1TemperatureCoeff")                                                          \
  LIST(13, agingCoeffForR2s, AgingCoeffForR2s, agingCoeffForR2, AgingCoeffForR2,                   \
       "agingCoeffForR2")                                                                          \
  LIST(14, agingCoeffForR2TemperatureCoeffs, AgingCoeffForR2TemperatureCoeffs,                     \
       agingCoeffForR2TemperatureCoeff, AgingCoeffForR2TemperatureCoeff,                           \
       "agingCoeffForR2TemperatureCoeff")                                                          \
  LIST(15, baselineRdcs, BaselineRdcs, baselineRdc, BaselineRdc, "baselineRdc")                    \
  SUB(16, baselineR0, BaselineR0, "baselineR0", OTAResistanceData)                                 \
  SUB(17, bmuResistance, BmuResistance, "bmuResistance", OTABMUResistance)                         \
  UINT32(18, chemID, ChemID, "chemID")                                                             \
  LIST(19, gridOCVs, GridOCVs, gridOCV, GridOCV, "gridOCV")                                        \
  SUB(20, baselineR3, BaselineR3, "baselineR3", OTAResistanceData)                                 \
  FLOAT(21, maxRdcRatio, MaxRdcRatio, "maxRdcRatio", 2)                                            \
  FLOAT(22, maxRdcRatioR2Extrap, MaxRdcRatioR2Extrap, "maxRdcRatioR2Extrap", 3)                    \
  FLOAT(23, baselineWRdc, BaselineWRdc, "baselineWRdc", 0)                                         \
  LIST(24, slopeForR0Extraps, SlopeForR0Extraps, slopeForR0Extrap, SlopeForR0Extrap,               \
       "slopeForR0Extrap")                                                                         \
  LIST(25, slopeForR1Extraps, SlopeForR1Extraps, slopeForR1Extrap, SlopeForR1Extrap,               \
       "slopeForR1Extrap")                                                                         \
  LIST(26, slopeForR2Extraps, SlopeForR2Extraps, slopeForR2Extrap, SlopeForR2Extrap,               \
       "slopeForR2Extrap")                                                                         \
  LIST(27, slopeForR3Extraps, SlopeForR3Extraps, slopeForR3Extrap, SlopeForR3Extrap,               \
       "slopeForR3Extrap")                                                                         \
  SUB(28, r3, R3, "R3", OTAResistanceData)                                                         \
  SUB(29, rCFreq4, RCFreq4, "RCFreq4", OTAResistanceData)                                          \
  SUB(30, baselineR4, BaselineR4, "baselineR4", OTAResistanceData)                                 \
  SUB(31, baselineRCFreq1, BaselineRCFreq1, "baselineRCFreq1", OTAResistanceData)                  \
  SUB(32, baselineRCFreq2, BaselineRCFreq2, "baselineRCFreq2", OTAResistanceData)                  \
  SUB(33, baselineRCFreq3, BaselineRCFreq3, "baselineRCFreq3", OTAResistanceData)                  \
  SUB(34, baselineRCFreq4, BaselineRCFreq4, "baselineRCFreq4", OTAResistanceData)                  \
  LIST(35, agingCoeffForR3s, AgingCoeffForR3s, agingCoeffForR3, AgingCoeffForR3,                   \
       "agingCoeffForR3")                                                                          \
  LIST(36, agingCoeffForR3TemperatureCoeffs, AgingCoeffForR3TemperatureCoeffs,                     \
       agingCoeffForR3TemperatureCoeff, AgingCoeffForR3TemperatureCoeff,                           \
       "agingCoeffForR3TemperatureCoeff")                                                          \
  LIST(37, agingCoeffForRCFreq1s, AgingCoeffForRCFreq1s, agingCoeffForRCFreq1,                     \
       AgingCoeffForRCFreq1, "agingCoeffForRCFreq1")                                               \
  LIST(38, agingCoeffForRCFreq2s, AgingCoeffForRCFreq2s, agingCoeffForRCFreq2,                     \
       AgingCoeffForRCFreq2, "agingCoeffForRCFreq2")                                               \
  LIST(39, agingCoeffForRCFreq3s, AgingCoeffForRCFreq3s, agingCoeffForRCFreq3,                     \
       AgingCoeffForRCFreq3, "agingCoeffForRCFreq3")                                               \
  LIST(40, agingCoeffForRCFreq4s, AgingCoeffForRCFreq4s, agingCoeffForRCFreq4,                     \
       AgingCoeffForRCFreq4, "agingCoeffForRCFreq4")                                               \
  LIST(41, agingCoeffForRCFreq1TemperatureCoeffs, AgingCoeffForRCFreq1TemperatureCoeffs,           \
       agingCoeffForRCFreq1TemperatureCoeff, AgingCoeffForRCFreq1TemperatureCoeff,                 \
       "agingCoeffForRCFreq1TemperatureCoeff")                                                     \
  LIST(42, agingCoeffForRCFreq2TemperatureCoeffs, AgingCoeffForRCFreq2TemperatureCoeffs,           \
       agingCoeffForRCFreq2TemperatureCoeff, AgingCoeffForRCFreq2TemperatureCoeff,                 \
       "agingCoeffForRCFreq2TemperatureCoeff")                                                     \
  LIST(43, agingCoeffForRCFreq3TemperatureCoeffs, AgingCoeffForRCFreq3TemperatureCoeffs,           \
       agingCoeffForRCFreq3TemperatureCoeff, AgingCoeffForRCFreq3TemperatureCoeff,                 \
       "agingCoeffForRCFreq3TemperatureCoeff")                                                     \
  LIST(44, agingCoeffForRCFreq4TemperatureCoeffs, AgingCoeffForRCFreq4TemperatureCoeffs,           \
       agingCoeffForRCFreq4TemperatureCoeff, AgingCoeffForRCFreq4TemperatureCoeff,                 \
       "agingCoeffForRCFreq4TemperatureCoeff")                                                     \
  ENUM(45, mLBConfig, MLBConfig, "MLBConfig", 1)
// clang-format on

namespace kolvrand {

// The board configuration a model was made for. The field holds any 32-bit
// value; only these two have names.
enum MLBConfig : int32_t {
  kKVRRegularMLB = 0,
  kKVRNorthSouthSplitMLB = 1,
};

namespace detail {
KVR_FIELD_SLOTS(OTAParamRCSlots, KVR_OTA_PARAM_RC_FIELDS);
}

// Accessors by kind (the field list above names them all):
// - sub-message r0: r0() (nullptr when absent), setR0(shared_ptr), hasR0().
// - repeated float gridOCVs: gridOCVsCount(), gridOCVs() (nullptr when
//   empty), clearGridOCVs(), addGridOCV(float), gridOCVAtIndex(size_t) (throws
//   NSRangeException past the end), setGridOCVs(const float*, size_t).
// - chemID(), setChemID(uint32_t); no presence.
// - optional float maxRdcRatio: maxRdcRatio() (the stored value, whatever its
//   bit), setMaxRdcRatio(float), setHasMaxRdcRatio(bool), hasMaxRdcRatio().
// - mLBConfig() (0 while hasMLBConfig() is false), setMLBConfig(int32_t),
//   setHasMLBConfig(bool), hasMLBConfig(), and the static
//   mLBConfigAsString(int32_t) and StringAsMLBConfig(optional<string_view>).
class OTAParamRC : public detail::GeneratedMessage<OTAParamRC, detail::OTAParamRCSlots> {
 public:
  KVR_ACCESSORS(KVR_OTA_PARAM_RC_FIELDS)

 private:
  friend GeneratedMessage;
  static constexpr const char* kClassName = "OTAParamRC";
  static const detail::MessageTable& table();
};

}  // namespace kolvrand
