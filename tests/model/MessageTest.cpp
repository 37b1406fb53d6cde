// SPDX-License-Identifier: MIT
// Messages as values: copying, merging, equality and hashing, enum names, and
// where decoded lists live; decoding of unusual and broken input. (Encoding,
// decoding and the dictionary form are checked against libprotobuf in the
// oracle test.)
#include <gmock/gmock.h>

#include <bit>
#include <fstream>
#include <limits>
#include <memory>
#include <sstream>
#include <tuple>
#include <vector>

#include "model/FloatHash.h"
#include "model/NSRangeException.h"
#include "model/OTAParamRC.h"
#include "tests/model/Support.h"

namespace kolvrand {
namespace {

using test::decode;
using test::list;
using V = std::vector<float>;

std::shared_ptr<OTAResistanceData> table(V r25) {
  auto t = std::make_shared<OTAResistanceData>();
  t->setResistance25Cs(r25.data(), r25.size());
  return t;
}

V r25(const std::shared_ptr<OTAResistanceData>& t) {
  return list(t->resistance25Cs(), t->resistance25CsCount());
}

V grid(const OTAParamRC& m) {
  return list(m.gridOCVs(), m.gridOCVsCount());
}

TEST(OTAParamRC, CopyToSharesCopyIsIndependentMergeRecursesAndAppends) {
  OTAParamRC source, shallow, receiver;
  source.setR0(table({1}));
  source.setChemID(3);
  source.addGridOCV(2);
  source.setMLBConfig(1);
  const std::string text = source.description();
  EXPECT_TRUE(text.starts_with("<OTAParamRC: ") &&
              text.ends_with("> " + source.dictionaryRepresentation().description()))
      << text;

  // What the source has replaces, the rest stays; sub-messages are shared.
  shallow.setR2(table({2}));
  shallow.setMaxRdcRatio(4);
  shallow.addGridOCV(9);
  source.copyTo(shallow);
  EXPECT_EQ(std::tuple(shallow.r0(), shallow.hasR2(), shallow.maxRdcRatio(), grid(shallow),
                       shallow.chemID()),
            std::tuple(source.r0(), true, 4.0f, V{2}, 3u));
  // A deep copy (whose equality and hash the oracle test checks on random
  // models) shares nothing: see the end.
  auto deep = source.copy();

  // Merging recurses into a present sub-message, shares an absent one, and
  // appends lists, also a list to itself.
  auto receiverR0 = table({5});
  receiver.setR0(receiverR0);
  receiver.setChemID(9);
  receiver.addGridOCV(1);
  source.setBmuResistance(std::make_shared<OTABMUResistance>());
  receiver.mergeFrom(source);
  EXPECT_EQ(std::tuple(receiver.r0(), r25(receiver.r0()), receiver.bmuResistance()),
            std::tuple(receiverR0, V{5, 1}, source.bmuResistance()));
  receiver.mergeFrom(receiver);
  EXPECT_EQ(std::tuple(receiver.chemID(), grid(receiver), receiver.mLBConfig()),
            std::tuple(3u, V{1, 2, 1, 2}, 1));

  // A later change through the source shows in the shallow copy only.
  source.r0()->addResistance25C(5);
  EXPECT_EQ(std::tuple(r25(shallow.r0()), r25(deep->r0()), deep->isEqual(&source)),
            std::tuple(V{1, 5}, V{1}, false));
}

TEST(OTAParamRC, EqualityHashAndBytesIgnoreValuesBehindClearBits) {
  constexpr uint64_t K = kPBHashMultiplier;
  OTAParamRC a, b;
  a.setChemID(1);
  // The empty lists hash alike and cancel out.
  EXPECT_EQ(std::tuple(a.hash(), a.isEqual(&b)), std::tuple(K, false));
  b.setChemID(1);
  a.setMaxRdcRatio(3);
  a.setHasMaxRdcRatio(false);
  a.setMLBConfig(1);
  a.setHasMLBConfig(false);
  EXPECT_EQ(std::tuple(a.isEqual(&b), a.data(), a.hash()), std::tuple(true, b.data(), b.hash()));
  a.setR3(std::make_shared<OTAResistanceData>());
  EXPECT_FALSE(a.isEqual(&b) || b.isEqual(&a));
  b.setR3(std::make_shared<OTAResistanceData>());
  a.setMLBConfig(-1);
  b.setMLBConfig(-1);
  EXPECT_EQ(std::tuple(a.isEqual(&b), a.hash()), std::tuple(true, K ^ (uint64_t{0} - K)));
  struct Derived : OTAParamRC {};
  Derived d;
  EXPECT_FALSE(OTAParamRC().isEqual(&d) || a.isEqual(nullptr));

  // Hash of a float: by the rounding rule, with no undefined conversion.
  std::vector<uint64_t> hashes;
  for (float f : {-0.0f, 1.5f, -1.25f, std::numeric_limits<float>::quiet_NaN(),
                  std::numeric_limits<float>::max()})
    hashes.push_back(PBFloatHash(f));
  EXPECT_EQ(hashes, (std::vector<uint64_t>{0, 2 * K, K + (uint64_t{1} << 62), 0, 0}));
}

TEST(OTAParamRC, MLBConfigNamesAndRangeErrors) {
  const std::pair<int32_t, const char*> names[] = {
      {0, "kKVRRegularMLB"}, {1, "kKVRNorthSouthSplitMLB"}, {-1, "(unknown: -1)"}};
  for (auto [value, name] : names) {
    EXPECT_EQ(OTAParamRC::mLBConfigAsString(value), name);
    EXPECT_EQ(OTAParamRC::StringAsMLBConfig(name), value == 1 ? 1 : 0);
  }
  EXPECT_EQ(OTAParamRC::StringAsMLBConfig("kkvrnorthsouthsplitmlb"), 0);
  EXPECT_EQ(OTAParamRC::StringAsMLBConfig(std::nullopt), 0);

  auto t = table({1, 2, 3});
  EXPECT_EQ(t->resistance25CAtIndex(2), 3.0f);
  EXPECT_THAT([&] { t->resistance25CAtIndex(3); },
              testing::Throws<NSRangeException>(
                  testing::Property(&NSRangeException::reason, "idx (3) is out of range (3)")));
}

// Decoded lists live in room lent from one array per decode, which every
// message that uses it keeps alive, and which a list leaves as soon as it is
// changed, copied or moved.
TEST(DecodedLists, OutliveTheDecodeAndLeaveTheirRoomWhenChanged) {
  OTAParamRC sample;
  sample.setGridOCVs(V{6, 7, 8, 9}.data(), 4);
  sample.setR0(table({1, 2, 3}));
  sample.r0()->setTemperatureCoeffs(V{4, 5}.data(), 2);
  auto m = std::make_unique<OTAParamRC>();
  ASSERT_TRUE(decode(*m, sample.data()));
  std::shared_ptr<OTAResistanceData> r0 = m->r0();
  std::shared_ptr<OTAParamRC> copy = m->copy();
  EXPECT_NE(copy->gridOCVs(), m->gridOCVs());

  // A second decode into the same message: its lists take arrays of their
  // own, and what the first decode lent stays valid.
  ASSERT_TRUE(decode(*m, test::fromHex("4D 00 00 30 41")));
  EXPECT_EQ(std::tuple(grid(*m), list(m->agingCoeffForR0s(), m->agingCoeffForR0sCount())),
            std::tuple(V{6, 7, 8, 9}, V{11}));

  // Growing moves a list to an array of its own; the room it left is not
  // handed out again, so the neighbouring list is untouched. Assigning from
  // the list's own elements and clearing work on any list.
  const float* lent = m->gridOCVs();
  m->addGridOCV(10);
  EXPECT_NE(m->gridOCVs(), lent);
  EXPECT_EQ(std::tuple(grid(*m), r25(r0)), std::tuple(V{6, 7, 8, 9, 10}, V{1, 2, 3}));
  m->setGridOCVs(m->gridOCVs() + 1, 2);
  EXPECT_EQ(grid(*m), (V{7, 8}));
  m->clearGridOCVs();
  EXPECT_EQ(m->gridOCVs(), nullptr);

  // The root and the input are gone; the table's lent room is not. A
  // self-merge doubles a lent list.
  m.reset();
  r0->mergeFrom(*r0);
  EXPECT_EQ(std::tuple(r25(r0), list(r0->temperatureCoeffs(), 2), grid(*copy)),
            std::tuple(V{1, 2, 3, 1, 2, 3}, V{4, 5}, V{6, 7, 8, 9}));
}

// Moving a list that holds lent room copies its elements to an array of its
// own.
TEST(PBRepeatedFloat, AMovedListOwnsItsElements) {
  PBRepeatedFloat target;
  {
    std::vector<float> room(3);
    PBRepeatedFloat lent;
    lent.lend(room.data(), room.size());
    lent.add(1);
    target = std::move(lent);
    EXPECT_NE(target.elements(), room.data());
  }  // the room is gone; the target is not
  EXPECT_EQ(list(target.elements(), target.size()), V{1});
}

// Unpacked runs are read many entries at a time: a run of every length, with
// one- and two-byte tags (agingCoeffForR0 is field 9, gridOCV field 19), cut
// at every byte (a run cut at a byte is all a shorter one can be), must give
// what reading the entries one by one gives: each whole entry, then 0.0 and
// failure for an entry whose tag is whole but whose value is cut.
TEST(DecodedLists, UnpackedRunsCutAnywhere) {
  for (const std::vector<uint8_t>& tag : {std::vector<uint8_t>{0x4D}, {0x9D, 0x01}}) {
    const size_t stride = tag.size() + 4;
    std::vector<uint8_t> bytes;
    for (uint8_t i = 0; i < 17; ++i) {
      bytes.insert(bytes.end(), tag.begin(), tag.end());
      bytes.insert(bytes.end(), {i, 0, 0, 0x40});
    }
    for (size_t cut = 0; cut <= bytes.size(); ++cut) {
      V expected;
      for (uint32_t i = 0; i < cut / stride; ++i)
        expected.push_back(std::bit_cast<float>(0x40000000 | i));
      if (cut % stride >= tag.size()) expected.push_back(0.0f);
      OTAParamRC m;
      const bool ok = decode(m, std::vector<uint8_t>(bytes.begin(), bytes.begin() + cut));
      const V got =
          tag.size() == 2 ? grid(m) : list(m.agingCoeffForR0s(), m.agingCoeffForR0sCount());
      EXPECT_EQ(std::tuple(got, ok), std::tuple(expected, cut % stride == 0))
          << "tag " << tag.size() << " cut " << cut;
    }
  }
}

// Decoding of valid, unusual and broken input, seen through what the message
// encodes afterwards; the cases are in wire_cases.txt beside this file.
TEST(OTAParamRCWire, ReadsAndWritesAgain) {
  std::ifstream file(KOLVRAND_SOURCE_DIR "/tests/model/wire_cases.txt");
  ASSERT_TRUE(file);
  for (std::string line; std::getline(file, line);) {
    if (line.empty() || line[0] == '#') continue;
    SCOPED_TRACE(line);
    std::istringstream row(line);
    std::string verdict, input, written;
    std::getline(row >> verdict, input, '/');
    std::getline(row, written);
    OTAParamRC m;
    EXPECT_EQ(test::decode(m, test::fromHex(input)), verdict == "ok");
    EXPECT_EQ(m.data(), test::fromHex(written));
    EXPECT_EQ(m.encodedSize(), m.data().size());
  }
}

// An end-group tag with no group open, which a message read never passes on,
// is refused. (How deep groups may nest is in the hostile-input table.)
TEST(PBReaderSkipValueWithTag, RefusesAStrayEnd) {
  PBDataReader empty(nullptr, 0);
  EXPECT_FALSE(PBReaderSkipValueWithTag(empty, 7, wire::kEndGroup));
}

}  // namespace
}  // namespace kolvrand
