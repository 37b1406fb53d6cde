// Differential decoding against libprotobuf. Each input that libprotobuf
// parses as a model becomes a valid message in its canonical form (unknown
// fields dropped, each field once), written both unpacked and packed; our
// reader must decode both to exactly the values libprotobuf holds, and our
// writer must reproduce libprotobuf's bytes (so libprotobuf reads ours back).
#include "fuzz/Support.h"
#include "model/OTAParamRC.h"
#include "oracle_packed.pb.h"
#include "oracle_plain.pb.h"
#include "tests/support/OracleDictionary.h"

using namespace kolvrand;

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  kolvrand::oracle::OTAParamRC plain;
  kolvrand::oracle_packed::OTAParamRC packed;
  if (!plain.ParseFromArray(data, static_cast<int>(size))) return 0;
  plain.DiscardUnknownFields();
  // Our writer always writes chemID; with it set, the bytes can match.
  if (!plain.has_chemid()) plain.set_chemid(0);
  const std::string canonical = plain.SerializeAsString();
  const Value expected = test::oracleDictionary(plain);
  // Decodes the whole of `input` to exactly `expected`; gives what our writer
  // writes of it.
  const auto decode = [&](const std::string& input) {
    OTAParamRC ours;
    PBDataReader reader(reinterpret_cast<const uint8_t*>(input.data()), input.size());
    fuzz::check(ours.readFrom(reader) && reader.position() == input.size());
    fuzz::check(ours.dictionaryRepresentation() == expected);
    return ours.data();
  };
  fuzz::check(decode(canonical) == std::vector<uint8_t>(canonical.begin(), canonical.end()));
  fuzz::check(packed.ParseFromString(canonical));
  decode(packed.SerializeAsString());
  return 0;
}
