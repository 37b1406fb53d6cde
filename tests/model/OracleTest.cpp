// Random models against libprotobuf, built from the same schema: what it
// encodes (unpacked or packed) we decode to the same values, and what we
// encode it parses back to the same values and bytes.
#include <google/protobuf/descriptor.h>
#include <google/protobuf/message.h>
#include <gtest/gtest.h>

#include <random>
#include <string>

#include "model/OTAParamRC.h"
#include "oracle_packed.pb.h"
#include "oracle_plain.pb.h"
#include "tests/model/Support.h"
#include "tests/support/OracleDictionary.h"

namespace kolvrand {
namespace {

using google::protobuf::FieldDescriptor;
using google::protobuf::Message;

float randomFloat(std::mt19937& rng) {
  // Any bit pattern now and then (NaN payloads, infinities, subnormals
  // included); ordinary magnitudes otherwise.
  if (rng() % 8 == 0) return std::bit_cast<float>(static_cast<uint32_t>(rng()));
  return std::uniform_real_distribution<float>(-1000, 1000)(rng);
}

void fillRandom(Message& m, std::mt19937& rng) {
  const auto* reflection = m.GetReflection();
  const auto* descriptor = m.GetDescriptor();
  for (int i = 0; i < descriptor->field_count(); ++i) {
    const FieldDescriptor* f = descriptor->field(i);
    if (f->is_repeated()) {
      const int n = rng() % 3 == 0 ? 0 : static_cast<int>(rng() % 40);
      for (int k = 0; k < n; ++k) reflection->AddFloat(&m, f, randomFloat(rng));
      continue;
    }
    switch (f->cpp_type()) {
      case FieldDescriptor::CPPTYPE_MESSAGE:
        if (rng() % 4) fillRandom(*reflection->MutableMessage(&m, f), rng);
        break;
      case FieldDescriptor::CPPTYPE_FLOAT:
        if (rng() % 2) reflection->SetFloat(&m, f, randomFloat(rng));
        break;
      case FieldDescriptor::CPPTYPE_UINT32:
        // Always set: our writer always writes chemID, so the bytes can match.
        reflection->SetUInt32(&m, f, rng() % 2 ? static_cast<uint32_t>(rng()) : rng() % 200);
        break;
      case FieldDescriptor::CPPTYPE_ENUM:
        if (rng() % 2) reflection->SetEnumValue(&m, f, static_cast<int>(rng() % 2));
        break;
      default:
        FAIL() << "unexpected field type in the schema: " << f->full_name();
    }
  }
}

TEST(OTAParamRCOracle, AgreesWithLibprotobufOnRandomModels) {
  std::mt19937 rng(20240601);
  for (int i = 0; i < 1200; ++i) {
    SCOPED_TRACE(i);
    kolvrand::oracle::OTAParamRC plain;
    fillRandom(plain, rng);
    const std::string plainBytes = plain.SerializeAsString();
    std::string input = plainBytes;
    if (i % 2) {
      kolvrand::oracle_packed::OTAParamRC packed;
      ASSERT_TRUE(packed.ParseFromString(plainBytes));
      input = packed.SerializeAsString();
    }

    OTAParamRC ours;
    ASSERT_TRUE(test::decode(ours, std::vector<uint8_t>(input.begin(), input.end())));
    const Value expected = test::oracleDictionary(plain);
    ASSERT_EQ(ours.dictionaryRepresentation(), expected);

    const std::vector<uint8_t> written = ours.data();
    ASSERT_EQ(std::string(written.begin(), written.end()), plainBytes);
    kolvrand::oracle::OTAParamRC parsed;
    ASSERT_TRUE(parsed.ParseFromArray(written.data(), static_cast<int>(written.size())));
    ASSERT_EQ(test::oracleDictionary(parsed), expected);

    auto copy = ours.copy();
    EXPECT_EQ(copy->hash(), ours.hash());
    EXPECT_EQ(copy->data(), written);
    // NaN never equals itself, so equality is only expected where it is reflexive.
    if (ours.isEqual(&ours)) {
      EXPECT_TRUE(copy->isEqual(&ours));
    }
  }
}

}  // namespace
}  // namespace kolvrand
