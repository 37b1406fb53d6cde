// SPDX-License-Identifier: MIT
// The JSON layer of rcmodel and the dictionary import under it, in process:
// random models round trip, floats are written shortest and read back exactly,
// and wrong JSON is refused with the path of the first wrong value.
#include <gtest/gtest.h>

#include <bit>
#include <cfloat>
#include <limits>
#include <nlohmann/json.hpp>
#include <random>

#include "model/OTAParamRC.h"
#include "tests/support/Files.h"
#include "tools/example_models/ExampleModel.h"
#include "tools/rcmodel/ModelJSON.h"

namespace kolvrand {
namespace {

using rcmodel::modelsFromJSON;
using rcmodel::renderJSON;
constexpr float kInf = std::numeric_limits<float>::infinity();
constexpr float kNaN = std::numeric_limits<float>::quiet_NaN();
constexpr float kTiny = std::numeric_limits<float>::denorm_min();

// Random models in their dictionary form, reproducible from a seed. Their
// shape (which keys, and of which kind) is taken from a full example model's
// dictionary, so every field is exercised without the test listing them.
struct RandomModels {
  std::mt19937_64 rng;
  const Value shape = makeExampleModel(0x2168)->dictionaryRepresentation();

  size_t pick(size_t n) { return static_cast<size_t>(rng() % n); }

  // A float of any kind; NaN only as the one quiet NaN, since JSON's "NaN"
  // carries neither sign nor payload.
  float randomFloat() {
    static const float kSpecial[] = {0.0f,  -0.0f,       kInf,       -kInf,   kNaN,
                                     kTiny, -kTiny,      FLT_MIN,    FLT_MAX, -FLT_MAX,
                                     0.1f,  1.0f / 3.0f, 16777216.0f};
    const size_t kind = pick(10);
    if (kind == 0) return kSpecial[pick(std::size(kSpecial))];
    if (kind >= 5) return std::uniform_real_distribution<float>(-5.0f, 5.0f)(rng);
    const float f = std::bit_cast<float>(static_cast<uint32_t>(rng()));
    return f != f ? kNaN : f;
  }

  // A dictionary like `shape`: every list (some empty), some sub-messages,
  // optional values and the enum left out.
  Value like(const Value& shape) {
    const Dictionary* d = shape.asDictionary();
    if (!d) return shape;
    Dictionary out;
    for (const auto& [key, value] : *d) {
      if (value.isArray()) {
        Array list(pick(5) == 0 ? 0 : pick(24));
        for (Value& v : list) v = Number::fromFloat(randomFloat());
        out.set(key, std::move(list));
      } else if (value.isDictionary()) {
        if (pick(10) < 7) out.set(key, like(value));
      } else if (value.asNumber() && value.asNumber()->kind() == Number::Kind::Unsigned) {
        out.set(key, Number::fromUnsigned(static_cast<uint32_t>(rng())));
      } else if (value.isNumber()) {
        if (pick(10) < 6) out.set(key, Number::fromFloat(randomFloat()));
      } else if (value.isString() && pick(10) < 6) {
        // The two named values or any other, which shows as "(unknown: N)".
        const int32_t v = static_cast<int32_t>(pick(3) < 2 ? pick(2) : rng());
        out.set(key, OTAParamRC::mLBConfigAsString(v));
      }
    }
    return out;
  }
};

TEST(ModelJSON, RandomModelsRoundTrip) {
  RandomModels random{std::mt19937_64(20261122)};
  for (int i = 0; i < 300; ++i) {
    const Value dictionary = random.like(random.shape);
    const std::string json = renderJSON(dictionary);

    // The model read from the JSON has the very dictionary it came from: the
    // import is the exact reverse of the dictionary form, and every float
    // written reads back to the same bits.
    ValueError error;
    auto models = modelsFromJSON(json, true, &error);
    ASSERT_TRUE(models) << error.message();
    EXPECT_TRUE((*models)[0]->dictionaryRepresentation() == dictionary) << json;
  }
}

// What comes of each JSON text: the model, as decode shows it again (for an
// empty `path`), or the path of the first wrong value and why.
TEST(ModelJSON, EachTextGivesItsModelOrThePathOfTheFirstWrongValue) {
  std::string deep = "$";
  for (int i = 0; i < 64; ++i) deep += "[0]";
  struct Case {
    std::string json, path, text;  // text: found in the model's JSON, or in the reason
    bool single = false;
  };
  // model_json_cases.json holds the cases (strings between them are
  // comments) as [json, path, text, single].
  std::vector<Case> cases;
  for (const auto& c : nlohmann::json::parse(
           test::readFile(KOLVRAND_SOURCE_DIR "/tests/tools/model_json_cases.json")))
    if (c.is_array()) cases.push_back({c[0], c[1], c[2], c.size() > 3 && c[3].get<bool>()});
  cases.push_back(
      {std::string(100000, '[') + std::string(100000, ']'), deep, "nested deeper than 64"});

  for (const Case& c : cases) {
    ValueError error;
    auto models = modelsFromJSON(c.json, c.single, &error);
    const std::string shown = c.json.substr(0, 80);
    ASSERT_EQ(!models, !c.path.empty()) << shown << " -> " << error.message();
    const std::string text =
        models ? renderJSON((*models)[0]->dictionaryRepresentation()) : error.reason;
    EXPECT_EQ(models ? "" : error.path, c.path) << shown;
    EXPECT_NE(text.find(c.text), std::string::npos) << shown << " -> " << text;
  }
}

}  // namespace
}  // namespace kolvrand
