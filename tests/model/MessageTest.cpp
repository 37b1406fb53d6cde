// Messages as values: copying, merging, equality and hashing, enum names.
// (Encoding, decoding and the dictionary form are checked against
// libprotobuf in the oracle test.)
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

std::shared_ptr<OTAResistanceData> table(std::vector<float> r25) {
  auto t = std::make_shared<OTAResistanceData>();
  t->setResistance25Cs(r25.data(), r25.size());
  return t;
}

std::vector<float> r25(const std::shared_ptr<OTAResistanceData>& t) {
  return list(t->resistance25Cs(), t->resistance25CsCount());
}

TEST(OTAParamRC, CopyToSharesCopyIsIndependentMergeRecursesAndAppends) {
  OTAParamRC source;
  source.setR0(table({1}));
  source.setChemID(3);
  source.addGridOCV(2);
  source.setMLBConfig(1);

  OTAParamRC shallow;
  shallow.setR2(table({2}));
  shallow.setMaxRdcRatio(4);
  shallow.addGridOCV(9);
  source.copyTo(shallow);
  EXPECT_EQ(shallow.r0(), source.r0());
  EXPECT_TRUE(shallow.hasR2());
  EXPECT_EQ(shallow.maxRdcRatio(), 4.0f);
  EXPECT_EQ(list(shallow.gridOCVs(), shallow.gridOCVsCount()), std::vector<float>{2});
  EXPECT_EQ(shallow.chemID(), 3u);

  auto deep = source.copy();
  EXPECT_TRUE(deep->isEqual(&source));
  EXPECT_EQ(deep->hash(), source.hash());
  EXPECT_NE(deep->r0(), source.r0());

  OTAParamRC receiver;
  auto receiverR0 = table({5});
  receiver.setR0(receiverR0);
  receiver.setChemID(9);
  receiver.addGridOCV(1);
  source.setBmuResistance(std::make_shared<OTABMUResistance>());
  receiver.mergeFrom(source);
  EXPECT_EQ(receiver.r0(), receiverR0);
  EXPECT_EQ(r25(receiver.r0()), (std::vector<float>{5, 1}));
  EXPECT_EQ(receiver.bmuResistance(), source.bmuResistance());
  EXPECT_EQ(receiver.chemID(), 3u);
  EXPECT_EQ(list(receiver.gridOCVs(), receiver.gridOCVsCount()), (std::vector<float>{1, 2}));
  EXPECT_EQ(receiver.mLBConfig(), 1);
  // A list merged into itself.
  receiver.mergeFrom(receiver);
  EXPECT_EQ(list(receiver.gridOCVs(), receiver.gridOCVsCount()), (std::vector<float>{1, 2, 1, 2}));

  // A later change through the source shows in the shallow copy only.
  source.r0()->addResistance25C(5);
  EXPECT_EQ(r25(shallow.r0()), (std::vector<float>{1, 5}));
  EXPECT_EQ(r25(deep->r0()), std::vector<float>{1});
  EXPECT_FALSE(deep->isEqual(&source));
}

TEST(OTAParamRC, EqualityAndHashIgnoreValuesBehindClearBits) {
  constexpr uint64_t K = kPBHashMultiplier;
  OTAParamRC a, b;
  a.setChemID(1);
  EXPECT_EQ(a.hash(), K);  // the empty lists hash alike and cancel out
  EXPECT_FALSE(a.isEqual(&b));
  b.setChemID(1);
  a.setMaxRdcRatio(3);
  a.setHasMaxRdcRatio(false);
  EXPECT_TRUE(a.isEqual(&b));
  EXPECT_EQ(a.data(), b.data());
  EXPECT_EQ(a.hash(), b.hash());
  a.setR3(std::make_shared<OTAResistanceData>());
  EXPECT_FALSE(a.isEqual(&b));
  EXPECT_FALSE(b.isEqual(&a));
  b.setR3(std::make_shared<OTAResistanceData>());
  a.setMLBConfig(-1);
  b.setMLBConfig(-1);
  EXPECT_TRUE(a.isEqual(&b));
  EXPECT_EQ(a.hash(), K ^ (uint64_t{0} - K));
  struct Derived : OTAParamRC {};
  Derived d;
  EXPECT_FALSE(OTAParamRC().isEqual(&d));
  EXPECT_FALSE(a.isEqual(nullptr));

  // Hash of a float: by the rounding rule, with no undefined conversion.
  const struct {
    float value;
    uint64_t hash;
  } floats[] = {{-0.0f, 0},
                {1.5f, 2 * K},
                {-1.25f, K + (uint64_t{1} << 62)},
                {std::numeric_limits<float>::quiet_NaN(), 0},
                {std::numeric_limits<float>::max(), 0}};
  for (const auto& c : floats) EXPECT_EQ(PBFloatHash(c.value), c.hash) << c.value;
}

TEST(OTAParamRC, MLBConfigNamesAndRangeErrors) {
  const struct {
    int32_t value;
    const char* name;
  } names[] = {{0, "kKVRRegularMLB"}, {1, "kKVRNorthSouthSplitMLB"}, {-1, "(unknown: -1)"}};
  for (const auto& n : names) {
    EXPECT_EQ(OTAParamRC::mLBConfigAsString(n.value), n.name);
    EXPECT_EQ(OTAParamRC::StringAsMLBConfig(n.name), n.value == 1 ? 1 : 0);
  }
  EXPECT_EQ(OTAParamRC::StringAsMLBConfig("kkvrnorthsouthsplitmlb"), 0);
  EXPECT_EQ(OTAParamRC::StringAsMLBConfig(std::nullopt), 0);

  OTAResistanceData t;
  t.setResistance25Cs(std::vector<float>{1, 2, 3}.data(), 3);
  EXPECT_EQ(t.resistance25CAtIndex(2), 3.0f);
  try {
    t.resistance25CAtIndex(3);
    FAIL() << "no exception";
  } catch (const NSRangeException& e) {
    EXPECT_EQ(e.reason(), "idx (3) is out of range (3)");
  }
}

}  // namespace
}  // namespace kolvrand
