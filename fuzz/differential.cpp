// SPDX-License-Identifier: MIT
// Differential decoding against libprotobuf. Each input that libprotobuf
// parses as a model becomes a valid message in its canonical form (unknown
// fields dropped, each field once), written both unpacked and packed; our
// reader must decode both to exactly the values libprotobuf holds, and our
// writer must reproduce libprotobuf's bytes (so libprotobuf reads ours back).
// And rcmodel validate's wire check: an input our reader decodes that
// libprotobuf rejects, or reads to other values, the check must name.
#include "fuzz/Support.h"
#include "model/OTAParamRC.h"
#include "oracle_packed.pb.h"
#include "oracle_plain.pb.h"
#include "tests/support/OracleDictionary.h"
#include "tools/rcmodel/WireCheck.h"

using namespace kolvrand;

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  kolvrand::oracle::OTAParamRC plain;
  kolvrand::oracle_packed::OTAParamRC packed;
  const bool parsed = plain.ParseFromArray(data, static_cast<int>(size));
  OTAParamRC raw;
  PBDataReader rawReader(data, size);
  if (raw.readFrom(rawReader)) {
    rcmodel::WireProblems problems;
    rcmodel::checkWire({data, size}, 0, &problems);
    // What the check says libprotobuf rejects, it does.
    for (const auto& p : problems.shown)
      fuzz::check(!parsed || p.text.find("rejects the file") == std::string::npos);
    if (problems.count == 0) {
      // Read alike, but for an MLBConfig the enum does not name.
      fuzz::check(parsed);
      const auto [ours, theirs] =
          test::comparableReadings(raw.dictionaryRepresentation(), test::oracleDictionary(plain));
      fuzz::check(ours == theirs);
    }
  }
  if (!parsed) return 0;
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
