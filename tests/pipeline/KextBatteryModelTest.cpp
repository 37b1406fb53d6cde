// The kernel record, checked against a layout computed here from the field
// sizes alone: every element of every list lands at its own offset, and
// nothing but the model decides a byte.
#include <gtest/gtest.h>

#include <cstring>

#include "model/OTAParamRC.h"
#include "pipeline/BatteryModelDataHandler.h"
#include "pipeline/KextBatteryModel.h"
#include "platform/CommonCrypto.h"
#include "tests/support/TestDevice.h"
#include "tools/example_models/ExampleModel.h"

namespace kolvrand {
namespace {

using Lines = std::vector<std::string>;

// The record's fields in order, with their sizes in 4-byte words; a
// resistance table is 51 + 153 words, the board block 5.
struct Slot {
  std::string name;
  size_t words;
};
std::vector<Slot> recordSlots() {
  std::vector<Slot> slots = {{"chemID", 1}};
  for (const char* t :
       {"r0", "r1", "r2", "r3", "rCFreq1", "rCFreq2", "rCFreq3", "rCFreq4", "baselineR0",
        "baselineR1", "baselineR2", "baselineR3", "baselineR4", "baselineRCFreq1",
        "baselineRCFreq2", "baselineRCFreq3", "baselineRCFreq4"}) {
    slots.push_back({std::string(t) + ".resistance25Cs", 51});
    slots.push_back({std::string(t) + ".temperatureCoeffs", 153});
  }
  for (const char* b :
       {"traceResistance25C", "traceResistanceTemperatureCoeff", "systemEquivalentResistance",
        "downstreamCommonResistance", "downstreamNorthResistance"})
    slots.push_back({std::string("bmu.") + b, 1});
  for (const char* a : {"R0", "R1", "R2", "R3"})
    slots.push_back({"agingCoeffFor" + std::string(a) + "s", 102});
  for (const char* a : {"R0", "R1", "R2", "R3"})
    slots.push_back({"agingCoeffFor" + std::string(a) + "TemperatureCoeffs", 306});
  for (const char* a : {"RCFreq1", "RCFreq2", "RCFreq3", "RCFreq4"})
    slots.push_back({"agingCoeffFor" + std::string(a) + "s", 102});
  for (const char* a : {"RCFreq1", "RCFreq2", "RCFreq3", "RCFreq4"})
    slots.push_back({"agingCoeffFor" + std::string(a) + "TemperatureCoeffs", 306});
  slots.push_back({"baselineRdcs", 15});
  slots.push_back({"baselineWRdc", 1});
  slots.push_back({"gridOCVs", 303});
  for (const char* s : {"R0", "R1", "R2", "R3"})
    slots.push_back({"slopeFor" + std::string(s) + "Extraps", 51});
  slots.push_back({"maxRdcRatio", 1});
  slots.push_back({"maxRdcRatioR2Extrap", 1});
  slots.push_back({"mLBConfig", 1});
  return slots;
}

// A value no other element of any list shares: the slot's number and the
// element's index, exactly representable as a float.
float marker(size_t slot, size_t index) {
  return static_cast<float>(slot * 1000 + index + 1);
}

// A model whose every element is its marker, with `extra` more elements per
// list than the record carries.
std::shared_ptr<OTAParamRC> markedModel(const std::vector<Slot>& slots, size_t extra) {
  auto m = std::make_shared<OTAParamRC>();
  std::map<std::string, std::shared_ptr<OTAResistanceData>> tables;
  auto bmu = std::make_shared<OTABMUResistance>();
  for (size_t s = 0; s < slots.size(); ++s) {
    const std::string& name = slots[s].name;
    std::vector<float> v;
    for (size_t i = 0; i < slots[s].words + extra; ++i) v.push_back(marker(s, i));
    auto dot = name.find('.');
    if (name == "chemID") {
      m->setChemID(0xC0FFEE);
    } else if (name == "mLBConfig") {
      m->setMLBConfig(7);
    } else if (name == "baselineWRdc") {
      m->setBaselineWRdc(marker(s, 0));
    } else if (name == "maxRdcRatio") {
      m->setMaxRdcRatio(marker(s, 0));
    } else if (name == "maxRdcRatioR2Extrap") {
      m->setMaxRdcRatioR2Extrap(marker(s, 0));
    } else if (name.starts_with("bmu.")) {
      std::string f = name.substr(4);
      if (f == "traceResistance25C") bmu->setTraceResistance25C(marker(s, 0));
      if (f == "traceResistanceTemperatureCoeff")
        bmu->setTraceResistanceTemperatureCoeff(marker(s, 0));
      if (f == "systemEquivalentResistance") bmu->setSystemEquivalentResistance(marker(s, 0));
      if (f == "downstreamCommonResistance") bmu->setDownstreamCommonResistance(marker(s, 0));
      if (f == "downstreamNorthResistance") bmu->setDownstreamNorthResistance(marker(s, 0));
    } else if (dot != std::string::npos) {
      auto& t = tables[name.substr(0, dot)];
      if (!t) t = std::make_shared<OTAResistanceData>();
      if (name.ends_with("resistance25Cs"))
        t->setResistance25Cs(v.data(), v.size());
      else
        t->setTemperatureCoeffs(v.data(), v.size());
    } else {
      // A list of the model itself: set it through the dictionary key's setter.
      static const std::map<std::string, void (OTAParamRC::*)(const float*, size_t)> setters = {
          {"agingCoeffForR0s", &OTAParamRC::setAgingCoeffForR0s},
          {"agingCoeffForR1s", &OTAParamRC::setAgingCoeffForR1s},
          {"agingCoeffForR2s", &OTAParamRC::setAgingCoeffForR2s},
          {"agingCoeffForR3s", &OTAParamRC::setAgingCoeffForR3s},
          {"agingCoeffForR0TemperatureCoeffs", &OTAParamRC::setAgingCoeffForR0TemperatureCoeffs},
          {"agingCoeffForR1TemperatureCoeffs", &OTAParamRC::setAgingCoeffForR1TemperatureCoeffs},
          {"agingCoeffForR2TemperatureCoeffs", &OTAParamRC::setAgingCoeffForR2TemperatureCoeffs},
          {"agingCoeffForR3TemperatureCoeffs", &OTAParamRC::setAgingCoeffForR3TemperatureCoeffs},
          {"agingCoeffForRCFreq1s", &OTAParamRC::setAgingCoeffForRCFreq1s},
          {"agingCoeffForRCFreq2s", &OTAParamRC::setAgingCoeffForRCFreq2s},
          {"agingCoeffForRCFreq3s", &OTAParamRC::setAgingCoeffForRCFreq3s},
          {"agingCoeffForRCFreq4s", &OTAParamRC::setAgingCoeffForRCFreq4s},
          {"agingCoeffForRCFreq1TemperatureCoeffs",
           &OTAParamRC::setAgingCoeffForRCFreq1TemperatureCoeffs},
          {"agingCoeffForRCFreq2TemperatureCoeffs",
           &OTAParamRC::setAgingCoeffForRCFreq2TemperatureCoeffs},
          {"agingCoeffForRCFreq3TemperatureCoeffs",
           &OTAParamRC::setAgingCoeffForRCFreq3TemperatureCoeffs},
          {"agingCoeffForRCFreq4TemperatureCoeffs",
           &OTAParamRC::setAgingCoeffForRCFreq4TemperatureCoeffs},
          {"baselineRdcs", &OTAParamRC::setBaselineRdcs},
          {"gridOCVs", &OTAParamRC::setGridOCVs},
          {"slopeForR0Extraps", &OTAParamRC::setSlopeForR0Extraps},
          {"slopeForR1Extraps", &OTAParamRC::setSlopeForR1Extraps},
          {"slopeForR2Extraps", &OTAParamRC::setSlopeForR2Extraps},
          {"slopeForR3Extraps", &OTAParamRC::setSlopeForR3Extraps},
      };
      (m.get()->*setters.at(name))(v.data(), v.size());
    }
  }
  m->setR0(tables["r0"]), m->setR1(tables["r1"]), m->setR2(tables["r2"]), m->setR3(tables["r3"]);
  m->setRCFreq1(tables["rCFreq1"]), m->setRCFreq2(tables["rCFreq2"]);
  m->setRCFreq3(tables["rCFreq3"]), m->setRCFreq4(tables["rCFreq4"]);
  m->setBaselineR0(tables["baselineR0"]), m->setBaselineR1(tables["baselineR1"]);
  m->setBaselineR2(tables["baselineR2"]), m->setBaselineR3(tables["baselineR3"]);
  m->setBaselineR4(tables["baselineR4"]);
  m->setBaselineRCFreq1(tables["baselineRCFreq1"]),
      m->setBaselineRCFreq2(tables["baselineRCFreq2"]);
  m->setBaselineRCFreq3(tables["baselineRCFreq3"]),
      m->setBaselineRCFreq4(tables["baselineRCFreq4"]);
  m->setBmuResistance(bmu);
  return m;
}

// The little-endian value at `offset`, on any host.
template <typename T>
T at(const KextBatteryModel& record, size_t offset) {
  LittleEndian32<T> v;
  std::memcpy(&v, reinterpret_cast<const uint8_t*>(&record) + offset, sizeof v);
  return v;
}

TEST(KextBatteryModel, EveryElementLandsAtItsOffsetAndNoFurther) {
  test::TestDevice device;
  const std::vector<Slot> slots = recordSlots();
  size_t total = 0;
  for (const Slot& s : slots) total += s.words * 4;
  ASSERT_EQ(total, kKextBatteryModelSize);

  // Lists longer than the record's counts: only the first elements are carried.
  auto record = BatteryModelDataHandler::init()->createKextModelFromProtobufModel(
      markedModel(slots, 3).get());
  ASSERT_TRUE(record);
  EXPECT_EQ(device.logLines(), Lines{});
  size_t offset = 0;
  for (size_t s = 0; s < slots.size(); ++s) {
    SCOPED_TRACE(slots[s].name + " at " + std::to_string(offset));
    if (slots[s].name == "chemID") {
      EXPECT_EQ(at<uint32_t>(*record, offset), 0xC0FFEEu);
    } else if (slots[s].name == "mLBConfig") {
      EXPECT_EQ(at<int32_t>(*record, offset), 7);
    } else {
      for (size_t i = 0; i < slots[s].words; ++i)
        ASSERT_EQ(at<float>(*record, offset + 4 * i), marker(s, i)) << "element " << i;
    }
    offset += slots[s].words * 4;
  }
}

TEST(KextBatteryModel, AbsentOptionalPartsGiveTheirDefaults) {
  test::TestDevice device;
  auto model = makeExampleModel(0x2168);
  model->setBmuResistance(nullptr);
  model->setHasMLBConfig(false);
  model->setHasMaxRdcRatio(false);  // the stored value is still carried
  auto record = BatteryModelDataHandler::init()->createKextModelFromProtobufModel(model.get());
  ASSERT_TRUE(record);
  EXPECT_EQ(at<int32_t>(*record, 29052), 0);
  EXPECT_EQ(at<float>(*record, 29044), model->maxRdcRatio());
  const uint8_t zeros[20] = {};
  EXPECT_EQ(std::memcmp(reinterpret_cast<const uint8_t*>(record.get()) + 13876, zeros, 20), 0);
}

TEST(KextBatteryModel, NullOrShortModelsAreRefusedWithTheirReasons) {
  const std::string prefix =
      "error [batteryModelDataHandling] -[BatteryModelDataHandler "
      "createKextModelFromProtobufModel:] <Error> ";
  test::TestDevice device;
  auto handler = BatteryModelDataHandler::init();
  EXPECT_FALSE(handler->createKextModelFromProtobufModel(nullptr));
  EXPECT_EQ(device.logLines(), Lines{prefix + "protobufModel nil"});

  device.clearLog();
  auto model = makeExampleModel(0x2168);
  model->setBaselineRCFreq4(nullptr);
  model->r1()->setTemperatureCoeffs(model->r1()->temperatureCoeffs(), 152);
  model->clearSlopeForR3Extraps();
  EXPECT_FALSE(handler->createKextModelFromProtobufModel(model.get()));
  // The first shortfall in record order, named as authors write it, and how
  // many more there are: one line a boot however bare the model.
  EXPECT_EQ(device.logLines(),
            Lines{prefix + "R1.temperatureCoeff holds 152 elements, the record carries 153; 2 "
                           "more shortfalls, rcmodel validate lists them"});
  device.clearLog();
  const OTAParamRC empty;
  EXPECT_FALSE(handler->createKextModelFromProtobufModel(&empty));
  EXPECT_EQ(device.logLines(), Lines{prefix + "R0 nil: the record needs all 17 resistance "
                                              "tables; 38 more shortfalls, rcmodel validate "
                                              "lists them"});
}

}  // namespace
}  // namespace kolvrand
