// SPDX-License-Identifier: MIT
// The battery model as the kernel driver takes it: one flat little-endian
// record of 29056 bytes, with no header, no padding and no gaps, so every byte
// is written when it is built.
#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>

namespace kolvrand {

// A 32-bit value held as its four little-endian bytes, whatever the host's
// byte order: the driver reads the record little-endian, so a record built on
// a big-endian host is still the same bytes. Byte-aligned, so the record has
// no padding and no field access is unaligned on any target.
template <typename T>
class LittleEndian32 {
  static_assert(sizeof(T) == 4);

 public:
  LittleEndian32() = default;  // not zeroed: the builder writes every byte
  LittleEndian32(T value) { *this = value; }
  LittleEndian32& operator=(T value) {
    const auto bits = std::bit_cast<uint32_t>(value);
    for (size_t i = 0; i < 4; ++i) bytes_[i] = static_cast<uint8_t>(bits >> (8 * i));
    return *this;
  }
  operator T() const {
    uint32_t bits = 0;
    for (size_t i = 0; i < 4; ++i) bits |= uint32_t{bytes_[i]} << (8 * i);
    return std::bit_cast<T>(bits);
  }

 private:
  uint8_t bytes_[4];
};

using LEFloat = LittleEndian32<float>;

// The image of one resistance table.
struct KextResistanceTable {
  static constexpr size_t kResistance25CCount = 51;
  static constexpr size_t kTemperatureCoeffCount = 153;
  LEFloat resistance25C[kResistance25CCount];
  LEFloat temperatureCoeff[kTemperatureCoeffCount];
};

// The image of the board-path resistances, in field-number order.
struct KextBMUResistance {
  LEFloat traceResistance25C;
  LEFloat traceResistanceTemperatureCoeff;
  LEFloat systemEquivalentResistance;
  LEFloat downstreamCommonResistance;
  LEFloat downstreamNorthResistance;
};

struct KextBatteryModel {
  static constexpr size_t kAgingCoeffCount = 102;
  static constexpr size_t kAgingTemperatureCoeffCount = 306;
  static constexpr size_t kBaselineRdcCount = 15;
  static constexpr size_t kGridOCVCount = 303;
  static constexpr size_t kSlopeCount = 51;

  LittleEndian32<uint32_t> chemID;
  KextResistanceTable r0, r1, r2, r3;
  KextResistanceTable rCFreq1, rCFreq2, rCFreq3, rCFreq4;
  KextResistanceTable baselineR0, baselineR1, baselineR2, baselineR3, baselineR4;
  KextResistanceTable baselineRCFreq1, baselineRCFreq2, baselineRCFreq3, baselineRCFreq4;
  KextBMUResistance bmuResistance;
  LEFloat agingCoeffForR0[kAgingCoeffCount];
  LEFloat agingCoeffForR1[kAgingCoeffCount];
  LEFloat agingCoeffForR2[kAgingCoeffCount];
  LEFloat agingCoeffForR3[kAgingCoeffCount];
  LEFloat agingCoeffForR0TemperatureCoeff[kAgingTemperatureCoeffCount];
  LEFloat agingCoeffForR1TemperatureCoeff[kAgingTemperatureCoeffCount];
  LEFloat agingCoeffForR2TemperatureCoeff[kAgingTemperatureCoeffCount];
  LEFloat agingCoeffForR3TemperatureCoeff[kAgingTemperatureCoeffCount];
  LEFloat agingCoeffForRCFreq1[kAgingCoeffCount];
  LEFloat agingCoeffForRCFreq2[kAgingCoeffCount];
  LEFloat agingCoeffForRCFreq3[kAgingCoeffCount];
  LEFloat agingCoeffForRCFreq4[kAgingCoeffCount];
  LEFloat agingCoeffForRCFreq1TemperatureCoeff[kAgingTemperatureCoeffCount];
  LEFloat agingCoeffForRCFreq2TemperatureCoeff[kAgingTemperatureCoeffCount];
  LEFloat agingCoeffForRCFreq3TemperatureCoeff[kAgingTemperatureCoeffCount];
  LEFloat agingCoeffForRCFreq4TemperatureCoeff[kAgingTemperatureCoeffCount];
  LEFloat baselineRdc[kBaselineRdcCount];
  LEFloat baselineWRdc;
  LEFloat gridOCV[kGridOCVCount];
  LEFloat slopeForR0Extrap[kSlopeCount];
  LEFloat slopeForR1Extrap[kSlopeCount];
  LEFloat slopeForR2Extrap[kSlopeCount];
  LEFloat slopeForR3Extrap[kSlopeCount];
  LEFloat maxRdcRatio;
  LEFloat maxRdcRatioR2Extrap;
  LittleEndian32<int32_t> mLBConfig;
};

inline constexpr size_t kKextBatteryModelSize = 29056;

static_assert(sizeof(KextResistanceTable) == 816);
static_assert(sizeof(KextBMUResistance) == 20);
static_assert(alignof(KextBatteryModel) == 1);
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
