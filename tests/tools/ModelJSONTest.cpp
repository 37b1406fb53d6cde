// The JSON layer of rcmodel and the dictionary import under it, in process:
// random models round trip, floats are written shortest and read back exactly,
// and wrong JSON is refused with the path of the first wrong value.
#include <gtest/gtest.h>

#include <charconv>

#include "model/OTAParamRC.h"
#include "tests/tools/RandomModel.h"
#include "tools/rcmodel/ModelJSON.h"

namespace kolvrand {
namespace {

using rcmodel::floatJSON;
using rcmodel::JSONError;
using rcmodel::modelsFromJSON;
using rcmodel::renderJSON;

uint32_t bits(float f) {
  return std::bit_cast<uint32_t>(f);
}

TEST(ModelJSON, RandomModelsRoundTrip) {
  test::RandomModels random(20261122);
  for (int i = 0; i < 300; ++i) {
    SCOPED_TRACE(i);
    const Value dictionary = random.next();
    const std::string json = renderJSON(dictionary);

    // The import is the exact reverse of the dictionary form.
    DictionaryError why;
    auto model = OTAParamRC::fromDictionary(dictionary, &why);
    ASSERT_TRUE(model) << why.path << ": " << why.reason;
    EXPECT_TRUE(model->dictionaryRepresentation() == dictionary) << json;

    // JSON -> message -> wire -> message -> JSON gives the same text, and the
    // message read from JSON encodes to the same bytes.
    JSONError error;
    auto fromJSON = modelsFromJSON(json, true, &error);
    ASSERT_TRUE(fromJSON) << error.message();
    const std::vector<uint8_t> wire = (*fromJSON)[0]->data();
    EXPECT_EQ(wire, model->data());
    OTAParamRC decoded;
    PBDataReader reader(wire.data(), wire.size());
    ASSERT_TRUE(decoded.readFrom(reader));
    EXPECT_EQ(renderJSON(decoded.dictionaryRepresentation()), json);
  }
}

TEST(ModelJSON, FloatsAreTheShortestTextThatReadsBack) {
  const std::pair<float, const char*> cases[] = {
      {0.1f, "0.1"},
      {1.0f, "1"},
      {-0.0f, "-0.0"},  // "-0" would read back as the integer 0
      {16777216.0f, "16777216"},
      {std::numeric_limits<float>::denorm_min(), "1e-45"},
      {FLT_MAX, "3.4028235e+38"},
      {std::numeric_limits<float>::quiet_NaN(), "\"NaN\""},
      {std::numeric_limits<float>::infinity(), "\"Infinity\""},
      {-std::numeric_limits<float>::infinity(), "\"-Infinity\""},
  };
  for (const auto& [value, text] : cases) EXPECT_EQ(floatJSON(value), text);

  test::RandomModels random(7);
  for (int i = 0; i < 20000; ++i) {
    const float f = random.randomFloat();
    auto value = rcmodel::parseJSON(floatJSON(f), nullptr);
    ASSERT_TRUE(value && value->isNumber()) << floatJSON(f);
    EXPECT_EQ(bits(value->asNumber()->floatValue()), bits(f)) << floatJSON(f);
  }
}

TEST(ModelJSON, NumbersRoundToTheNearestFloatOnce) {
  struct Case {
    const char* json;
    float expected;
  } const cases[] = {
      {"[0.1]", 0.1f},
      {"[3]", 3.0f},
      {"[16777217]", 16777216.0f},
      {"[1e-50]", 0.0f},
      {"[3.4028235e38]", FLT_MAX},
      {"[1.00000005960464477539062499]", 1.0f},  // just below the midpoint to the next float
      {"[1.00000005960464477539062501]", 1.00000011920928955078125f},  // just above it
  };
  for (const Case& c : cases) {
    Value wrapped = Dictionary{{"gridOCV", *rcmodel::parseJSON(c.json, nullptr)}};
    DictionaryError why;
    auto model = OTAParamRC::fromDictionary(wrapped, &why);
    ASSERT_TRUE(model) << c.json << ": " << why.reason;
    ASSERT_EQ(model->gridOCVsCount(), 1u);
    EXPECT_EQ(bits(model->gridOCVAtIndex(0)), bits(c.expected)) << c.json;
  }
}

TEST(ModelJSON, EnumTakesNamesTheUnknownFormAndIntegers) {
  const std::pair<const char*, int32_t> taken[] = {
      {"\"kKVRRegularMLB\"", 0},
      {"\"kKVRNorthSouthSplitMLB\"", 1},
      {"\"(unknown: 7)\"", 7},
      {"\"(unknown: -2147483648)\"", INT32_MIN},
      {"5", 5},
      {"-1", -1},
      {"2147483647", INT32_MAX},
  };
  for (const auto& [json, value] : taken) {
    JSONError error;
    auto models = modelsFromJSON(std::string("{\"MLBConfig\":") + json + "}", true, &error);
    ASSERT_TRUE(models) << json << ": " << error.message();
    EXPECT_TRUE((*models)[0]->hasMLBConfig());
    EXPECT_EQ((*models)[0]->mLBConfig(), value) << json;
  }
}

TEST(ModelJSON, WrongJSONNamesThePathOfTheFirstWrongValue) {
  std::string deep = "$";
  for (int i = 0; i < 64; ++i) deep += "[0]";
  struct Case {
    std::string json;
    bool single;
    std::string path;
    const char* reason;
  };
  std::vector<Case> cases = {
      {"{\"R0x\": []}", false, "$.R0x", "unknown key"},
      {"{\"r0\": {}}", false, "$.r0", "did you mean \"R0\""},
      {"{\"chemID\": -1}", false, "$.chemID", "-1 is out of range"},
      {"{\"chemID\": 4294967296}", false, "$.chemID", "out of range"},
      {"{\"chemID\": 2.5}", false, "$.chemID", "expected an unsigned 32-bit integer"},
      {"{\"chemID\": \"1\"}", false, "$.chemID", "got the string \"1\""},
      {"{\"gridOCV\": [1, 2, \"x\"]}", false, "$.gridOCV[2]", "expected a float"},
      {"{\"gridOCV\": [1e39]}", false, "$.gridOCV[0]", "out of range for a 32-bit float"},
      {"{\"gridOCV\": 1}", false, "$.gridOCV", "expected an array of floats"},
      {"{\"maxRdcRatio\": [1]}", false, "$.maxRdcRatio", "expected a float, got an array"},
      {"{\"R0\": []}", false, "$.R0", "expected an object (OTAResistanceData)"},
      {"{\"R0\": {\"resistance25C\": [0, null]}}", false, "$.R0.resistance25C[1]", "null"},
      {"[{}, {\"bmuResistance\": {\"bogus\": 1}}]", false, "$[1].bmuResistance.bogus",
       "unknown key"},
      {"[{}, 3]", false, "$[1]", "expected an object"},
      {"[{}]", true, "$", "expected one object"},
      {"{\"chemID\": 1, \"chemID\": 2}", false, "$.chemID", "twice"},
      {"{\"chemID\": 1", false, "$", "not valid JSON"},
      {"{} {}", false, "$", "not valid JSON"},
      {"", false, "$", "not valid JSON"},
      {std::string(100000, '[') + std::string(100000, ']'), false, deep, "nested deeper than 64"},
  };
  // Of an enum, only the text the dictionary would show for a value is taken.
  for (const char* json : {"\"(unknown: 0)\"", "\"(unknown: 07)\"", "\"(unknown: 2147483648)\"",
                           "\"(unknown: )\"", "\"kkvrregularmlb\"", "2147483648", "1.5", "true"})
    cases.push_back({std::string("{\"MLBConfig\":") + json + "}", false, "$.MLBConfig", ""});
  for (const Case& c : cases) {
    JSONError error;
    const std::string shown = c.json.substr(0, 80);
    EXPECT_FALSE(modelsFromJSON(c.json, c.single, &error)) << shown;
    EXPECT_EQ(error.path, c.path) << shown;
    EXPECT_NE(error.reason.find(c.reason), std::string::npos) << shown << " -> " << error.reason;
  }
}

TEST(ModelJSON, KeysLeftOutLeaveTheirFieldsAlone) {
  auto model = makeExampleModel(0x2168);
  const std::vector<uint8_t> before = model->data();
  DictionaryError why;
  ASSERT_TRUE(model->setFieldsFromDictionary(Dictionary{{"chemID", Number::fromSigned(5)}}, &why));
  EXPECT_EQ(model->chemID(), 5u);
  model->setChemID(0x2168);
  EXPECT_EQ(model->data(), before);
}

}  // namespace
}  // namespace kolvrand
