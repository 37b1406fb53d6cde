// Building the kernel record from a decoded model: straight copies of the
// first elements of every list. A model that cannot fill the record is refused
// rather than padded, so no byte of the record is made up.
#include <new>

#include "model/OTAParamRC.h"
#include "model/Wire.h"
#include "pipeline/BatteryModelDataHandler.h"
#include "pipeline/KextBatteryModel.h"
#include "pipeline/KextBatteryModelSources.h"

namespace kolvrand {

namespace {

constexpr const char* kMethod = "-[BatteryModelDataHandler createKextModelFromProtobufModel:]";

// Logs every table the model lacks and every list shorter than the record's
// count; true when there is none.
bool modelFillsRecord(const OTAParamRC& model, const os_log_t& log) {
  bool fills = true;
  for (const KextTableSource& t : kextTableSources()) {
    const OTAResistanceData* table = t.table(model);
    if (!table) {
      os_log_error(log, "%s <Error> %s nil: the record needs all 17 resistance tables", kMethod,
                   t.field);
      fills = false;
      continue;
    }
    for (const KextTableListSource& l : kextTableListSources()) {
      size_t held = l.elements(*table).size();
      if (held < l.count) {
        os_log_error(log, "%s <Error> %s.%s holds %zu elements, the record carries %zu", kMethod,
                     t.field, l.field, held, l.count);
        fills = false;
      }
    }
  }
  for (const KextListSource& l : kextListSources()) {
    size_t held = l.elements(model).size();
    if (held < l.count) {
      os_log_error(log, "%s <Error> %s holds %zu elements, the record carries %zu", kMethod,
                   l.field, held, l.count);
      fills = false;
    }
  }
  return fills;
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
