// SPDX-License-Identifier: MIT
// Building the kernel record from a decoded model: straight copies of the
// first elements of every list. A model that cannot fill the record is refused
// rather than padded, so no byte of the record is made up.
#include <algorithm>
#include <new>
#include <string>

#include "model/OTAParamRC.h"
#include "model/Wire.h"
#include "pipeline/BatteryModelDataHandler.h"
#include "pipeline/KextBatteryModel.h"
#include "pipeline/KextBatteryModelSources.h"

namespace kolvrand {

namespace {

constexpr const char* kMethod = "-[BatteryModelDataHandler createKextModelFromProtobufModel:]";

// Logs the first table the model lacks or list shorter than the record's
// count, with how many more there are (one line a boot, however bare the
// model; rcmodel validate lists them all); true when there is none.
bool modelFillsRecord(const OTAParamRC& model, const os_log_t& log) {
  const std::vector<KextListCheck> checks = checkKextLists(model);
  auto first = std::find_if(checks.begin(), checks.end(), [](auto& c) { return !c.fills(); });
  if (first == checks.end()) return true;
  const auto others = std::count_if(first + 1, checks.end(), [](auto& c) { return !c.fills(); });
  std::string more;
  if (others > 0)
    more = "; " + std::to_string(others) + (others == 1 ? " more shortfall" : " more shortfalls") +
           ", rcmodel validate lists them";
  if (!first->list)
    os_log_error(log, "%s <Error> %s nil: the record needs all %zu resistance tables%s", kMethod,
                 first->table, kextTableSources().size(), more);
  else
    os_log_error(log, "%s <Error> %s holds %zu elements, the record carries %zu%s", kMethod,
                 first->name(), first->held, first->carried, more);
  return false;
}

// The record is little-endian on every host; modelFillsRecord has checked that
// the list holds `count` elements.
void copyFloats(uint8_t* destination, std::span<const float> source, size_t count) {
  wire::storeFloats(destination, source.data(), count);
}

}  // namespace

std::unique_ptr<KextBatteryModel> BatteryModelDataHandler::createKextModelFromProtobufModel(
    const OTAParamRC* protobufModel) {
  if (!protobufModel) {
    os_log_error(log_, "%s <Error> protobufModel nil", kMethod);
    return nullptr;
  }
  const OTAParamRC& model = *protobufModel;
  if (!modelFillsRecord(model, log_)) return nullptr;

  // Not zeroed: every byte is written below.
  std::unique_ptr<KextBatteryModel> record(new (std::nothrow) KextBatteryModel);
  if (!record) {
    os_log_error(log_, "%s <Error> kextModel nil", kMethod);
    return nullptr;
  }
  auto* bytes = reinterpret_cast<uint8_t*>(record.get());

  record->chemID = model.chemID();
  record->maxRdcRatio = model.maxRdcRatio();
  record->maxRdcRatioR2Extrap = model.maxRdcRatioR2Extrap();
  record->baselineWRdc = model.baselineWRdc();
  record->mLBConfig = model.mLBConfig();

  if (const auto& bmu = model.bmuResistance()) {
    record->bmuResistance = {bmu->traceResistance25C(), bmu->traceResistanceTemperatureCoeff(),
                             bmu->systemEquivalentResistance(), bmu->downstreamCommonResistance(),
                             bmu->downstreamNorthResistance()};
  } else {
    record->bmuResistance = {};
  }

  for (const KextTableSource& t : kextTableSources()) {
    const OTAResistanceData& table = *t.table(model);
    for (const KextTableListSource& l : kextTableListSources())
      copyFloats(bytes + t.offset + l.offset, l.elements(table), l.count);
  }
  for (const KextListSource& l : kextListSources())
    copyFloats(bytes + l.offset, l.elements(model), l.count);
  return record;
}

}  // namespace kolvrand
