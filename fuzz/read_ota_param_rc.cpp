// SPDX-License-Identifier: MIT
// Feeds arbitrary bytes to the battery model's read function. Whatever reads
// successfully must survive a write and a second read unchanged.
#include "fuzz/Support.h"
#include "model/OTAParamRC.h"

using namespace kolvrand;

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  OTAParamRC first, second, merged;
  PBDataReader reader(data, size);
  if (!first.readFrom(reader)) return 0;
  fuzz::check(reader.position() <= size);

  const std::vector<uint8_t> written = first.data();
  fuzz::check(written.size() == first.encodedSize());
  PBDataReader again(written.data(), written.size());
  fuzz::check(second.readFrom(again) && second.data() == written);
  // Floats compare bit for bit in the dictionary, so NaN values match there
  // while isEqual() rightly says a NaN is unequal to itself.
  fuzz::check(second.dictionaryRepresentation() == first.dictionaryRepresentation());
  fuzz::check(second.hash() == first.hash() && first.copy()->hash() == first.hash());
  if (first.isEqual(&first)) fuzz::check(second.isEqual(&first) && first.isEqual(&second));
  merged.mergeFrom(first);
  fuzz::check(merged.data() == written);
  return 0;
}
