#include "pipeline/KextBatteryModelSources.h"

#include "model/OTAParamRC.h"
#include "pipeline/KextBatteryModel.h"

namespace kolvrand {

namespace {

#define KEXT_LIST(list, recordField)                                                                 \
  KextListSource {                                                                                   \
#list, offsetof(KextBatteryModel, recordField),                                                  \
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

#define KEXT_TABLE(field)                                                               \
  KextTableSource {                                                                     \
#field, offsetof(KextBatteryModel, field),                                          \
        [](const OTAParamRC& m) -> const OTAResistanceData* { return m.field().get(); } \
  }

constexpr KextTableSource kTables[] = {
    KEXT_TABLE(r0),
    KEXT_TABLE(r1),
    KEXT_TABLE(r2),
    KEXT_TABLE(r3),
    KEXT_TABLE(rCFreq1),
    KEXT_TABLE(rCFreq2),
    KEXT_TABLE(rCFreq3),
    KEXT_TABLE(rCFreq4),
    KEXT_TABLE(baselineR0),
    KEXT_TABLE(baselineR1),
    KEXT_TABLE(baselineR2),
    KEXT_TABLE(baselineR3),
    KEXT_TABLE(baselineR4),
    KEXT_TABLE(baselineRCFreq1),
    KEXT_TABLE(baselineRCFreq2),
    KEXT_TABLE(baselineRCFreq3),
    KEXT_TABLE(baselineRCFreq4),
};
#undef KEXT_TABLE

constexpr KextTableListSource kTableLists[] = {
    {"resistance25Cs", offsetof(KextResistanceTable, resistance25C),
     KextResistanceTable::kResistance25CCount,
     [](const OTAResistanceData& t) {
       return std::span<const float>(t.resistance25Cs(),
                                     static_cast<size_t>(t.resistance25CsCount()));
     }},
    {"temperatureCoeffs", offsetof(KextResistanceTable, temperatureCoeff),
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

}  // namespace kolvrand
