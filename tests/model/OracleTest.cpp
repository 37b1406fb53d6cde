// SPDX-License-Identifier: MIT
// Random models against libprotobuf, built from the same schema: what it
// encodes (unpacked or packed) we decode to the same values, and we encode
// them to its very bytes (so it parses ours back to the same values). And
// rcmodel validate's wire check against libprotobuf: whatever our reader
// decodes and libprotobuf rejects or reads otherwise, the check names.
#include <google/protobuf/descriptor.h>
#include <google/protobuf/message.h>
#include <gtest/gtest.h>

#include <fstream>
#include <random>
#include <string>
#include <tuple>

#include "model/OTAParamRC.h"
#include "oracle_packed.pb.h"
#include "oracle_plain.pb.h"
#include "tests/model/Support.h"
#include "tests/support/OracleDictionary.h"
#include "tools/rcmodel/WireCheck.h"

namespace kolvrand {
namespace {

using google::protobuf::FieldDescriptor;

float randomFloat(std::mt19937& rng) {
  // Any bit pattern now and then (NaN payloads, infinities, subnormals
  // included); ordinary magnitudes otherwise.
  if (rng() % 8 == 0) return std::bit_cast<float>(static_cast<uint32_t>(rng()));
  return std::uniform_real_distribution<float>(-1000, 1000)(rng);
}

void fillRandom(google::protobuf::Message& m, std::mt19937& rng) {
  const auto* reflection = m.GetReflection();
  for (int i = 0; i < m.GetDescriptor()->field_count(); ++i) {
    const FieldDescriptor* f = m.GetDescriptor()->field(i);
    const auto type = f->cpp_type();
    if (f->is_repeated()) {
      const int n = rng() % 3 == 0 ? 0 : static_cast<int>(rng() % 40);
      for (int k = 0; k < n; ++k) reflection->AddFloat(&m, f, randomFloat(rng));
    } else if (type == FieldDescriptor::CPPTYPE_MESSAGE) {
      if (rng() % 4) fillRandom(*reflection->MutableMessage(&m, f), rng);
    } else if (type == FieldDescriptor::CPPTYPE_FLOAT) {
      if (rng() % 2) reflection->SetFloat(&m, f, randomFloat(rng));
    } else if (type == FieldDescriptor::CPPTYPE_UINT32) {
      // Always set: our writer always writes chemID, so the bytes can match.
      reflection->SetUInt32(&m, f, rng() % 2 ? static_cast<uint32_t>(rng()) : rng() % 200);
    } else {
      // The enum, the schema's one other type (libprotobuf aborts on any other).
      if (rng() % 2) reflection->SetEnumValue(&m, f, static_cast<int>(rng() % 2));
    }
  }
}

TEST(OTAParamRCOracle, AgreesWithLibprotobufOnRandomModels) {
  std::mt19937 rng(20240601);
  for (int i = 0; i < 1200; ++i) {
    SCOPED_TRACE(i);
    kolvrand::oracle::OTAParamRC plain;
    kolvrand::oracle_packed::OTAParamRC packed;
    fillRandom(plain, rng);
    const std::string plainBytes = plain.SerializeAsString();
    ASSERT_TRUE(packed.ParseFromString(plainBytes));
    const std::string input = i % 2 ? packed.SerializeAsString() : plainBytes;

    OTAParamRC ours;
    const std::vector<uint8_t> bytes(input.begin(), input.end());
    ASSERT_TRUE(test::decode(ours, bytes));
    rcmodel::WireProblems problems;
    rcmodel::checkWire(bytes, 0, &problems);
    ASSERT_EQ(problems.count, 0u) << problems.shown[0].text;
    ASSERT_EQ(ours.dictionaryRepresentation(), test::oracleDictionary(plain));
    const std::vector<uint8_t> written = ours.data();
    ASSERT_EQ(std::string(written.begin(), written.end()), plainBytes);

    // NaN never equals itself, so equality is only expected where it is reflexive.
    auto copy = ours.copy();
    EXPECT_EQ(std::tuple(copy->hash(), copy->data()), std::tuple(ours.hash(), written));
    EXPECT_TRUE(copy->isEqual(&ours) || !ours.isEqual(&ours));
  }
}

// Every input of wire_cases.txt that our reader decodes: when the wire check
// finds nothing, libprotobuf parses it to the very values we read (but for an
// MLBConfig the enum does not name, which our reader carries and libprotobuf
// keeps apart as an unknown field, showing an earlier named value if any;
// the daemon means to carry any value); when libprotobuf rejects it,
// the check names why, and what it says libprotobuf rejects, it does.
TEST(WireCheckOracle, NamesWhatLibprotobufRejectsOrReadsOtherwise) {
  std::ifstream file(KOLVRAND_SOURCE_DIR "/tests/model/wire_cases.txt");
  ASSERT_TRUE(file);
  size_t flagged = 0, clean = 0;
  for (std::string line; std::getline(file, line);) {
    if (!line.starts_with("ok ")) continue;
    SCOPED_TRACE(line);
    const std::vector<uint8_t> input = test::fromHex(line.substr(3, line.find('/') - 3));
    OTAParamRC ours;
    ASSERT_TRUE(test::decode(ours, input));
    rcmodel::WireProblems problems;
    rcmodel::checkWire(input, 0, &problems);
    kolvrand::oracle::OTAParamRC theirs;
    const bool parsed = theirs.ParseFromArray(input.data(), static_cast<int>(input.size()));
    if (problems.count > 0) {
      // What the check says libprotobuf rejects, it does.
      const bool rejects = std::ranges::any_of(problems.shown, [](const auto& p) {
        return p.text.find("rejects the file") != std::string::npos;
      });
      EXPECT_TRUE(!rejects || !parsed) << problems.shown[0].text;
      ++flagged;
      continue;
    }
    ++clean;
    ASSERT_TRUE(parsed);
    const auto [read, oracle] =
        test::comparableReadings(ours.dictionaryRepresentation(), test::oracleDictionary(theirs));
    EXPECT_EQ(oracle, read);
  }
  // The file holds both kinds.
  EXPECT_GT(flagged, 8u);
  EXPECT_GT(clean, 5u);
}

}  // namespace
}  // namespace kolvrand
