// The kernel record, checked against a layout computed here from the field
// sizes alone: every element of every list lands at its own offset, and
// nothing but the model decides a byte.
#include <gtest/gtest.h>

#include <cstring>

#include "model/OTAParamRC.h"
#include "pipeline/BatteryModelDataHandler.h"
#include "pipeline/KextBatteryModel.h"
#include "tests/support/TestDevice.h"
#include "tools/example_models/ExampleModel.h"

namespace kolvrand {
namespace {

using Lines = std::vector<std::string>;

// The record's fields in order, by dictionary key, with their sizes in 4-byte
// words; a resistance table is 51 + 153 words. One word is a scalar.
struct Slot {
  std::string key;
  size_t words;
};
std::vector<Slot> recordSlots() {
  std::vector<Slot> slots = {{"chemID", 1}};
  for (std::string t : {"R0", "R1", "R2", "R3", "RCFreq1", "RCFreq2", "RCFreq3", "RCFreq4",
                        "baselineR0", "baselineR1", "baselineR2", "baselineR3", "baselineR4",
                        "baselineRCFreq1", "baselineRCFreq2", "baselineRCFreq3", "baselineRCFreq4"})
    slots.insert(slots.end(), {{t + ".resistance25C", 51}, {t + ".temperatureCoeff", 153}});
  for (std::string b :
       {"traceResistance25C", "traceResistanceTemperatureCoeff", "systemEquivalentResistance",
        "downstreamCommonResistance", "downstreamNorthResistance"})
    slots.push_back({"bmuResistance." + b, 1});
  for (std::string group : {"R", "RCFreq"}) {
    for (char n : std::string(group == "R" ? "0123" : "1234"))
      slots.push_back({"agingCoeffFor" + group + n, 102});
    for (char n : std::string(group == "R" ? "0123" : "1234"))
      slots.push_back({"agingCoeffFor" + group + n + "TemperatureCoeff", 306});
  }
  slots.insert(slots.end(), {{"baselineRdc", 15}, {"baselineWRdc", 1}, {"gridOCV", 303}});
  for (char n : std::string("0123")) slots.push_back({std::string("slopeForR") + n + "Extrap", 51});
  slots.insert(slots.end(), {{"maxRdcRatio", 1}, {"maxRdcRatioR2Extrap", 1}, {"MLBConfig", 1}});
  return slots;
}

// A value no other element of any list shares, exactly representable.
float marker(size_t slot, size_t index) {
  return static_cast<float>(slot * 1000 + index + 1);
}

// The little-endian value at `offset`, on any host.
template <typename T>
T at(const KextBatteryModel& record, size_t offset) {
  LittleEndian32<T> v;
  std::memcpy(&v, reinterpret_cast<const uint8_t*>(&record) + offset, sizeof v);
  return v;
}

// Every element its marker, lists 3 longer than the record carries (only the
// first elements go in). `bare`: no board block, no MLBConfig, and the has-bit
// of maxRdcRatio cleared: the first two give zeros, the stored ratio is carried.
TEST(KextBatteryModel, EveryElementLandsAtItsOffsetAndNoFurther) {
  const std::vector<Slot> slots = recordSlots();
  size_t total = 0;
  for (const Slot& s : slots) total += s.words * 4;
  ASSERT_EQ(total, kKextBatteryModelSize);
  for (bool bare : {false, true}) {
    test::TestDevice device;
    Dictionary root;
    for (size_t s = 0; s < slots.size(); ++s) {
      const std::string& key = slots[s].key;
      Value v = Number::fromFloat(marker(s, 0));
      if (slots[s].words > 1) {
        Array a;
        for (size_t i = 0; i < slots[s].words + 3; ++i)
          a.emplace_back(Number::fromFloat(marker(s, i)));
        v = std::move(a);
      }
      if (key == "chemID") v = Number::fromUnsigned(0xC0FFEE);
      if (key == "MLBConfig") v = "(unknown: 7)";
      if (bare && (key == "MLBConfig" || key.starts_with("bmu"))) continue;
      const size_t dot = key.find('.');
      if (dot == std::string::npos) {
        root.set(key, std::move(v));
        continue;
      }
      if (!root.find(key.substr(0, dot))) root.set(key.substr(0, dot), Dictionary{});
      root.find(key.substr(0, dot))->asDictionary()->set(key.substr(dot + 1), std::move(v));
    }
    DictionaryError why;
    auto model = OTAParamRC::fromDictionary(root, &why);
    ASSERT_TRUE(model) << why.path << ": " << why.reason;
    if (bare) model->setHasMaxRdcRatio(false);
    auto record = BatteryModelDataHandler::init()->createKextModelFromProtobufModel(model.get());
    ASSERT_TRUE(record);
    EXPECT_EQ(device.logLines(), Lines{});
    size_t offset = 0;
    for (size_t s = 0; s < slots.size(); ++s) {
      const std::string& key = slots[s].key;
      SCOPED_TRACE(key + " at " + std::to_string(offset) + (bare ? ", bare" : ""));
      const bool zero = bare && (key == "MLBConfig" || key.starts_with("bmu"));
      if (key == "chemID")
        EXPECT_EQ(at<uint32_t>(*record, offset), 0xC0FFEEu);
      else if (key == "MLBConfig")
        EXPECT_EQ(at<int32_t>(*record, offset), zero ? 0 : 7);
      else
        for (size_t i = 0; i < slots[s].words; ++i)
          ASSERT_EQ(at<float>(*record, offset + 4 * i), zero ? 0.0f : marker(s, i)) << i;
      offset += slots[s].words * 4;
    }
  }
}

// The first shortfall in record order, named as authors write it, and how
// many more there are: one line a boot however bare the model.
TEST(KextBatteryModel, NullOrShortModelsAreRefusedWithTheirReasons) {
  const std::string prefix =
      "error [batteryModelDataHandling] -[BatteryModelDataHandler "
      "createKextModelFromProtobufModel:] <Error> ";
  auto model = makeExampleModel(0x2168);
  model->setBaselineRCFreq4(nullptr);
  model->r1()->setTemperatureCoeffs(model->r1()->temperatureCoeffs(), 152);
  model->clearSlopeForR3Extraps();
  const OTAParamRC empty;
  const std::pair<const OTAParamRC*, std::string> cases[] = {
      {nullptr, "protobufModel nil"},
      {model.get(),
       "R1.temperatureCoeff holds 152 elements, the record carries 153; 2 more "
       "shortfalls, rcmodel validate lists them"},
      {&empty,
       "R0 nil: the record needs all 17 resistance tables; 38 more shortfalls, rcmodel "
       "validate lists them"},
  };
  for (const auto& [m, line] : cases) {
    test::TestDevice device;
    EXPECT_FALSE(BatteryModelDataHandler::init()->createKextModelFromProtobufModel(m));
    EXPECT_EQ(device.logLines(), Lines{prefix + line});
  }
}

}  // namespace
}  // namespace kolvrand
