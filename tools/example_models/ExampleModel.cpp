// SPDX-License-Identifier: MIT
#include "tools/example_models/ExampleModel.h"

#include <cmath>
#include <vector>

#include "model/OTAParamRC.h"

namespace kolvrand {

namespace {

// A small generator of our own, so the numbers do not depend on a standard
// library's distributions.
class Jitter {
 public:
  explicit Jitter(uint64_t seed) : state_(seed * 0x9E3779B97F4A7C15ull + 1) {}
  // Uniform in [-1, 1).
  double next() {
    state_ ^= state_ << 13;
    state_ ^= state_ >> 7;
    state_ ^= state_ << 17;
    return static_cast<double>(state_ >> 11) / 4503599627370496.0 - 1.0;
  }

 private:
  uint64_t state_;
};

constexpr int kSocPoints = 51;

double soc(int i) {
  return static_cast<double>(i) / (kSocPoints - 1);
}

// Open-circuit voltage against state of charge, from about 3.0 V empty to
// 4.4 V full, for three temperature bands a few millivolts apart.
std::vector<float> gridOCV(Jitter& j) {
  std::vector<float> v;
  for (int band = 0; band < 3; ++band) {
    for (int i = 0; i <= 100; ++i) {
      double s = i / 100.0;
      double volts = 3.0 + 0.55 * (1 - std::exp(-12 * s)) + 0.85 * std::pow(s, 1.6);
      volts -= 0.004 * (band - 1) * (1 - s);
      v.push_back(static_cast<float>(volts + 0.0005 * j.next() * s * (1 - s)));
    }
  }
  return v;
}

// Resistance in ohms against state of charge: highest when nearly empty.
std::vector<float> resistance25C(Jitter& j, double base) {
  std::vector<float> v;
  for (int i = 0; i < kSocPoints; ++i)
    v.push_back(
        static_cast<float>(base * (1 + 1.2 * std::exp(-8 * soc(i))) * (1 + 0.02 * j.next())));
  return v;
}

// Per-kelvin coefficients for three temperature bands, larger in the cold.
std::vector<float> temperatureCoeffs(Jitter& j, int perBand) {
  std::vector<float> v;
  for (double band : {0.035, 0.022, 0.012})
    for (int i = 0; i < perBand; ++i)
      v.push_back(
          static_cast<float>(band * (1 + 0.3 * (1 - soc(i % kSocPoints))) * (1 + 0.05 * j.next())));
  return v;
}

// Growth of a resistance per equivalent full cycle.
std::vector<float> agingCoeffs(Jitter& j) {
  std::vector<float> v;
  for (int i = 0; i < 2 * kSocPoints; ++i)
    v.push_back(static_cast<float>(1.8e-4 * (1 + 0.4 * (i / kSocPoints)) * (1 + 0.1 * j.next())));
  return v;
}

std::vector<float> agingTemperatureCoeffs(Jitter& j) {
  std::vector<float> v;
  for (int i = 0; i < 6 * kSocPoints; ++i)
    v.push_back(static_cast<float>(0.045 * (1 + 0.1 * (i / kSocPoints)) * (1 + 0.1 * j.next())));
  return v;
}

// Slope used to extrapolate a resistance beyond the table, ohms per unit SOC.
std::vector<float> slopes(Jitter& j, double scale) {
  std::vector<float> v;
  for (int i = 0; i < kSocPoints; ++i)
    v.push_back(
        static_cast<float>(-scale * 8 * 1.2 * std::exp(-8 * soc(i)) * (1 + 0.02 * j.next())));
  return v;
}

std::shared_ptr<OTAResistanceData> table(Jitter& j, double base) {
  auto t = std::make_shared<OTAResistanceData>();
  std::vector<float> r = resistance25C(j, base);
  std::vector<float> tc = temperatureCoeffs(j, kSocPoints);
  t->setResistance25Cs(r.data(), r.size());
  t->setTemperatureCoeffs(tc.data(), tc.size());
  return t;
}

void setList(OTAParamRC& m, void (OTAParamRC::*setter)(const float*, size_t),
             const std::vector<float>& v) {
  (m.*setter)(v.data(), v.size());
}

}  // namespace

std::shared_ptr<OTAParamRC> makeExampleModel(uint32_t chemID, char variant) {
  const bool second = variant == 'b';
  Jitter j(second ? chemID ^ uint64_t{'b'} << 32 : chemID);
  // Resistances and their extrapolation slopes scale alike.
  const double r = second ? 1.08 : 1.0;
  auto m = std::make_shared<OTAParamRC>();
  m->setChemID(chemID);

  // The ohmic part (R0) is the smallest; the RC pairs at rising frequencies
  // follow; baselines are the same tables for a fresh cell.
  m->setR0(table(j, r * 0.045));
  m->setR1(table(j, r * 0.020));
  m->setR2(table(j, r * 0.015));
  m->setR3(table(j, r * 0.010));
  m->setRCFreq1(table(j, r * 0.030));
  m->setRCFreq2(table(j, r * 0.022));
  m->setRCFreq3(table(j, r * 0.016));
  m->setRCFreq4(table(j, r * 0.011));
  m->setBaselineR0(table(j, r * 0.043));
  m->setBaselineR1(table(j, r * 0.019));
  m->setBaselineR2(table(j, r * 0.014));
  m->setBaselineR3(table(j, r * 0.009));
  m->setBaselineR4(table(j, r * 0.007));
  m->setBaselineRCFreq1(table(j, r * 0.029));
  m->setBaselineRCFreq2(table(j, r * 0.021));
  m->setBaselineRCFreq3(table(j, r * 0.015));
  m->setBaselineRCFreq4(table(j, r * 0.010));

  auto bmu = std::make_shared<OTABMUResistance>();
  bmu->setTraceResistance25C(static_cast<float>(0.0042 * (1 + 0.05 * j.next())));
  bmu->setTraceResistanceTemperatureCoeff(0.0039f);  // copper
  bmu->setSystemEquivalentResistance(static_cast<float>(0.011 * (1 + 0.05 * j.next())));
  bmu->setDownstreamCommonResistance(static_cast<float>(0.0021 * (1 + 0.05 * j.next())));
  bmu->setDownstreamNorthResistance(static_cast<float>(0.0016 * (1 + 0.05 * j.next())));
  m->setBmuResistance(bmu);

  for (auto setter : {&OTAParamRC::setAgingCoeffForR0s, &OTAParamRC::setAgingCoeffForR1s,
                      &OTAParamRC::setAgingCoeffForR2s, &OTAParamRC::setAgingCoeffForR3s,
                      &OTAParamRC::setAgingCoeffForRCFreq1s, &OTAParamRC::setAgingCoeffForRCFreq2s,
                      &OTAParamRC::setAgingCoeffForRCFreq3s, &OTAParamRC::setAgingCoeffForRCFreq4s})
    setList(*m, setter, agingCoeffs(j));
  for (auto setter : {&OTAParamRC::setAgingCoeffForR0TemperatureCoeffs,
                      &OTAParamRC::setAgingCoeffForR1TemperatureCoeffs,
                      &OTAParamRC::setAgingCoeffForR2TemperatureCoeffs,
                      &OTAParamRC::setAgingCoeffForR3TemperatureCoeffs,
                      &OTAParamRC::setAgingCoeffForRCFreq1TemperatureCoeffs,
                      &OTAParamRC::setAgingCoeffForRCFreq2TemperatureCoeffs,
                      &OTAParamRC::setAgingCoeffForRCFreq3TemperatureCoeffs,
                      &OTAParamRC::setAgingCoeffForRCFreq4TemperatureCoeffs})
    setList(*m, setter, agingTemperatureCoeffs(j));

  std::vector<float> rdc;
  for (int i = 0; i < 15; ++i)
    rdc.push_back(static_cast<float>(0.095 + 0.004 * i + 0.001 * j.next()));
  setList(*m, &OTAParamRC::setBaselineRdcs, rdc);
  setList(*m, &OTAParamRC::setGridOCVs, gridOCV(j));
  setList(*m, &OTAParamRC::setSlopeForR0Extraps, slopes(j, r * 0.045));
  setList(*m, &OTAParamRC::setSlopeForR1Extraps, slopes(j, r * 0.020));
  setList(*m, &OTAParamRC::setSlopeForR2Extraps, slopes(j, r * 0.015));
  setList(*m, &OTAParamRC::setSlopeForR3Extraps, slopes(j, r * 0.010));

  m->setMaxRdcRatio(2.5f);
  m->setMaxRdcRatioR2Extrap(3.0f);
  m->setBaselineWRdc(static_cast<float>(0.12 * (1 + 0.02 * j.next())));
  // Boards of the R72 family split the current path north and south.
  m->setMLBConfig(chemID >= 5639 && chemID <= 5649 ? kKVRNorthSouthSplitMLB : kKVRRegularMLB);
  return m;
}

}  // namespace kolvrand
