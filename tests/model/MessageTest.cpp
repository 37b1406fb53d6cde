// Messages as values: copying, merging, equality, hashing, dictionary form.
#include <gtest/gtest.h>

#include <limits>
#include <memory>
#include <vector>

#include "model/FloatHash.h"
#include "model/NSRangeException.h"
#include "model/OTAParamRC.h"
#include "tests/model/Support.h"

namespace kolvrand {
namespace {

using test::list;

constexpr uint64_t K = kPBHashMultiplier;

std::shared_ptr<OTAResistanceData> table(std::vector<float> r25) {
  auto t = std::make_shared<OTAResistanceData>();
  t->setResistance25Cs(r25.data(), r25.size());
  return t;
}

std::vector<float> r25(const std::shared_ptr<OTAResistanceData>& t) {
  return list(t->resistance25Cs(), t->resistance25CsCount());
}

TEST(PBFloatHash, FollowsTheRoundingRule) {
  const struct {
    float value;
    uint64_t hash;
  } cases[] = {
      {0.0f, 0},
      {-0.0f, 0},
      {1.5f, 2 * K},  // 1.5 - 2 is negative: no fraction term
      {1.25f, K + (uint64_t{1} << 62)},
      {-1.25f, K + (uint64_t{1} << 62)},
      {std::numeric_limits<float>::quiet_NaN(), 0},
      {std::numeric_limits<float>::infinity(), 0},
      // Multiples of 2^64 reduce to 0, with no undefined conversion on the way.
      {18446744073709551616.0f, 0},
      {std::numeric_limits<float>::max(), 0},
  };
  for (const auto& c : cases) EXPECT_EQ(PBFloatHash(c.value), c.hash) << c.value;
}

TEST(PBRepeatedFloat, OutOfRangeIndexThrowsWithReason) {
  OTAResistanceData t;
  const float values[] = {1, 2, 3};
  t.setResistance25Cs(values, 3);
  EXPECT_EQ(t.resistance25CAtIndex(2), 3.0f);
  try {
    t.resistance25CAtIndex(3);
    FAIL() << "no exception";
  } catch (const NSRangeException& e) {
    EXPECT_EQ(e.reason(), "idx (3) is out of range (3)");
    EXPECT_STREQ(e.what(), "idx (3) is out of range (3)");
  }
  t.clearResistance25Cs();
  EXPECT_EQ(t.resistance25Cs(), nullptr);
  EXPECT_THROW(t.resistance25CAtIndex(0), NSRangeException);
}

TEST(OTAResistanceData, CopyToReplacesOnlyNonEmptyListsAndMergeAppends) {
  OTAResistanceData source, target;
  source.addResistance25C(1);
  target.addResistance25C(9);
  target.addTemperatureCoeff(3);
  source.copyTo(target);
  EXPECT_EQ(list(target.resistance25Cs(), target.resistance25CsCount()), std::vector<float>{1});
  EXPECT_EQ(list(target.temperatureCoeffs(), target.temperatureCoeffsCount()),
            std::vector<float>{3});

  source.addTemperatureCoeff(2);
  target.mergeFrom(source);
  EXPECT_EQ(list(target.temperatureCoeffs(), target.temperatureCoeffsCount()),
            (std::vector<float>{3, 2}));
  // Lists that alias themselves.
  target.mergeFrom(target);
  EXPECT_EQ(list(target.temperatureCoeffs(), target.temperatureCoeffsCount()),
            (std::vector<float>{3, 2, 3, 2}));
  target.setTemperatureCoeffs(target.temperatureCoeffs() + 1, 2);
  EXPECT_EQ(list(target.temperatureCoeffs(), target.temperatureCoeffsCount()),
            (std::vector<float>{2, 3}));
}

TEST(OTAResistanceData, EqualityRequiresTheExactClass) {
  struct Derived : OTAResistanceData {};
  OTAResistanceData a;
  Derived b;
  EXPECT_TRUE(a.isEqual(&a));
  EXPECT_FALSE(a.isEqual(&b));
  EXPECT_FALSE(b.isEqual(&a));
  EXPECT_FALSE(a.isEqual(nullptr));
  a.addResistance25C(-0.0f);
  OTAResistanceData c;
  c.addResistance25C(0.0f);
  EXPECT_TRUE(a.isEqual(&c));
  EXPECT_EQ(a.hash(), c.hash());
}

TEST(OTABMUResistance, ValueBehindAClearBitTakesNoPart) {
  OTABMUResistance a, b;
  a.setTraceResistance25C(5);
  a.setHasTraceResistance25C(false);
  a.setDownstreamNorthResistance(1);
  b.setDownstreamNorthResistance(1);
  EXPECT_EQ(a.traceResistance25C(), 5.0f);
  EXPECT_EQ(a.data(), b.data());
  EXPECT_TRUE(a.isEqual(&b));
  EXPECT_EQ(a.hash(), PBFloatHash(1));
  EXPECT_EQ(a.hash(), b.hash());
  const Value dictionary = a.dictionaryRepresentation();
  const Dictionary& d = *dictionary.asDictionary();
  EXPECT_EQ(d.size(), 1u);
  EXPECT_EQ(*d.find("downstreamNorthResistance"), Value(Number::fromFloat(1)));

  OTABMUResistance source;
  source.setDownstreamNorthResistance(7);
  b.setTraceResistance25C(2);
  b.mergeFrom(source);
  EXPECT_EQ(b.traceResistance25C(), 2.0f);
  EXPECT_EQ(b.downstreamNorthResistance(), 7.0f);
}

TEST(OTAParamRC, EmptyDictionaryHasTheListsAndChemID) {
  OTAParamRC m;
  const Value empty = m.dictionaryRepresentation();
  const Dictionary& d = *empty.asDictionary();
  EXPECT_EQ(d.size(), 23u);
  EXPECT_EQ(*d.find("chemID"), Value(Number::fromUnsigned(0)));
  EXPECT_EQ(*d.find("gridOCV"), Value(Array{}));
  EXPECT_EQ(*d.find("agingCoeffForRCFreq4TemperatureCoeff"), Value(Array{}));
  for (const char* absent : {"R0", "bmuResistance", "maxRdcRatio", "baselineWRdc", "MLBConfig"})
    EXPECT_EQ(d.find(absent), nullptr) << absent;

  m.setChemID(0x1234);
  m.setBmuResistance(std::make_shared<OTABMUResistance>());
  m.addGridOCV(1.5f);
  const std::string text = m.description();
  EXPECT_EQ(text.rfind("<OTAParamRC: 0x", 0), 0u) << text;
  EXPECT_NE(text.find("> " + m.dictionaryRepresentation().description()), std::string::npos);
  const Value filled = m.dictionaryRepresentation();
  const Dictionary& e = *filled.asDictionary();
  EXPECT_EQ(*e.find("bmuResistance"), Value(Dictionary{}));
  EXPECT_EQ(*e.find("gridOCV"), Value(Array{Number::fromFloat(1.5f)}));
}

TEST(OTAParamRC, MLBConfigNamesAndDefault) {
  const struct {
    int32_t value;
    const char* name;
  } names[] = {{0, "kKVRRegularMLB"},
               {1, "kKVRNorthSouthSplitMLB"},
               {7, "(unknown: 7)"},
               {-1, "(unknown: -1)"}};
  for (const auto& n : names) {
    EXPECT_EQ(OTAParamRC::mLBConfigAsString(n.value), n.name);
    OTAParamRC m;
    m.setMLBConfig(n.value);
    EXPECT_EQ(*m.dictionaryRepresentation().asDictionary()->find("MLBConfig"), Value(n.name));
    m.setHasMLBConfig(false);
    EXPECT_EQ(m.mLBConfig(), 0);
    EXPECT_EQ(m.dictionaryRepresentation().asDictionary()->find("MLBConfig"), nullptr);
  }
  EXPECT_EQ(OTAParamRC::StringAsMLBConfig("kKVRNorthSouthSplitMLB"), 1);
  EXPECT_EQ(OTAParamRC::StringAsMLBConfig("kKVRRegularMLB"), 0);
  EXPECT_EQ(OTAParamRC::StringAsMLBConfig("kkvrnorthsouthsplitmlb"), 0);
  EXPECT_EQ(OTAParamRC::StringAsMLBConfig(""), 0);
  EXPECT_EQ(OTAParamRC::StringAsMLBConfig(std::nullopt), 0);
}

TEST(OTAParamRC, CopyToSharesAndCopyIsIndependent) {
  OTAParamRC source;
  source.setR1(table({1}));
  source.setChemID(3);

  OTAParamRC shallow;
  shallow.setR2(table({2}));
  shallow.setMaxRdcRatio(4);
  source.copyTo(shallow);
  EXPECT_EQ(shallow.r1(), source.r1());
  EXPECT_TRUE(shallow.hasR2());
  EXPECT_TRUE(shallow.hasMaxRdcRatio());
  EXPECT_EQ(shallow.chemID(), 3u);

  auto deep = source.copy();
  EXPECT_TRUE(deep->isEqual(&source));
  EXPECT_EQ(deep->hash(), source.hash());
  EXPECT_NE(deep->r1(), source.r1());
  source.r1()->addResistance25C(5);
  EXPECT_EQ(r25(shallow.r1()), (std::vector<float>{1, 5}));
  EXPECT_EQ(r25(deep->r1()), std::vector<float>{1});
  EXPECT_FALSE(deep->isEqual(&source));
}

TEST(OTAParamRC, MergeIsRecursiveSharesNewSubMessagesAndTakesChemID) {
  OTAParamRC receiver, source;
  auto receiverR0 = table({2});
  receiver.setR0(receiverR0);
  receiver.setChemID(9);
  receiver.addGridOCV(1);
  source.setR0(table({1}));
  source.setBmuResistance(std::make_shared<OTABMUResistance>());
  source.addGridOCV(2);
  source.setMLBConfig(1);
  receiver.mergeFrom(source);
  EXPECT_EQ(receiver.r0(), receiverR0);
  EXPECT_EQ(r25(receiver.r0()), (std::vector<float>{2, 1}));
  EXPECT_EQ(receiver.bmuResistance(), source.bmuResistance());
  EXPECT_EQ(receiver.chemID(), 0u);
  EXPECT_EQ(list(receiver.gridOCVs(), receiver.gridOCVsCount()), (std::vector<float>{1, 2}));
  EXPECT_EQ(receiver.mLBConfig(), 1);
}

TEST(OTAParamRC, EqualityAndHash) {
  OTAParamRC a, b;
  a.setChemID(1);
  EXPECT_EQ(a.hash(), K);  // the 22 empty lists hash alike and cancel out
  EXPECT_FALSE(a.isEqual(&b));
  b.setChemID(1);
  a.setMaxRdcRatio(3);
  a.setHasMaxRdcRatio(false);
  EXPECT_TRUE(a.isEqual(&b));
  EXPECT_EQ(a.hash(), b.hash());
  a.setR3(std::make_shared<OTAResistanceData>());
  EXPECT_FALSE(a.isEqual(&b));
  EXPECT_FALSE(b.isEqual(&a));
  b.setR3(std::make_shared<OTAResistanceData>());
  a.setMLBConfig(-1);
  b.setMLBConfig(-1);
  EXPECT_TRUE(a.isEqual(&b));
  EXPECT_EQ(a.hash(), K ^ (uint64_t{0} - K));
}

}  // namespace
}  // namespace kolvrand
