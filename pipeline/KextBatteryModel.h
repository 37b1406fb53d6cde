// The battery model as the kernel driver takes it: one flat little-endian
// record of 29056 bytes, with no header, no padding and no gaps, so every byte
// is written when it is built.
#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>

namespace kolvrand {

static_assert(std::endian::native == std::endian::little,
              "the driver reads the record in little-endian order");

// The image of one resistance table.
struct KextResistanceTable {
  static constexpr size_t kResistance25CCount = 51;
  static constexpr size_t kTemperatureCoeffCount = 153;
  float resistance25C[kResistance25CCount];
  float temperatureCoeff[kTemperatureCoeffCount];
};

// The image of the board-path resistances, in field-number order.
struct KextBMUResistance {
  float traceResistance25C;
  float traceResistanceTemperatureCoeff;
  float systemEquivalentResistance;
  float downstreamCommonResistance;
  float downstreamNorthResistance;
};

struct KextBatteryModel {
  static constexpr size_t kAgingCoeffCount = 102;
  static constexpr size_t kAgingTemperatureCoeffCount = 306;
  static constexpr size_t kBaselineRdcCount = 15;
  static constexpr size_t kGridOCVCount = 303;
  static constexpr size_t kSlopeCount = 51;

  uint32_t chemID;
  KextResistanceTable r0, r1, r2, r3;
  KextResistanceTable rCFreq1, rCFreq2, rCFreq3, rCFreq4;
  KextResistanceTable baselineR0, baselineR1, baselineR2, baselineR3, baselineR4;
  KextResistanceTable baselineRCFreq1, baselineRCFreq2, baselineRCFreq3, baselineRCFreq4;
  KextBMUResistance bmuResistance;
  float agingCoeffForR0[kAgingCoeffCount];
  float agingCoeffForR1[kAgingCoeffCount];
  float agingCoeffForR2[kAgingCoeffCount];
  float agingCoeffForR3[kAgingCoeffCount];
  float agingCoeffForR0TemperatureCoeff[kAgingTemperatureCoeffCount];
  float agingCoeffForR1TemperatureCoeff[kAgingTemperatureCoeffCount];
  float agingCoeffForR2TemperatureCoeff[kAgingTemperatureCoeffCount];
  float agingCoeffForR3TemperatureCoeff[kAgingTemperatureCoeffCount];
  float agingCoeffForRCFreq1[kAgingCoeffCount];
  float agingCoeffForRCFreq2[kAgingCoeffCount];
  float agingCoeffForRCFreq3[kAgingCoeffCount];
  float agingCoeffForRCFreq4[kAgingCoeffCount];
  float agingCoeffForRCFreq1TemperatureCoeff[kAgingTemperatureCoeffCount];
  float agingCoeffForRCFreq2TemperatureCoeff[kAgingTemperatureCoeffCount];
  float agingCoeffForRCFreq3TemperatureCoeff[kAgingTemperatureCoeffCount];
  float agingCoeffForRCFreq4TemperatureCoeff[kAgingTemperatureCoeffCount];
  float baselineRdc[kBaselineRdcCount];
  float baselineWRdc;
  float gridOCV[kGridOCVCount];
  float slopeForR0Extrap[kSlopeCount];
  float slopeForR1Extrap[kSlopeCount];
  float slopeForR2Extrap[kSlopeCount];
  float slopeForR3Extrap[kSlopeCount];
  float maxRdcRatio;
  float maxRdcRatioR2Extrap;
  int32_t mLBConfig;
};

inline constexpr size_t kKextBatteryModelSize = 29056;

static_assert(sizeof(KextResistanceTable) == 816);
static_assert(sizeof(KextBMUResistance) == 20);
static_assert(sizeof(KextBatteryModel) == kKextBatteryModelSize);
static_assert(offsetof(KextBatteryModel, r0) == 0x0004);
static_assert(offsetof(KextBatteryModel, r1) == 0x0334);
static_assert(offsetof(KextBatteryModel, r2) == 0x0664);
static_assert(offsetof(KextBatteryModel, r3) == 0x0994);
static_assert(offsetof(KextBatteryModel, rCFreq1) == 0x0CC4);
static_assert(offsetof(KextBatteryModel, rCFreq4) == 0x1654);
static_assert(offsetof(KextBatteryModel, baselineR0) == 0x1984);
static_assert(offsetof(KextBatteryModel, baselineR4) == 0x2644);
static_assert(offsetof(KextBatteryModel, baselineRCFreq1) == 0x2974);
static_assert(offsetof(KextBatteryModel, baselineRCFreq4) == 0x3304);
static_assert(offsetof(KextBatteryModel, bmuResistance) == 0x3634);
static_assert(offsetof(KextBatteryModel, agingCoeffForR0) == 0x3648);
static_assert(offsetof(KextBatteryModel, agingCoeffForR3) == 0x3B10);
static_assert(offsetof(KextBatteryModel, agingCoeffForR0TemperatureCoeff) == 0x3CA8);
static_assert(offsetof(KextBatteryModel, agingCoeffForR3TemperatureCoeff) == 0x4B00);
static_assert(offsetof(KextBatteryModel, agingCoeffForRCFreq1) == 0x4FC8);
static_assert(offsetof(KextBatteryModel, agingCoeffForRCFreq4) == 0x5490);
static_assert(offsetof(KextBatteryModel, agingCoeffForRCFreq1TemperatureCoeff) == 0x5628);
static_assert(offsetof(KextBatteryModel, agingCoeffForRCFreq4TemperatureCoeff) == 0x6480);
static_assert(offsetof(KextBatteryModel, baselineRdc) == 0x6948);
static_assert(offsetof(KextBatteryModel, baselineWRdc) == 0x6984);
static_assert(offsetof(KextBatteryModel, gridOCV) == 0x6988);
static_assert(offsetof(KextBatteryModel, slopeForR0Extrap) == 0x6E44);
static_assert(offsetof(KextBatteryModel, slopeForR3Extrap) == 0x70A8);
static_assert(offsetof(KextBatteryModel, maxRdcRatio) == 0x7174);
static_assert(offsetof(KextBatteryModel, maxRdcRatioR2Extrap) == 0x7178);
static_assert(offsetof(KextBatteryModel, mLBConfig) == 0x717C);

}  // namespace kolvrand
