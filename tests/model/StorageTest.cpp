// Where decoded lists live: room lent from one array per decode, which every
// message that uses it keeps alive, and which a list leaves as soon as it is
// changed, copied or moved.
#include <gtest/gtest.h>

#include <bit>
#include <memory>
#include <vector>

#include "model/OTAParamRC.h"
#include "tests/model/Support.h"

namespace kolvrand {
namespace {

using test::decode;
using test::list;
using V = std::vector<float>;

std::vector<uint8_t> sampleBytes(V grid, bool withR0 = true) {
  OTAParamRC m;
  m.setGridOCVs(grid.data(), grid.size());
  if (!withR0) return m.data();
  auto r0 = std::make_shared<OTAResistanceData>();
  r0->setResistance25Cs(V{1, 2, 3}.data(), 3);
  r0->setTemperatureCoeffs(V{4, 5}.data(), 2);
  m.setR0(r0);
  return m.data();
}

TEST(DecodedLists, OutliveTheDecodeAndLeaveTheirRoomWhenChanged) {
  const std::vector<uint8_t> bytes = sampleBytes({6, 7, 8, 9});
  std::shared_ptr<OTAResistanceData> r0;
  {
    OTAParamRC m;
    ASSERT_TRUE(decode(m, bytes));
    r0 = m.r0();
  }
  // The root and the input are gone; the table's lent room is not.
  EXPECT_EQ(list(r0->resistance25Cs(), r0->resistance25CsCount()), (V{1, 2, 3}));
  EXPECT_EQ(list(r0->temperatureCoeffs(), r0->temperatureCoeffsCount()), (V{4, 5}));
  // A self-merge doubles a lent list.
  r0->mergeFrom(*r0);
  EXPECT_EQ(list(r0->resistance25Cs(), r0->resistance25CsCount()), (V{1, 2, 3, 1, 2, 3}));

  // Growing moves a list to an array of its own; the room it left is not
  // handed out again, so the neighbouring list is untouched.
  OTAParamRC m;
  ASSERT_TRUE(decode(m, bytes));
  const float* lent = m.gridOCVs();
  m.addGridOCV(10);
  EXPECT_NE(m.gridOCVs(), lent);
  EXPECT_EQ(list(m.gridOCVs(), m.gridOCVsCount()), (V{6, 7, 8, 9, 10}));
  EXPECT_EQ(list(m.r0()->resistance25Cs(), 3), (V{1, 2, 3}));

  // Copies share nothing with the decoded message; assigning from the list's
  // own elements, and clearing, let the room go.
  OTAParamRC again;
  ASSERT_TRUE(decode(again, bytes));
  std::shared_ptr<OTAParamRC> copy = again.copy();
  EXPECT_NE(copy->gridOCVs(), again.gridOCVs());
  EXPECT_TRUE(copy->isEqual(&again));
  again.setGridOCVs(again.gridOCVs() + 1, 2);
  EXPECT_EQ(list(again.gridOCVs(), again.gridOCVsCount()), (V{7, 8}));
  again.clearGridOCVs();
  EXPECT_EQ(again.gridOCVs(), nullptr);
  EXPECT_EQ(list(copy->gridOCVs(), copy->gridOCVsCount()), (V{6, 7, 8, 9}));

  // A second decode into the same message: its lists take arrays of their
  // own, and what the first decode lent stays valid.
  OTAParamRC twice;
  ASSERT_TRUE(decode(twice, bytes));
  ASSERT_TRUE(decode(twice, sampleBytes({11, 12}, false)));
  EXPECT_EQ(list(twice.gridOCVs(), twice.gridOCVsCount()), (V{6, 7, 8, 9, 11, 12}));
  EXPECT_EQ(list(twice.r0()->temperatureCoeffs(), 2), (V{4, 5}));
}

TEST(PBRepeatedFloat, AMovedOrCopiedListOwnsItsElements) {
  for (bool move : {true, false}) {
    PBRepeatedFloat target;
    {
      std::vector<float> room(3);
      PBRepeatedFloat lent;
      lent.lend(room.data(), room.size());
      float* out = lent.appendUninitialized(2);
      out[0] = 1, out[1] = 2;
      EXPECT_EQ(lent.elements(), room.data());
      target = move ? std::move(lent) : lent;
      EXPECT_NE(target.elements(), room.data());
    }  // the room is gone; the target is not
    EXPECT_EQ(list(target.elements(), target.size()), (V{1, 2})) << move;
  }
  // An owned array moves as is.
  PBRepeatedFloat a, b;
  b.add(7);
  const float* array = b.elements();
  a = std::move(b);
  EXPECT_EQ(a.elements(), array);
  EXPECT_TRUE(b.empty());
}

// Unpacked runs are read many entries at a time: every run length, with one-
// and two-byte tags, cut at every byte, must give what reading the entries
// one by one gives: each whole entry, then 0.0 and failure for an entry whose
// tag is whole but whose value is cut.
TEST(DecodedLists, UnpackedRunsOfEveryLengthCutAnywhere) {
  for (bool twoByteTag : {false, true}) {
    // agingCoeffForR0 is field 9, gridOCV field 19.
    const std::vector<uint8_t> tag =
        twoByteTag ? std::vector<uint8_t>{0x9D, 0x01} : std::vector<uint8_t>{0x4D};
    const size_t stride = tag.size() + 4;
    for (size_t length = 1; length <= 17; ++length) {
      std::vector<uint8_t> bytes;
      for (size_t i = 0; i < length; ++i) {
        bytes.insert(bytes.end(), tag.begin(), tag.end());
        const uint32_t bits = std::bit_cast<uint32_t>(static_cast<float>(i) + 0.5f);
        for (int b = 0; b < 4; ++b) bytes.push_back(static_cast<uint8_t>(bits >> (8 * b)));
      }
      for (size_t cut = 0; cut <= bytes.size(); ++cut) {
        V expected;
        for (size_t i = 0; i < cut / stride; ++i) expected.push_back(static_cast<float>(i) + 0.5f);
        if (cut % stride >= tag.size()) expected.push_back(0.0f);
        OTAParamRC m;
        const bool ok = decode(m, std::vector<uint8_t>(bytes.begin(), bytes.begin() + cut));
        const V got = twoByteTag ? list(m.gridOCVs(), m.gridOCVsCount())
                                 : list(m.agingCoeffForR0s(), m.agingCoeffForR0sCount());
        EXPECT_EQ(got, expected) << "tag " << tag.size() << " length " << length << " cut " << cut;
        EXPECT_EQ(ok, cut % stride == 0) << "tag " << tag.size() << " length " << length;
      }
    }
  }
}

}  // namespace
}  // namespace kolvrand
