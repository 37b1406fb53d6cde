// Differential decoding against libprotobuf. Each input that libprotobuf
// parses as a model becomes a valid message in its canonical form (unknown
// fields dropped, each field once), written both unpacked and packed; our
// reader must decode both to exactly the values libprotobuf holds, our writer
// must reproduce libprotobuf's bytes, and libprotobuf must read ours back.
#include <google/protobuf/descriptor.h>
#include <google/protobuf/message.h>

#include <bit>
#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "fuzz/Support.h"
#include "model/OTAParamRC.h"
#include "oracle_packed.pb.h"
#include "oracle_plain.pb.h"

using namespace kolvrand;
using fuzz::check;
using google::protobuf::FieldDescriptor;
using google::protobuf::Message;

namespace {

// The dictionary form of a libprotobuf message by the rules of ours: lists
// always, chemID always (it has no presence in ours), every other field when set.
Value dictionaryOf(const Message& m) {
  const auto* reflection = m.GetReflection();
  const auto* descriptor = m.GetDescriptor();
  Dictionary d;
  for (int i = 0; i < descriptor->field_count(); ++i) {
    const FieldDescriptor* f = descriptor->field(i);
    if (f->is_repeated()) {
      check(f->cpp_type() == FieldDescriptor::CPPTYPE_FLOAT);
      Array a;
      for (int k = 0; k < reflection->FieldSize(m, f); ++k)
        a.emplace_back(Number::fromFloat(reflection->GetRepeatedFloat(m, f, k)));
      d.set(f->name(), std::move(a));
      continue;
    }
    if (f->cpp_type() == FieldDescriptor::CPPTYPE_UINT32) {
      d.set(f->name(), Number::fromUnsigned(reflection->GetUInt32(m, f)));
      continue;
    }
    if (!reflection->HasField(m, f)) continue;
    switch (f->cpp_type()) {
      case FieldDescriptor::CPPTYPE_MESSAGE:
        d.set(f->name(), dictionaryOf(reflection->GetMessage(m, f)));
        break;
      case FieldDescriptor::CPPTYPE_FLOAT:
        d.set(f->name(), Number::fromFloat(reflection->GetFloat(m, f)));
        break;
      case FieldDescriptor::CPPTYPE_ENUM:
        d.set(f->name(), OTAParamRC::mLBConfigAsString(reflection->GetEnumValue(m, f)));
        break;
      default:
        check(false);  // a field type the schema does not use
    }
  }
  return d;
}

std::vector<uint8_t> bytesOf(const std::string& s) {
  return {s.begin(), s.end()};
}

void decodeAndCompare(const std::string& input, const Value& expected) {
  OTAParamRC ours;
  PBDataReader reader(reinterpret_cast<const uint8_t*>(input.data()), input.size());
  check(ours.readFrom(reader));
  check(reader.position() == input.size());
  check(ours.dictionaryRepresentation() == expected);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  kolvrand::oracle::OTAParamRC plain;
  if (!plain.ParseFromArray(data, static_cast<int>(size))) return 0;
  plain.DiscardUnknownFields();
  // Our writer always writes chemID; with it set, the bytes can match.
  if (!plain.has_chemid()) plain.set_chemid(0);
  const std::string canonical = plain.SerializeAsString();
  const Value expected = dictionaryOf(plain);
  decodeAndCompare(canonical, expected);

  kolvrand::oracle_packed::OTAParamRC packed;
  check(packed.ParseFromString(canonical));
  decodeAndCompare(packed.SerializeAsString(), expected);

  OTAParamRC ours;
  PBDataReader reader(reinterpret_cast<const uint8_t*>(canonical.data()), canonical.size());
  check(ours.readFrom(reader));
  const std::vector<uint8_t> written = ours.data();
  check(written == bytesOf(canonical));
  kolvrand::oracle::OTAParamRC parsed;
  check(parsed.ParseFromArray(written.data(), static_cast<int>(written.size())));
  check(dictionaryOf(parsed) == expected);
  return 0;
}
