// Differential decoding against libprotobuf. Each input that libprotobuf
// parses as a model becomes a valid message in its canonical form (unknown
// fields dropped, each field once), written both unpacked and packed; our
// reader must decode both to exactly the values libprotobuf holds, our writer
// must reproduce libprotobuf's bytes, and libprotobuf must read ours back.
#include <bit>
#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "fuzz/Support.h"
#include "model/OTAParamRC.h"
#include "oracle_packed.pb.h"
#include "oracle_plain.pb.h"
#include "tests/support/OracleDictionary.h"

using namespace kolvrand;
using fuzz::check;

namespace {

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
  const Value expected = test::oracleDictionary(plain);
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
  check(test::oracleDictionary(parsed) == expected);
  return 0;
}
