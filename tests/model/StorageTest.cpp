// Where decoded lists live: room lent from one array per decode, which every
// message that uses it keeps alive, and which a list leaves as soon as it is
// changed, copied or moved.
#include <gtest/gtest.h>

#include <memory>
#include <vector>

#include "model/OTAParamRC.h"
#include "tests/model/Support.h"

namespace kolvrand {
namespace {

using test::decode;
using test::list;

std::shared_ptr<OTAParamRC> sampleModel() {
  auto m = std::make_shared<OTAParamRC>();
  auto r0 = std::make_shared<OTAResistanceData>();
  const float r25[] = {1, 2, 3}, tc[] = {4, 5};
  r0->setResistance25Cs(r25, 3);
  r0->setTemperatureCoeffs(tc, 2);
  m->setR0(r0);
  const float grid[] = {6, 7, 8, 9};
  m->setGridOCVs(grid, 4);
  m->setChemID(0x2168);
  return m;
}

TEST(DecodedLists, OutliveTheMessageTheyWereDecodedWith) {
  const std::vector<uint8_t> bytes = sampleModel()->data();
  std::shared_ptr<OTAResistanceData> r0;
  {
    OTAParamRC m;
    ASSERT_TRUE(decode(m, bytes));
    r0 = m.r0();
  }
  // The root and the input are gone; the table's lent room is not.
  EXPECT_EQ(list(r0->resistance25Cs(), r0->resistance25CsCount()), (std::vector<float>{1, 2, 3}));
  EXPECT_EQ(list(r0->temperatureCoeffs(), r0->temperatureCoeffsCount()),
            (std::vector<float>{4, 5}));
}

TEST(DecodedLists, LeaveTheirRoomWhenChangedOrCopied) {
  const std::vector<uint8_t> bytes = sampleModel()->data();
  OTAParamRC m;
  ASSERT_TRUE(decode(m, bytes));
  const float* lent = m.gridOCVs();
  const std::vector<float> grid{6, 7, 8, 9};

  // Growing moves the list to an array of its own; the room it left is not
  // handed out again, so the neighbouring list is untouched.
  m.addGridOCV(10);
  EXPECT_NE(m.gridOCVs(), lent);
  EXPECT_EQ(list(m.gridOCVs(), m.gridOCVsCount()), (std::vector<float>{6, 7, 8, 9, 10}));
  EXPECT_EQ(list(m.r0()->resistance25Cs(), 3), (std::vector<float>{1, 2, 3}));

  // Copies share nothing with the decoded message.
  OTAParamRC again;
  ASSERT_TRUE(decode(again, bytes));
  std::shared_ptr<OTAParamRC> copy = again.copy();
  EXPECT_NE(copy->gridOCVs(), again.gridOCVs());
  EXPECT_TRUE(copy->isEqual(&again));

  // Assigning from the list's own elements, and clearing, let the room go.
  again.setGridOCVs(again.gridOCVs() + 1, 2);
  EXPECT_EQ(list(again.gridOCVs(), again.gridOCVsCount()), (std::vector<float>{7, 8}));
  again.clearGridOCVs();
  EXPECT_EQ(again.gridOCVs(), nullptr);
  EXPECT_EQ(list(copy->gridOCVs(), copy->gridOCVsCount()), grid);
}

TEST(DecodedLists, SelfMergeDoublesALentList) {
  OTAParamRC m;
  ASSERT_TRUE(decode(m, sampleModel()->data()));
  std::shared_ptr<OTAResistanceData> r0 = m.r0();
  r0->mergeFrom(*r0);
  EXPECT_EQ(list(r0->resistance25Cs(), r0->resistance25CsCount()),
            (std::vector<float>{1, 2, 3, 1, 2, 3}));
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
      if (move)
        target = std::move(lent);
      else
        target = lent;
      EXPECT_NE(target.elements(), room.data());
      // The room is gone after this scope; the target is not.
    }
    EXPECT_EQ(list(target.elements(), target.size()), (std::vector<float>{1, 2})) << move;
  }
  // An owned array moves as is.
  PBRepeatedFloat a, b;
  b.add(7);
  const float* array = b.elements();
  a = std::move(b);
  EXPECT_EQ(a.elements(), array);
  EXPECT_TRUE(b.empty());
}

TEST(DecodedLists, ReadingAgainIntoTheSameMessageKeepsBothDecodes) {
  // The second reader's array is not the one the message holds: its lists
  // take arrays of their own, and what the first decode lent stays valid.
  OTAParamRC m;
  ASSERT_TRUE(decode(m, sampleModel()->data()));
  auto second = sampleModel();
  const float more[] = {11, 12};
  second->setGridOCVs(more, 2);
  second->setR0(nullptr);
  ASSERT_TRUE(decode(m, second->data()));
  EXPECT_EQ(list(m.gridOCVs(), m.gridOCVsCount()), (std::vector<float>{6, 7, 8, 9, 11, 12}));
  EXPECT_EQ(list(m.r0()->temperatureCoeffs(), 2), (std::vector<float>{4, 5}));
}

// Unpacked runs are read many entries at a time: every run length, with one-
// and two-byte tags, cut at every byte, must give what reading the entries
// one by one gives: each whole entry, then 0.0 and failure for an entry whose
// tag is whole but whose value is cut.
TEST(DecodedLists, UnpackedRunsOfEveryLengthCutAnywhere) {
  for (uint32_t field : {1u, 19u}) {
    for (size_t length = 1; length <= 17; ++length) {
      std::vector<float> values(length);
      for (size_t i = 0; i < length; ++i) values[i] = static_cast<float>(i) + 0.5f;
      std::vector<uint8_t> bytes;
      if (field == 1) {
        OTAResistanceData t;
        t.setResistance25Cs(values.data(), length);
        bytes = t.data();
      } else {
        OTAParamRC m;
        m.setGridOCVs(values.data(), length);
        bytes = m.data();  // chemID (field 18), then the list
      }
      const size_t tagSize = field == 1 ? 1 : 2, stride = tagSize + 4;
      const size_t start = bytes.size() - length * stride;
      for (size_t cut = 0; cut <= length * stride; ++cut) {
        const std::vector<uint8_t> prefix(bytes.begin(), bytes.begin() + start + cut);
        std::vector<float> expected(values.begin(), values.begin() + cut / stride);
        const bool cutValue = cut % stride >= tagSize;
        if (cutValue) expected.push_back(0.0f);
        std::vector<float> got;
        bool ok;
        if (field == 1) {
          OTAResistanceData t;
          ok = decode(t, prefix);
          got = list(t.resistance25Cs(), t.resistance25CsCount());
        } else {
          OTAParamRC m;
          ok = decode(m, prefix);
          got = list(m.gridOCVs(), m.gridOCVsCount());
        }
        EXPECT_EQ(got, expected) << "field " << field << " length " << length << " cut " << cut;
        EXPECT_EQ(ok, cut % stride == 0) << "field " << field << " length " << length;
      }
    }
  }
}

}  // namespace
}  // namespace kolvrand
