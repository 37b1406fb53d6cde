// Feeds arbitrary text to rcmodel's JSON import, the way `rcmodel encode`
// reads a model author's file. Whatever imports must export and import again
// to the very same model, and its encoding must read back unchanged.
#include <cstddef>
#include <cstdint>
#include <string_view>
#include <vector>

#include "fuzz/Support.h"
#include "model/OTAParamRC.h"
#include "tools/rcmodel/ModelJSON.h"

using namespace kolvrand;
using fuzz::check;

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  fuzz::quietLogs();
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const std::string_view text(reinterpret_cast<const char*>(data), size);
  rcmodel::JSONError error;
  auto models = rcmodel::modelsFromJSON(text, false, &error);
  if (!models) {
    check(!error.reason.empty());
    return 0;
  }
  for (const auto& model : *models) {
    check(model != nullptr);
    const std::vector<uint8_t> bytes = model->data();

    // Exported as rcmodel writes it, then imported again: the same model.
    const std::string exported = rcmodel::renderJSON(model->dictionaryRepresentation());
    auto again = rcmodel::modelsFromJSON(exported, true, &error);
    check(again && again->size() == 1);
    check(again->front()->data() == bytes);

    // Encoded and decoded: the same bytes.
    OTAParamRC decoded;
    PBDataReader reader(bytes.data(), bytes.size());
    check(decoded.readFrom(reader));
    check(decoded.data() == bytes);
  }
  return 0;
}
