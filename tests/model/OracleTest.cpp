// Random models against libprotobuf, built from the same schema: what it
// encodes (unpacked or packed) we decode to the same values, and we encode
// them to its very bytes (so it parses ours back to the same values).
#include <google/protobuf/descriptor.h>
#include <google/protobuf/message.h>
#include <gtest/gtest.h>

#include <random>
#include <string>
#include <tuple>

#include "model/OTAParamRC.h"
#include "oracle_packed.pb.h"
#include "oracle_plain.pb.h"
#include "tests/model/Support.h"
#include "tests/support/OracleDictionary.h"

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
    ASSERT_TRUE(test::decode(ours, std::vector<uint8_t>(input.begin(), input.end())));
    ASSERT_EQ(ours.dictionaryRepresentation(), test::oracleDictionary(plain));
    const std::vector<uint8_t> written = ours.data();
    ASSERT_EQ(std::string(written.begin(), written.end()), plainBytes);

    // NaN never equals itself, so equality is only expected where it is reflexive.
    auto copy = ours.copy();
    EXPECT_EQ(std::tuple(copy->hash(), copy->data()), std::tuple(ours.hash(), written));
    EXPECT_TRUE(copy->isEqual(&ours) || !ours.isEqual(&ours));
  }
}

}  // namespace
}  // namespace kolvrand
