// Feeds arbitrary bytes to the battery model's read function. Whatever reads
// successfully must survive a write and a second read unchanged.
#include <cstddef>
#include <cstdint>
#include <vector>

#include "fuzz/Support.h"
#include "model/OTAParamRC.h"

using kolvrand::fuzz::check;

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  using namespace kolvrand;
  OTAParamRC first;
  PBDataReader reader(data, size);
  if (!first.readFrom(reader)) return 0;
  check(reader.position() <= size);

  const std::vector<uint8_t> written = first.data();
  check(written.size() == first.encodedSize());
  OTAParamRC second;
  PBDataReader again(written.data(), written.size());
  check(second.readFrom(again));
  check(second.data() == written);
  // Floats compare bit for bit in the dictionary, so NaN values match there
  // while isEqual() rightly says a NaN is unequal to itself.
  check(second.dictionaryRepresentation() == first.dictionaryRepresentation());
  check(second.hash() == first.hash());
  if (first.isEqual(&first)) check(second.isEqual(&first) && first.isEqual(&second));

  const auto copy = first.copy();
  check(copy->hash() == first.hash());
  OTAParamRC merged;
  merged.mergeFrom(first);
  check(merged.data() == written);
  return 0;
}
