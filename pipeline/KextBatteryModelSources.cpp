// SPDX-License-Identifier: MIT
#include "pipeline/KextBatteryModelSources.h"

#include "model/OTAParamRC.h"
#include "pipeline/KextBatteryModel.h"

namespace kolvrand {

namespace {

// The record's field is named as the dictionary key of its list.
#define KEXT_LIST(list, recordField)                                                                 \
  KextListSource {                                                                                   \
#recordField, offsetof(KextBatteryModel, recordField),                                                  \
        sizeof(KextBatteryModel::recordField) / sizeof(LEFloat),                                     \
        [](const OTAParamRC&                                                                         \
               m) { return std::span<const float>(m.list(), static_cast<size_t>(m.list##Count())); } \
  }

constexpr KextListSource kLists[] = {
    KEXT_LIST(agingCoeffForR0s, agingCoeffForR0),
    KEXT_LIST(agingCoeffForR1s, agingCoeffForR1),
    KEXT_LIST(agingCoeffForR2s, agingCoeffForR2),
    KEXT_LIST(agingCoeffForR3s, agingCoeffForR3),
    KEXT_LIST(agingCoeffForR0TemperatureCoeffs, agingCoeffForR0TemperatureCoeff),
    KEXT_LIST(agingCoeffForR1TemperatureCoeffs, agingCoeffForR1TemperatureCoeff),
    KEXT_LIST(agingCoeffForR2TemperatureCoeffs, agingCoeffForR2TemperatureCoeff),
    KEXT_LIST(agingCoeffForR3TemperatureCoeffs, agingCoeffForR3TemperatureCoeff),
    KEXT_LIST(agingCoeffForRCFreq1s, agingCoeffForRCFreq1),
    KEXT_LIST(agingCoeffForRCFreq2s, agingCoeffForRCFreq2),
    KEXT_LIST(agingCoeffForRCFreq3s, agingCoeffForRCFreq3),
    KEXT_LIST(agingCoeffForRCFreq4s, agingCoeffForRCFreq4),
    KEXT_LIST(agingCoeffForRCFreq1TemperatureCoeffs, agingCoeffForRCFreq1TemperatureCoeff),
    KEXT_LIST(agingCoeffForRCFreq2TemperatureCoeffs, agingCoeffForRCFreq2TemperatureCoeff),
    KEXT_LIST(agingCoeffForRCFreq3TemperatureCoeffs, agingCoeffForRCFreq3TemperatureCoeff),
    KEXT_LIST(agingCoeffForRCFreq4TemperatureCoeffs, agingCoeffForRCFreq4TemperatureCoeff),
    KEXT_LIST(baselineRdcs, baselineRdc),
    KEXT_LIST(gridOCVs, gridOCV),
    KEXT_LIST(slopeForR0Extraps, slopeForR0Extrap),
    KEXT_LIST(slopeForR1Extraps, slopeForR1Extrap),
    KEXT_LIST(slopeForR2Extraps, slopeForR2Extrap),
    KEXT_LIST(slopeForR3Extraps, slopeForR3Extrap),
};
#undef KEXT_LIST

#define KEXT_TABLE(field, key)                                                          \
  KextTableSource {                                                                     \
    key, offsetof(KextBatteryModel, field),                                             \
        [](const OTAParamRC& m) -> const OTAResistanceData* { return m.field().get(); } \
  }

constexpr KextTableSource kTables[] = {
    KEXT_TABLE(r0, "R0"),
    KEXT_TABLE(r1, "R1"),
    KEXT_TABLE(r2, "R2"),
    KEXT_TABLE(r3, "R3"),
    KEXT_TABLE(rCFreq1, "RCFreq1"),
    KEXT_TABLE(rCFreq2, "RCFreq2"),
    KEXT_TABLE(rCFreq3, "RCFreq3"),
    KEXT_TABLE(rCFreq4, "RCFreq4"),
    KEXT_TABLE(baselineR0, "baselineR0"),
    KEXT_TABLE(baselineR1, "baselineR1"),
    KEXT_TABLE(baselineR2, "baselineR2"),
    KEXT_TABLE(baselineR3, "baselineR3"),
    KEXT_TABLE(baselineR4, "baselineR4"),
    KEXT_TABLE(baselineRCFreq1, "baselineRCFreq1"),
    KEXT_TABLE(baselineRCFreq2, "baselineRCFreq2"),
    KEXT_TABLE(baselineRCFreq3, "baselineRCFreq3"),
    KEXT_TABLE(baselineRCFreq4, "baselineRCFreq4"),
};
#undef KEXT_TABLE

constexpr KextTableListSource kTableLists[] = {
    {"resistance25C", offsetof(KextResistanceTable, resistance25C),
     KextResistanceTable::kResistance25CCount,
     [](const OTAResistanceData& t) {
       return std::span<const float>(t.resistance25Cs(),
                                     static_cast<size_t>(t.resistance25CsCount()));
     }},
    {"temperatureCoeff", offsetof(KextResistanceTable, temperatureCoeff),
     KextResistanceTable::kTemperatureCoeffCount,
     [](const OTAResistanceData& t) {
       return std::span<const float>(t.temperatureCoeffs(),
                                     static_cast<size_t>(t.temperatureCoeffsCount()));
     }},
};

}  // namespace

std::span<const KextListSource> kextListSources() {
  return kLists;
}
std::span<const KextTableSource> kextTableSources() {
  return kTables;
}
std::span<const KextTableListSource> kextTableListSources() {
  return kTableLists;
}

std::string KextListCheck::name() const {
  if (!table) return list;
  if (!list) return table;
  return std::string(table) + "." + list;
}

std::vector<KextListCheck> checkKextLists(const OTAParamRC& model) {
  std::vector<KextListCheck> checks;
  checks.reserve(std::size(kTables) * (1 + std::size(kTableLists)) + std::size(kLists));
  for (const KextTableSource& t : kTables) {
    const OTAResistanceData* table = t.table(model);
    if (!table) {
      checks.push_back({t.field, nullptr, 0, 0});
      continue;
    }
    for (const KextTableListSource& l : kTableLists)
      checks.push_back({t.field, l.field, l.elements(*table).size(), l.count});
  }
  for (const KextListSource& l : kLists)
    checks.push_back({nullptr, l.field, l.elements(model).size(), l.count});
  return checks;
}

}  // namespace kolvrand
