// SPDX-License-Identifier: MIT
// Feeds arbitrary text to rcmodel's JSON import, the way `rcmodel encode`
// reads a model author's file. Whatever imports must export and import again
// to the very same model, and its encoding must read back unchanged.
#include "fuzz/Support.h"
#include "model/OTAParamRC.h"
#include "tools/rcmodel/ModelJSON.h"

using namespace kolvrand;

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  fuzz::quietLogs();
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  ValueError error;
  auto models = rcmodel::modelsFromJSON(std::string_view(reinterpret_cast<const char*>(data), size),
                                        false, &error);
  fuzz::check(models || !error.reason.empty());
  if (!models) return 0;
  for (const auto& model : *models) {
    const std::vector<uint8_t> bytes = model->data();
    // Exported as rcmodel writes it, then imported again: the same model.
    auto again = rcmodel::modelsFromJSON(rcmodel::renderJSON(model->dictionaryRepresentation()),
                                         true, &error);
    fuzz::check(again && again->size() == 1 && again->front()->data() == bytes);
    // Encoded and decoded: the same bytes.
    OTAParamRC decoded;
    PBDataReader reader(bytes.data(), bytes.size());
    fuzz::check(decoded.readFrom(reader) && decoded.data() == bytes);
  }
  return 0;
}
