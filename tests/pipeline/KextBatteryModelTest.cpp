// SPDX-License-Identifier: MIT
// The kernel record, checked against a layout computed here from the field
// sizes alone: every element of every list lands at its own offset, and
// nothing but the model decides a byte; and the records of the example
// models, pinned.
#include <gtest/gtest.h>

#include <algorithm>
#include <bit>

#include "base/CommonCrypto.h"
#include "model/OTAParamRC.h"
#include "pipeline/BatteryModelDataHandler.h"
#include "pipeline/KextBatteryModel.h"
#include "pipeline/PBStreamReader.h"
#include "pipeline/PBStreamWriter.h"
#include "tests/support/TestDevice.h"

namespace kolvrand {
namespace {

// The record's fields in order, by dictionary key, with their sizes in 4-byte
// words; a resistance table is 51 + 153 words. One word is a scalar.
std::vector<std::pair<std::string, size_t>> recordSlots() {
  std::vector<std::pair<std::string, size_t>> slots = {{"chemID", 1}};
  for (std::string t : {"R0", "R1", "R2", "R3", "RCFreq1", "RCFreq2", "RCFreq3", "RCFreq4",
                        "baselineR0", "baselineR1", "baselineR2", "baselineR3", "baselineR4",
                        "baselineRCFreq1", "baselineRCFreq2", "baselineRCFreq3", "baselineRCFreq4"})
    slots.insert(slots.end(), {{t + ".resistance25C", 51}, {t + ".temperatureCoeff", 153}});
  for (std::string b :
       {"traceResistance25C", "traceResistanceTemperatureCoeff", "systemEquivalentResistance",
        "downstreamCommonResistance", "downstreamNorthResistance"})
    slots.push_back({"bmuResistance." + b, 1});
  for (std::string table : {"R", "RCFreq"})
    for (std::string suffix : {"", "TemperatureCoeff"})
      for (int n = table == "R" ? 0 : 1, last = n + 3; n <= last; ++n)
        slots.push_back(
            {"agingCoeffFor" + table + std::to_string(n) + suffix, suffix.empty() ? 102 : 306});
  slots.insert(slots.end(), {{"baselineRdc", 15}, {"baselineWRdc", 1}, {"gridOCV", 303}});
  for (char n : std::string("0123")) slots.push_back({std::string("slopeForR") + n + "Extrap", 51});
  slots.insert(slots.end(), {{"maxRdcRatio", 1}, {"maxRdcRatioR2Extrap", 1}, {"MLBConfig", 1}});
  return slots;
}

// Every element a value no other element of any list shares, exactly
// representable; lists 3 longer than the record carries (only the first
// elements go in). `bare`: no board block, no MLBConfig, and the has-bit of
// maxRdcRatio cleared: the first two give zeros, the stored ratio is carried.
TEST(KextBatteryModel, EveryElementLandsAtItsOffsetAndNoFurther) {
  const auto slots = recordSlots();
  for (bool bare : {false, true}) {
    SCOPED_TRACE(bare ? "bare" : "full");
    test::TestDevice device;
    Dictionary root;
    std::vector<uint8_t> expected;  // the record, little-endian on every host
    const auto put = [&](uint32_t word) {
      for (int i = 0; i < 32; i += 8) expected.push_back(static_cast<uint8_t>(word >> i));
    };
    for (size_t s = 0; s < slots.size(); ++s) {
      const auto& [key, words] = slots[s];
      const auto marker = [s](size_t i) { return static_cast<float>(s * 1000 + i + 1); };
      const bool absent = bare && (key == "MLBConfig" || key.starts_with("bmu"));
      Value v = Number::fromFloat(marker(0));
      if (key == "chemID") {
        v = Number::fromUnsigned(0xC0FFEE);
        put(0xC0FFEE);
      } else if (key == "MLBConfig") {
        v = "(unknown: 7)";
        put(absent ? 0 : 7);
      } else {
        Array a;
        for (size_t i = 0; i < words + 3; ++i) a.emplace_back(Number::fromFloat(marker(i)));
        for (size_t i = 0; i < words; ++i) put(absent ? 0 : std::bit_cast<uint32_t>(marker(i)));
        if (words > 1) v = std::move(a);
      }
      if (absent) continue;
      const size_t dot = key.find('.');
      if (dot == std::string::npos) {
        root.set(key, std::move(v));
        continue;
      }
      if (!root.find(key.substr(0, dot))) root.set(key.substr(0, dot), Dictionary{});
      root.find(key.substr(0, dot))->asDictionary()->set(key.substr(dot + 1), std::move(v));
    }
    ASSERT_EQ(expected.size(), kKextBatteryModelSize);
    ValueError why;
    auto model = OTAParamRC::fromDictionary(root, &why);
    ASSERT_TRUE(model) << why.path << ": " << why.reason;
    if (bare) model->setHasMaxRdcRatio(false);
    auto record = BatteryModelDataHandler::init()->createKextModelFromProtobufModel(model.get());
    ASSERT_TRUE(record);
    EXPECT_EQ(device.logLines(), std::vector<std::string>{});
    const auto* bytes = reinterpret_cast<const uint8_t*>(record.get());
    const auto differs = std::mismatch(expected.begin(), expected.end(), bytes).first;
    EXPECT_TRUE(differs == expected.end()) << "at byte " << differs - expected.begin();
  }
}

// The committed example models, written on a little-endian 64-bit host, read
// the same on every target: each decodes and encodes again to the very bytes
// of its file, and gives the kernel record whose SHA-1 is fixed below, the
// same on every architecture (the record is little-endian by definition).
// File, chem ID, SHA-1 of the record.
constexpr std::tuple<const char*, uint32_t, const char*> kExamples[] = {
    {"examples/models/K517/1821.rcmodel", 0x1821, "83b8e6fb91ab8c06e267bb8bed872113b25a5fa9"},
    {"examples/models/R70/1552.rcmodel", 0x1552, "82e31811550188d291511afceeabad1880f62221"},
    {"examples/models/R71/1532.rcmodel", 0x1532, "e43e002abc201d5b3b81e6a19e330ad863e8391b"},
    {"examples/models/R72/1608a.rcmodel", 0x1608, "7d9bf1503bd5a43e22bee26ef1db71eb1a95b4ce"},
    {"examples/models/R72/1608b.rcmodel", 0x1608, "39487a168437bfd12cfa6df8382d64c1019f80b7"},
    {"examples/models/T604/1886.rcmodel", 0x1886, "9ef753e1d66f8cf2ffaa7706f5f3453c27d37788"},
    {"examples/models/T618e/2168.rcmodel", 0x2168, "1b50f4236af0c0adec44bb492118b90940445413"},
    {"examples/device/Library/KVR/BatteryModels/T618e/2168.rcmodel", 0x2168,
     "1b50f4236af0c0adec44bb492118b90940445413"},
};

TEST(ExampleModels, EncodeAgainToTheirFileAndGiveRecordsOfTheirFixedDigests) {
  test::TestDevice device;
  auto handler = BatteryModelDataHandler::init();
  for (const auto& [name, chemID, recordSHA1] : kExamples) {
    SCOPED_TRACE(name);
    NSError error;
    auto file = PBStreamReader::readFile(std::string(KOLVRAND_SOURCE_DIR) + "/" + name, &error);
    ASSERT_TRUE(file) << error.description();
    auto models = PBStreamReader::readProtoBuffersOfClass<OTAParamRC>(*file, &error);
    ASSERT_TRUE(models && models->size() == 1) << error.description();
    EXPECT_EQ(models->front()->chemID(), chemID);
    EXPECT_EQ(
        PBStreamWriter::dataForMessages(std::span<const std::shared_ptr<OTAParamRC>>(*models)),
        *file);
    auto record = handler->createKextModelFromProtobufModel(models->front().get());
    ASSERT_TRUE(record);
    const SHA1Digest digest = sha1(record.get(), kKextBatteryModelSize);
    EXPECT_EQ(hexString(digest.data(), digest.size()), recordSHA1);
  }
}

}  // namespace
}  // namespace kolvrand
